// Thread safety: pure functions; styleOf() reads the environment, which nobody may change meanwhile.
//
// How texts for people may look: how wide, with which characters, in colour or not.
#pragma once

#include <cstddef>
#include <functional>
#include <optional>
#include <string>
#include <string_view>

namespace spacekeep::ctl {

inline constexpr std::size_t kDefaultColumns = 80;
inline constexpr std::size_t kFewestColumns = 20;
inline constexpr std::size_t kMostColumns = 400;

struct Style {
  std::size_t columns = kDefaultColumns;
  bool terminal = false;  ///< a person looks at it, so names may be shortened to fit
  bool colour = false;
  bool blocks = false;  ///< bars of block characters (Unicode) instead of number signs
};

/// Answers null for a variable that is not set.
using Environment = std::function<const char*(const char* name)>;

/// `window_columns` is what the terminal says of itself, none when the output is no terminal.
/// COLUMNS wins over it. Colour needs a terminal, an empty NO_COLOR and a TERM other than "dumb";
/// block characters need a terminal and a locale of UTF-8.
[[nodiscard]] Style styleFor(std::optional<std::size_t> window_columns,
                             const Environment& environment);

/// The style for what is written to `fd` (isatty(3), ioctl_tty(2)).
[[nodiscard]] Style styleOf(int fd);

enum class Colour { kNone, kFaint, kGreen, kYellow, kRed };
[[nodiscard]] std::string coloured(std::string_view text, Colour colour, const Style& style);

/// `cells` characters, of which the share from 0 to 1 is filled. What is more than nothing fills
/// one at least, and only all of it fills all.
[[nodiscard]] std::string bar(double share, std::size_t cells, const Style& style);

}  // namespace spacekeep::ctl
