// Thread safety: plain values and pure functions.
//
// When a volume counts as short of space.
#pragma once

#include <cstdint>

#include "support/volumes/low_space_settings.h"

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
  bool operator==(const SpaceThresholds&) const = default;
};

/// Low below min(percent of the size, bytes), very low below a third of that; by default 5 % and
/// 500 MiB. A percentage alone would keep tens of gigabytes free on a large volume. The same for
/// the inodes, whose very low threshold is the fraction 1.7/5 of the low one (by default 5 % and
/// 1.7 %). Percentages count in steps of 0.0001.
[[nodiscard]] SpaceThresholds spaceThresholds(const VolumeSpace& space,
                                              const LowSpaceSettings& settings);

/// Where a volume that was below the threshold leaves it upwards: 1.5 times, saturating.
[[nodiscard]] std::uint64_t exitThreshold(std::uint64_t threshold);

/// A volume that was at `previous` leaves it upwards only at 1.5 times its threshold, so that one
/// which hovers at the threshold does not set off one purge after another.
[[nodiscard]] SpaceLevel spaceLevel(const VolumeSpace& space, const SpaceThresholds& thresholds,
                                    SpaceLevel previous);

}  // namespace spacekeep
