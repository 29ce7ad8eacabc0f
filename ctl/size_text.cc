#include "ctl/size_text.h"

#include <fmt/core.h>

#include <algorithm>
#include <cstddef>
#include <optional>

#include "support/values/text.h"

namespace spacekeep::ctl {
namespace {

// Products of a 64-bit factor and a decimal number need more than 64 bits. (A library type of the
// compiler, hence the extension mark.)
__extension__ using Wide = unsigned __int128;

constexpr std::string_view kDigits = "0123456789";
constexpr std::string_view kSteps = "kmgtp";
constexpr std::size_t kMostDigits = 20;  ///< of each half; 2^64 has twenty

struct Parts {
  std::string_view whole;
  std::string_view fraction;  ///< without the point
  bool has_point = false;
  std::string_view unit;
};

std::string lowered(std::string_view text) {
  std::string result(text);
  std::transform(result.begin(), result.end(), result.begin(), [](char c) {
    return c >= 'A' && c <= 'Z' ? static_cast<char>(c - 'A' + 'a') : c;
  });
  return result;
}

std::string_view takeDigits(std::string_view& rest) {
  const std::size_t count = std::min(rest.find_first_not_of(kDigits), rest.size());
  const auto digits = rest.substr(0, count);
  rest.remove_prefix(count);
  return digits;
}

Parts split(std::string_view text) {
  Parts parts;
  parts.whole = takeDigits(text);
  if (text.starts_with('.')) {
    text.remove_prefix(1);
    parts.has_point = true;
    parts.fraction = takeDigits(text);
  }
  text.remove_prefix(std::min(text.find_first_not_of(' '), text.size()));
  parts.unit = text;
  return parts;
}

/// Bytes in one of the unit, none for an unknown one.
std::optional<std::uint64_t> factorOf(std::string_view unit) {
  const std::string name = lowered(unit);
  if (name.empty() || name == "b") return 1;
  const std::size_t step = kSteps.find(name.front());
  if (step == std::string_view::npos) return std::nullopt;
  const std::string_view ending = std::string_view(name).substr(1);
  if (ending != "" && ending != "ib" && ending != "b") return std::nullopt;
  const std::uint64_t base = ending == "b" ? 1000 : 1024;
  std::uint64_t factor = 1;
  for (std::size_t i = 0; i <= step; ++i) factor *= base;
  return factor;
}

/// The digits as a number; at most kMostDigits of them, so that it fits.
Wide numberOf(std::string_view digits) {
  Wide number = 0;
  for (const char digit : digits) number = number * 10 + static_cast<unsigned>(digit - '0');
  return number;
}

std::string describeFault(std::string_view text, const Parts& parts) {
  if (text.empty()) return "it is empty";
  if (text.front() == '-') return "it is negative";
  if (parts.whole.empty()) return "it does not begin with a digit";
  if (parts.unit == "%") return "percentages are not known, give an amount";
  if (parts.unit.starts_with(',')) return "write a point, not a comma, before the fraction";
  if (parts.has_point && parts.fraction.empty()) return "there is no digit after the point";
  if (!factorOf(parts.unit)) return fmt::format("the unit \"{}\" is not known", lineOf(parts.unit));
  if (parts.has_point && *factorOf(parts.unit) == 1) return "there are no fractions of a byte";
  return {};
}

SizeError errorFor(std::string_view text, std::string_view fault) {
  return {
      fmt::format("\"{}\" is no size: {}. Sizes look like 1000000, 500M, 1.5GiB (steps of 1024) "
                  "or 750MB (steps of 1000)",
                  lineOf(text), fault)};
}

}  // namespace

std::variant<std::uint64_t, SizeError> parseSize(std::string_view text) {
  const Parts parts = split(text);
  if (const std::string fault = describeFault(text, parts); !fault.empty()) {
    return errorFor(text, fault);
  }
  const std::size_t first = std::min(parts.whole.find_first_not_of('0'), parts.whole.size());
  const std::string_view whole = parts.whole.substr(first);
  const std::string_view fraction = parts.fraction.substr(0, 18);
  if (whole.size() > kMostDigits) return errorFor(text, "it is more than any volume holds");

  const Wide factor = *factorOf(parts.unit);
  Wide scale = 1;
  for (std::size_t i = 0; i < fraction.size(); ++i) scale *= 10;
  const Wide bytes = numberOf(whole) * factor + numberOf(fraction) * factor / scale;
  if (bytes > UINT64_MAX) return errorFor(text, "it is more than any volume holds");
  return static_cast<std::uint64_t>(bytes);
}

std::string printSize(std::uint64_t bytes) {
  constexpr const char* kUnits[] = {"KiB", "MiB", "GiB", "TiB", "PiB", "EiB"};
  if (bytes < 1024) return fmt::format("{} B", bytes);
  std::size_t unit = 0;
  std::uint64_t size = 1024;
  while (bytes / size >= 1024) {
    size *= 1024;
    ++unit;
  }
  const std::uint64_t tenths = bytes % size / (size / 1024) * 10 / 1024;
  return fmt::format("{}.{} {}", bytes / size, tenths, kUnits[unit]);
}

}  // namespace spacekeep::ctl
