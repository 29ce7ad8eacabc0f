// Thread safety: pure functions; a Root belongs to one thread at a time.
//
// The cache directories of one request, opened once. Everything else the engine touches is reached
// from these descriptors, so a directory that is swapped afterwards cannot lead it elsewhere.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "services/cachedir/engine/file_facts.h"
#include "services/cachedir/engine/rules.h"
#include "services/cachedir/engine/unique_fd.h"

namespace spacekeep::cachedir {

struct Root {
  const DirectoryRule* rule = nullptr;
  UniqueFd fd;
  Inode inode;
  std::uint64_t mount_id = 0;
  /// The device of the whole file system. btrfs gives each subvolume a device number of its own in
  /// stat(2), while /proc/PID/maps and the mount table know only this one.
  std::uint64_t file_system = 0;
};

struct OpenedRoots {
  std::vector<Root> roots;
  std::vector<std::string> problems;  // a directory that cannot be used or is left out, in words
};

/// Opens each directory of `rules`; with `volume` (a mount point) only those on its file system. A
/// directory that does not exist takes no part and is no problem: caches come and go.
[[nodiscard]] OpenedRoots openRoots(const Rules& rules, const std::optional<std::string>& volume);

}  // namespace spacekeep::cachedir
