// Thread safety: pure functions.
//
// What a property-list document must satisfy before libplist may see it. Both checks read the
// document themselves and build nothing.
#pragma once

#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>

namespace spacekeep {

/// "bplist00": a document of the binary encoding begins with it.
[[nodiscard]] bool isBinaryPlist(std::span<const std::uint8_t> document);

/// Limits of kMaxPlistValues and kMaxPlistDepth hold for the unfolded tree: a small binary document
/// can name one object many times over. None when the document may pass, else what is wrong.
[[nodiscard]] std::optional<std::string> binaryPlistProblem(std::span<const std::uint8_t> document);

/// Stricter than XML about comments and quoted angle brackets, so that no text can be a tag to
/// this check and a comment to the parser, or the other way round.
[[nodiscard]] std::optional<std::string> xmlPlistProblem(std::string_view document);

/// Seconds between 1970-01-01 and 2001-01-01 00:00 UTC, where dates in documents start.
inline constexpr std::int64_t kPlistEpochUnixSeconds = 978'307'200;
/// A date `seconds` after that epoch lies within what nanoseconds in 64 bits can say.
[[nodiscard]] bool plistDateFits(double seconds);

}  // namespace spacekeep
