// Thread safety: plain values and pure functions.
//
// When a volume counts as short of space.
#pragma once

#include <cstdint>

namespace spacekeep {

/// What statvfs(3) tells of a file system, in bytes. "available" is what an unprivileged writer can
/// still use, not what is free: some file systems keep a reserve for root.
struct VolumeSpace {
  std::uint64_t size_bytes = 0;
  std::uint64_t available_bytes = 0;
  std::uint64_t inodes = 0;  ///< 0 when the file system makes them as it needs them (btrfs)
  std::uint64_t available_inodes = 0;
  bool operator==(const VolumeSpace&) const = default;
};

enum class SpaceLevel { kEnough, kLow, kVeryLow };

/// A volume with less than this available is low, or very low.
struct SpaceThresholds {
  std::uint64_t low_bytes = 0;
  std::uint64_t very_low_bytes = 0;
  std::uint64_t low_inodes = 0;
  std::uint64_t very_low_inodes = 0;
};

/// min(5 % of the size, 500 MiB), and a third of that; 5 % and 1.7 % of the inodes. A percentage
/// alone would keep tens of gigabytes free on a large volume.
[[nodiscard]] SpaceThresholds spaceThresholds(const VolumeSpace& space);

/// A volume that was at `previous` leaves it upwards only at 1.5 times its threshold, so that one
/// which hovers at the threshold does not set off one purge after another.
[[nodiscard]] SpaceLevel spaceLevel(const VolumeSpace& space, SpaceLevel previous);

}  // namespace spacekeep
