// Thread safety: pure functions.
//
// Property-list documents, XML and binary, by libplist. What libplist itself does not survive or
// silently bends (deep nesting, shared objects that unfold without end, numbers out of range) is
// refused before the document gets there.
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
/// Most values (containers and keys included) in one document.
inline constexpr std::size_t kMaxPlistValues = 100'000;
/// Deepest nesting. Stored state wraps values that peers may nest kMaxValueDepth deep by
/// themselves.
inline constexpr int kMaxPlistDepth = kMaxValueDepth + 4;

/// Parses a document of either encoding; XML does without a document type. Refuses what is too
/// large, too deep (kMaxPlistDepth), holds too much (kMaxPlistValues), a null, a UID, a set, a
/// string that is not Unicode or holds a zero character, or a number or date outside the range of
/// Value. An integer that fits comes as signed, a larger one as unsigned. Of a key that stands
/// twice the last value counts.
[[nodiscard]] std::variant<Value, PlistError> parsePlist(std::span<const std::uint8_t> document);

/// The binary encoding. Keeps every kind and the full range of its numbers; the two integer kinds
/// come back as one (see parsePlist) and compare equal. A date keeps what a double of seconds can
/// hold, about 120 ns today, and is stable from the second round on. In strings, zero characters
/// and bytes that are no UTF-8 become U+FFFD. Empty when the document would be one that parsePlist
/// refuses: too deep, too large, too many values.
[[nodiscard]] std::vector<std::uint8_t> binaryPlist(const Value& value);

}  // namespace spacekeep
