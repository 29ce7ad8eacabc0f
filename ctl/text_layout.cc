#include "ctl/text_layout.h"

#include <fmt/core.h>

#include <algorithm>
#include <cmath>

#include "ctl/size_text.h"
#include "support/values/text.h"

namespace spacekeep::ctl {
namespace {

constexpr std::string_view kEllipsis = "...";

std::string_view takeCharacter(std::string_view& rest) {
  const std::size_t length = std::max<std::size_t>(utf8SequenceLength(rest), 1);
  const std::string_view character = rest.substr(0, length);
  rest.remove_prefix(length);
  return character;
}

std::string_view firstCharacters(std::string_view text, std::size_t count) {
  std::string_view rest = text;
  while (count-- > 0 && !rest.empty()) takeCharacter(rest);
  return text.substr(0, text.size() - rest.size());
}

std::string_view withoutFirst(std::string_view text, std::size_t count) {
  return text.substr(firstCharacters(text, count).size());
}

std::string_view takeWord(std::string_view& rest) {
  rest.remove_prefix(std::min(rest.find_first_not_of(' '), rest.size()));
  const std::string_view word = rest.substr(0, rest.find(' '));
  rest.remove_prefix(word.size());
  return word;
}

}  // namespace

std::size_t displayWidth(std::string_view text) {
  std::size_t width = 0;
  for (; !text.empty(); ++width) takeCharacter(text);
  return width;
}

std::string padded(std::string_view text, std::size_t width) {
  const std::size_t used = displayWidth(text);
  return std::string(text) + std::string(width > used ? width - used : 0, ' ');
}

std::string rightAligned(std::string_view text, std::size_t width) {
  const std::size_t used = displayWidth(text);
  return std::string(width > used ? width - used : 0, ' ') + std::string(text);
}

std::string shortened(std::string_view text, std::size_t width) {
  const std::size_t whole = displayWidth(text);
  if (whole <= width) return std::string(text);
  if (width <= kEllipsis.size()) return std::string(firstCharacters(text, width));
  const std::size_t kept = width - kEllipsis.size();
  const std::size_t at_end = (kept + 1) / 2;
  return fmt::format("{}{}{}", firstCharacters(text, kept - at_end), kEllipsis,
                     withoutFirst(text, whole - at_end));
}

std::string wrapped(std::string_view text, std::size_t width, std::size_t indent) {
  const std::string margin(indent, ' ');
  std::string lines = margin;
  std::size_t used = indent;
  for (auto word = takeWord(text); !word.empty(); word = takeWord(text)) {
    const std::size_t length = displayWidth(word);
    const bool first_of_line = used == indent;
    if (!first_of_line && used + 1 + length > width) {
      lines += "\n" + margin;
      used = indent;
    } else if (!first_of_line) {
      lines += ' ';
      ++used;
    }
    lines += word;
    used += length;
  }
  return lines;
}

std::string harmless(std::string_view text) { return lineOf(text); }

std::string printCount(std::uint64_t count) {
  std::string digits = std::to_string(count);
  for (std::size_t at = digits.size(); at > 3; at -= 3) digits.insert(at - 3, ",");
  return digits;
}

std::string printSignedSize(std::int64_t bytes) {
  const auto magnitude = static_cast<std::uint64_t>(bytes);
  return bytes < 0 ? "-" + printSize(0 - magnitude) : printSize(magnitude);
}

std::string printShare(double part, double whole) {
  if (!(whole > 0)) return "-";
  return fmt::format("{:.1f} %", std::floor(part / whole * 1000 + 1e-9) / 10);
}

std::string printAge(double seconds) {
  constexpr double kMinute = 60;
  constexpr double kHour = 60 * kMinute;
  constexpr double kDay = 24 * kHour;
  const double age_seconds = std::max(seconds, 0.0);
  if (age_seconds < 2 * kMinute) return fmt::format("{:.0f} s", std::floor(age_seconds));
  if (age_seconds < 2 * kHour) return fmt::format("{:.0f} min", std::floor(age_seconds / kMinute));
  if (age_seconds < 2 * kDay) return fmt::format("{:.0f} h", std::floor(age_seconds / kHour));
  return fmt::format("{:.0f} days", std::floor(age_seconds / kDay));
}

}  // namespace spacekeep::ctl
