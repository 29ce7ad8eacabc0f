// Thread safety: pure functions over descriptors and /proc.
//
// What the index has to know of file systems and mounts.
#pragma once

#include <cstdint>
#include <optional>
#include <string>

namespace spacekeep::cachedir {

/// How long after the last change the kernel may still change how many blocks a file occupies,
/// without telling anybody: until what was written is written out and, on xfs, what was reserved in
/// advance is given back. 0 on tmpfs. None for a file system of which nobody has shown that
/// inotify(7) tells everything: network and stacked ones do not.
[[nodiscard]] std::optional<std::uint64_t> settleNs(int fd);

/// The mounts whose mount point lies below the directory `path`, in words that are equal only when
/// the mounts are (from `table`, proc_pid_mountinfo(5)).
[[nodiscard]] std::string mountsBelow(const std::string& path,
                                      const std::string& table = "/proc/self/mountinfo");

}  // namespace spacekeep::cachedir
