#include "ctl/style.h"

#include <fmt/core.h>
#include <sys/ioctl.h>
#include <unistd.h>

#include <algorithm>
#include <charconv>
#include <cmath>
#include <cstdlib>

namespace spacekeep::ctl {
namespace {

std::string_view variable(const Environment& environment, const char* name) {
  const char* value = environment(name);
  return value == nullptr ? std::string_view() : std::string_view(value);
}

std::optional<std::size_t> numberIn(std::string_view text) {
  std::size_t number = 0;
  const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number);
  if (error != std::errc() || end != text.data() + text.size()) return std::nullopt;
  return number;
}

std::size_t columnsFor(std::optional<std::size_t> window_columns, const Environment& environment) {
  std::size_t columns = numberIn(variable(environment, "COLUMNS")).value_or(0);
  if (columns == 0) columns = window_columns.value_or(0);
  if (columns == 0) columns = kDefaultColumns;
  return std::clamp(columns, kFewestColumns, kMostColumns);
}

/// The first of the variables that is set decides (locale(7)).
bool localeIsUtf8(const Environment& environment) {
  for (const char* name : {"LC_ALL", "LC_CTYPE", "LANG"}) {
    const std::string_view locale = variable(environment, name);
    if (locale.empty()) continue;
    return locale.ends_with("UTF-8") || locale.ends_with("utf8");
  }
  return false;
}

const char* codeOf(Colour colour) {
  switch (colour) {
    case Colour::kNone:
      return "";
    case Colour::kFaint:
      return "\x1b[2m";
    case Colour::kGreen:
      return "\x1b[32m";
    case Colour::kYellow:
      return "\x1b[33m";
    case Colour::kRed:
      return "\x1b[31m";
  }
  return "";
}

std::string repeated(std::string_view text, std::size_t times) {
  std::string result;
  for (std::size_t i = 0; i < times; ++i) result += text;
  return result;
}

}  // namespace

Style styleFor(std::optional<std::size_t> window_columns, const Environment& environment) {
  Style style;
  style.columns = columnsFor(window_columns, environment);
  style.terminal = window_columns.has_value();
  style.colour = style.terminal && variable(environment, "NO_COLOR").empty() &&
                 variable(environment, "TERM") != "dumb";
  style.blocks = style.terminal && localeIsUtf8(environment);
  return style;
}

Style styleOf(int fd) {
  std::optional<std::size_t> window_columns;
  winsize size = {};
  if (isatty(fd) == 1) window_columns = ioctl(fd, TIOCGWINSZ, &size) == 0 ? size.ws_col : 0;
  return styleFor(window_columns, [](const char* name) { return std::getenv(name); });
}

std::string coloured(std::string_view text, Colour colour, const Style& style) {
  if (text.empty() || !style.colour || colour == Colour::kNone) return std::string(text);
  return fmt::format("{}{}\x1b[0m", codeOf(colour), text);
}

std::string bar(double share, std::size_t cells, const Style& style) {
  const double exact =
      std::clamp(std::isfinite(share) ? share : 0.0, 0.0, 1.0) * static_cast<double>(cells);
  auto filled = static_cast<std::size_t>(exact);
  if (share > 0 && filled == 0) filled = std::min<std::size_t>(1, cells);
  return repeated(style.blocks ? "\u2588" : "#", filled) +
         repeated(style.blocks ? "\u2591" : ".", cells - filled);
}

}  // namespace spacekeep::ctl
