// Thread safety: pure functions over the file system and /proc.
//
// Signs that a program lives in a directory although no file in it is open.
#pragma once

#include <set>
#include <string>

namespace spacekeep::command {

/// Whether a socket or a pipe stands anywhere below the directory `fd`: whoever made it may be
/// waiting there for as long as the machine runs, and no time of use tells. Also when something
/// could not be looked at.
[[nodiscard]] bool hasMeetingPoint(int fd);

/// Where processes stand, as far as it may be seen.
[[nodiscard]] std::set<std::string> workingDirectories(const std::string& proc = "/proc");
/// Mount points (proc_pid_mountinfo(5)).
[[nodiscard]] std::set<std::string> mountPoints();

/// Whether one of `paths` is `path` or below it.
[[nodiscard]] bool isAnyWithin(const std::set<std::string>& paths, const std::string& path);

}  // namespace spacekeep::command
