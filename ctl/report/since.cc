#include "ctl/report/since.h"

#include <time.h>

#include <array>
#include <charconv>
#include <optional>

namespace spacekeep::ctl {
namespace {

constexpr std::int64_t kSecondNs = 1'000'000'000;
constexpr std::int64_t kMostSeconds = 100LL * 366 * 24 * 3600;

std::int64_t secondsIn(char unit) {
  switch (unit) {
    case 'm':
      return 60;
    case 'h':
      return 3600;
    case 'd':
      return 24 * 3600;
    case 'w':
      return 7 * 24 * 3600;
  }
  return 0;
}

std::optional<std::int64_t> ageSeconds(std::string_view text) {
  if (text.size() < 2) return std::nullopt;
  const std::int64_t unit = secondsIn(text.back());
  text.remove_suffix(1);
  std::int64_t count = 0;
  const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), count);
  const bool whole = error == std::errc() && end == text.data() + text.size();
  if (unit == 0 || !whole || count < 0 || count > kMostSeconds / unit) return std::nullopt;
  return count * unit;
}

/// A day that no calendar has (February 30) is none: mktime(3) would take it for a later one.
std::optional<std::int64_t> secondsAt(tm local) {
  const tm wanted = local;
  local.tm_isdst = -1;
  const time_t seconds = mktime(&local);
  if (local.tm_mday != wanted.tm_mday || local.tm_mon != wanted.tm_mon) return std::nullopt;
  return seconds;
}

std::optional<std::int64_t> momentSeconds(const std::string& text) {
  constexpr std::array kForms{"%Y-%m-%d", "%Y-%m-%d %H:%M", "%Y-%m-%dT%H:%M", "%Y-%m-%d %H:%M:%S",
                              "%Y-%m-%dT%H:%M:%S"};
  for (const char* form : kForms) {
    tm local = {};
    const char* end = strptime(text.c_str(), form, &local);
    if (end != nullptr && *end == '\0') return secondsAt(local);
  }
  return std::nullopt;
}

}  // namespace

std::variant<std::int64_t, SinceError> parseSince(std::string_view text, std::int64_t now_ns) {
  if (const auto age = ageSeconds(text)) return now_ns - *age * kSecondNs;
  const auto seconds = momentSeconds(std::string(text));
  if (seconds && *seconds > -kMostSeconds && *seconds < 2 * kMostSeconds) {
    return *seconds * kSecondNs;
  }
  return SinceError{
      "since when is an age like 90m, 12h, 7d or 4w, or a day like 2026-11-01 with or "
      "without a time like 14:30, not \"" +
      std::string(text) + "\""};
}

}  // namespace spacekeep::ctl
