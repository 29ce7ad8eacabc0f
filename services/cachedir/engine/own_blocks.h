// Thread safety: pure function over a descriptor.
//
// How many of a file's allocated bytes come back when it is deleted.
#pragma once

#include <sys/stat.h>
#include <cstdint>

namespace spacekeep::cachedir {

/// Allocated bytes without those that other files share (reflinks, snapshots) and, on btrfs, those
/// that never were data blocks (inline content, content not yet written). From FS_IOC_FIEMAP; a
/// file system without it counts in full.
[[nodiscard]] std::uint64_t ownBytes(int fd, const struct stat& facts);

}  // namespace spacekeep::cachedir
