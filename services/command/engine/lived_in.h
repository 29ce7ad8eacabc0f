// Thread safety: pure functions over the file system and /proc.
//
// Signs that a program lives in a directory although no file in it is open.
#pragma once

#include <set>
#include <string>

#include "services/cachedir/engine/file_facts.h"

namespace spacekeep::command {

/// Directories that processes stand in, take for "/" or have open, as far as it may be seen. By
/// inode, because a process may know a directory by another path, in a mount namespace of its own.
/// Of this process only where it stands: it has open what it is looking at.
[[nodiscard]] std::set<cachedir::Inode> heldDirectories(const std::string& proc = "/proc");

/// Whether the directory `fd` or one below it is among `held`, or a socket or a pipe stands there:
/// whoever made it may be waiting there for as long as the machine runs, and no time of use tells.
/// Also when something could not be looked at.
[[nodiscard]] bool hasSignOfLife(int fd, const std::set<cachedir::Inode>& held);

/// Mount points (proc_pid_mountinfo(5)).
[[nodiscard]] std::set<std::string> mountPoints();

/// Whether one of `paths` is `path` or below it.
[[nodiscard]] bool isAnyWithin(const std::set<std::string>& paths, const std::string& path);

}  // namespace spacekeep::command
