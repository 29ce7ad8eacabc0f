// Thread safety: pure functions.
//
// Texts in columns. Widths are in characters (code points), since IDs and paths need not be ASCII.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>

namespace spacekeep::ctl {

[[nodiscard]] std::size_t displayWidth(std::string_view text);

/// Spaces behind or in front of `text`, up to `width`; longer text stays as it is.
[[nodiscard]] std::string padded(std::string_view text, std::size_t width);
[[nodiscard]] std::string rightAligned(std::string_view text, std::size_t width);

/// At most `width` characters: what is longer loses its middle, since IDs differ at their end and
/// tell whose they are at their beginning.
[[nodiscard]] std::string shortened(std::string_view text, std::size_t width);

/// Breaks `text` between words into lines of at most `width` that begin with `indent` spaces, which
/// count. A word that is too long for a line stands alone in it. No line break at the end.
[[nodiscard]] std::string wrapped(std::string_view text, std::size_t width, std::size_t indent);

/// `text` for one line of a terminal: what comes from other programs can do nothing there.
[[nodiscard]] std::string harmless(std::string_view text);

/// 3276800 as "3,276,800".
[[nodiscard]] std::string printCount(std::uint64_t count);
/// "512 B", "-1.5 GiB".
[[nodiscard]] std::string printSignedSize(std::int64_t bytes);
/// "12.3 %", cut off rather than carried up; "-" when there is no whole.
[[nodiscard]] std::string printShare(double part, double whole);
/// "0 s", "119 s", "2 min", "3 h", "4 days".
[[nodiscard]] std::string printAge(double seconds);

}  // namespace spacekeep::ctl
