#include "services/command/engine/file_age.h"

#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <charconv>
#include <ctime>
#include <limits>

#include "services/cachedir/engine/beneath.h"
#include "services/cachedir/engine/file_facts.h"

namespace spacekeep::command {
namespace {

std::optional<std::uint64_t> hexadecimal(std::string_view text) {
  std::uint64_t number = 0;
  const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number, 16);
  if (error != std::errc() || end != text.data() + text.size()) return std::nullopt;
  return number;
}

/// A number of exactly so many digits at `at`, followed by `after` (0: by anything).
bool takeNumber(std::string_view& text, std::size_t digits, char after, int& number) {
  if (text.size() < digits + (after != 0 ? 1 : 0)) return false;
  const auto [end, error] = std::from_chars(text.data(), text.data() + digits, number);
  if (error != std::errc() || end != text.data() + digits) return false;
  text.remove_prefix(digits);
  if (after == 0) return true;
  const bool good = text.front() == after;
  text.remove_prefix(1);
  return good;
}

}  // namespace

/// "system@SEQNUMID-SEQNUM-REALTIME.journal" was closed in order, "system@REALTIME-RANDOM.journal~"
/// was not; REALTIME is microseconds, all numbers are hexadecimal.
std::optional<std::int64_t> journalTimeNs(std::string_view name, std::int64_t modified_ns) {
  const std::size_t at = name.find('@');
  const bool closed = name.ends_with(".journal");
  if (at == std::string_view::npos || (!closed && !name.ends_with(".journal~"))) {
    return std::nullopt;
  }
  name = name.substr(at + 1, name.rfind(".journal") - at - 1);
  const std::size_t first = name.find('-');
  const std::size_t last = name.rfind('-');
  if (first == std::string_view::npos || (closed == (first == last))) return std::nullopt;
  const auto microseconds = hexadecimal(closed ? name.substr(last + 1) : name.substr(0, first));
  if (!microseconds || *microseconds > static_cast<std::uint64_t>(INT64_MAX) / 1000) {
    return std::nullopt;
  }
  return std::min(static_cast<std::int64_t>(*microseconds) * 1000, modified_ns);
}

std::optional<std::int64_t> deletionTimeNs(std::string_view record) {
  constexpr std::string_view kKey = "\nDeletionDate=";
  const std::size_t at = record.find(kKey);
  if (at == std::string_view::npos) return std::nullopt;
  std::string_view text = record.substr(at + kKey.size());
  std::tm date{};
  if (!takeNumber(text, 4, '-', date.tm_year) || !takeNumber(text, 2, '-', date.tm_mon) ||
      !takeNumber(text, 2, 'T', date.tm_mday) || !takeNumber(text, 2, ':', date.tm_hour) ||
      !takeNumber(text, 2, ':', date.tm_min) || !takeNumber(text, 2, 0, date.tm_sec)) {
    return std::nullopt;
  }
  date.tm_year -= 1900;
  date.tm_mon -= 1;
  date.tm_isdst = -1;  // whatever held then
  const std::time_t seconds = std::mktime(&date);
  if (seconds == -1) return std::nullopt;
  return cachedir::nsOf(seconds, 0);
}

std::optional<std::int64_t> trashTimeNs(int trash_fd, std::string_view path) {
  constexpr std::string_view kFiles = "files/";
  constexpr std::string_view kInfo = "info/";
  constexpr std::string_view kEnding = ".trashinfo";
  std::string record_path;
  if (path.starts_with(kFiles)) {
    path.remove_prefix(kFiles.size());
    record_path = std::string(kInfo) + std::string(path.substr(0, path.find('/')));
    record_path += kEnding;
  } else if (path.starts_with(kInfo) && path.ends_with(kEnding)) {
    record_path = path;
  } else {
    return std::nullopt;
  }
  const cachedir::UniqueFd fd =
      cachedir::openBeneath(trash_fd, record_path.c_str(), O_RDONLY | O_NONBLOCK);
  if (!fd && errno == ENOENT) return std::numeric_limits<std::int64_t>::min();
  std::array<char, 8192> record{};
  const ssize_t size = fd ? ::read(fd.get(), record.data(), record.size()) : -1;
  if (size <= 0) return std::nullopt;
  return deletionTimeNs({record.data(), static_cast<std::size_t>(size)});
}

}  // namespace spacekeep::command
