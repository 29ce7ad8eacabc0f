// Thread safety: pure functions.
//
// Property-list documents, XML and binary, by libplist.
#pragma once

#include <cstdint>
#include <span>
#include <string>
#include <variant>
#include <vector>

#include "support/values/value.h"

namespace spacekeep {

/// What was wrong, in words for a person.
struct PlistError {
  std::string reason;
};

/// Largest document accepted, in bytes.
inline constexpr std::size_t kMaxPlistBytes = 4 * 1024 * 1024;

/// Parses a document of either encoding. Refuses what is too large, too deep (kMaxValueDepth), or
/// holds a null or a UID.
[[nodiscard]] std::variant<Value, PlistError> parsePlist(std::span<const std::uint8_t> document);

/// The binary encoding. Keeps every kind and the full range of its numbers.
[[nodiscard]] std::vector<std::uint8_t> binaryPlist(const Value& value);

}  // namespace spacekeep
