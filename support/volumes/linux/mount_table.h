// Thread safety: every member may be called from any thread.
//
// The local mounts as they are now. The table is read anew only when the kernel says that it has
// changed, which costs one poll(2) to find out.
#pragma once

#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "support/runtime/runtime.h"
#include "support/volumes/local_mounts.h"
#include "support/volumes/low_space.h"

namespace spacekeep {

class MountTable {
 public:
  using Mounts = std::shared_ptr<const std::vector<MountEntry>>;

  /// `path` is "/proc/self/mountinfo" but for tests.
  explicit MountTable(std::string path = "/proc/self/mountinfo");
  ~MountTable();
  MountTable(const MountTable&) = delete;
  MountTable& operator=(const MountTable&) = delete;

  /// The local volumes that are directories (localMounts()), never null. While the table cannot be
  /// read the last one stands, and the reason is logged.
  [[nodiscard]] Mounts current();

  /// How often the table was read.
  [[nodiscard]] std::uint64_t readings() const;

 private:
  bool changedSinceLastLook();
  void readAgain();

  const std::string path_;
  const int fd_;  // open on path_ for its change signal, -1 when that failed
  mutable rt::Mutex mutex_;
  // Protected by mutex_.
  Mounts mounts_;
  bool stale_ = true;
  std::uint64_t readings_ = 0;
};

/// The space of the file system that is mounted there, by statvfs(3). None when `mount` is not what
/// is found at its mount point any more.
[[nodiscard]] std::optional<VolumeSpace> measureSpace(const MountEntry& mount);

}  // namespace spacekeep
