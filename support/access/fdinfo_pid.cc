#include "support/access/fdinfo_pid.h"

#include <algorithm>
#include <charconv>
#include <system_error>

namespace spacekeep::access {

std::optional<int> pidFromFdinfo(std::string_view fdinfo) {
  constexpr std::string_view kField = "\nPid:";
  const std::size_t at = fdinfo.find(kField);
  if (at == std::string_view::npos) return std::nullopt;
  std::string_view number = fdinfo.substr(at + kField.size());
  number = number.substr(0, number.find('\n'));
  number.remove_prefix(std::min(number.find_first_not_of(" \t"), number.size()));
  int pid = 0;
  const char* end = number.data() + number.size();
  const auto [read_to, problem] = std::from_chars(number.data(), end, pid);
  const bool is_whole = problem == std::errc() && read_to == end;
  return is_whole && pid > 0 ? std::optional<int>(pid) : std::nullopt;
}

}  // namespace spacekeep::access
