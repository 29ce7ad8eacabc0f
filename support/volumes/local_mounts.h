// Thread safety: plain values and pure functions.
//
// Which mounts are local volumes, decided from the mount table alone: nothing here touches a file
// system, so one that hangs cannot take the daemon along.
#pragma once

#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

namespace spacekeep {

/// One line of the mount table (proc(5), /proc/pid/mountinfo).
struct MountEntry {
  std::int32_t id = 0;
  std::int32_t parent_id = 0;
  std::uint32_t device_major = 0;
  std::uint32_t device_minor = 0;
  std::string mount_point = {};
  std::string type = {};
  std::string source = {};
  /// The file system, not the mount: a service manager may show the daemon writable file systems
  /// by read-only mounts, and others go on writing to them.
  bool read_only = false;
};

/// What a type of file system is to us.
enum class FileSystemKind {
  kLocal,      ///< stands on a block device or flash of this machine, or is a tmpfs
  kRootLocal,  ///< local as the root only: an overlay
  kDistant,  ///< on the network, in another process, or mounted on first use: may hang when touched
  kPseudo,   ///< holds no data of anybody
};
[[nodiscard]] FileSystemKind kindOf(const MountEntry& mount);

/// The local volumes among `table`, in its order: writable, visible at their mount point (not
/// covered by a later mount), and reachable without passing through a distant file system. Second
/// and further mounts of one file system are among them.
[[nodiscard]] std::vector<MountEntry> localMounts(const std::vector<MountEntry>& table);

/// The same file system gives the same number.
[[nodiscard]] std::uint64_t fileSystemNumber(const MountEntry& mount);

}  // namespace spacekeep
