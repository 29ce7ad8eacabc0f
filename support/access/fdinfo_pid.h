// Thread safety: pure function.
//
// The process behind a pidfd, as /proc tells it.
#pragma once

#include <optional>
#include <string_view>

namespace spacekeep::access {

/// The number on the line "Pid:" of /proc/self/fdinfo/FD (pidfd_open(2)). None when the process is
/// gone (-1), lies outside this process's namespace (0), or the line is not a whole number.
[[nodiscard]] std::optional<int> pidFromFdinfo(std::string_view fdinfo);

}  // namespace spacekeep::access
