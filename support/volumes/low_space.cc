#include "support/volumes/low_space.h"

#include <algorithm>

namespace spacekeep {
namespace {

constexpr std::uint64_t kLargestLowBytes = 500ULL * 1024 * 1024;

/// One and a half times, saturating.
std::uint64_t exitThreshold(std::uint64_t threshold) {
  const std::uint64_t half = threshold / 2 + threshold % 2;
  return threshold > UINT64_MAX - half ? UINT64_MAX : threshold + half;
}

/// 1.7 %, without the overflow of multiplying first.
std::uint64_t seventeenPerMille(std::uint64_t number) {
  return number / 1000 * 17 + number % 1000 * 17 / 1000;
}

SpaceLevel levelOf(std::uint64_t available, std::uint64_t low, std::uint64_t very_low,
                   SpaceLevel previous) {
  const bool was_very_low = previous == SpaceLevel::kVeryLow;
  const bool was_low = previous != SpaceLevel::kEnough;
  if (available < (was_very_low ? exitThreshold(very_low) : very_low)) return SpaceLevel::kVeryLow;
  if (available < (was_low ? exitThreshold(low) : low)) return SpaceLevel::kLow;
  return SpaceLevel::kEnough;
}

}  // namespace

SpaceThresholds spaceThresholds(const VolumeSpace& space) {
  const std::uint64_t low_bytes = std::min(space.size_bytes / 20, kLargestLowBytes);
  return {.low_bytes = low_bytes,
          .very_low_bytes = low_bytes / 3,
          .low_inodes = space.inodes / 20,
          .very_low_inodes = seventeenPerMille(space.inodes)};
}

SpaceLevel spaceLevel(const VolumeSpace& space, SpaceLevel previous) {
  const SpaceThresholds thresholds = spaceThresholds(space);
  const SpaceLevel by_bytes =
      levelOf(space.available_bytes, thresholds.low_bytes, thresholds.very_low_bytes, previous);
  if (space.inodes == 0) return by_bytes;
  const SpaceLevel by_inodes =
      levelOf(space.available_inodes, thresholds.low_inodes, thresholds.very_low_inodes, previous);
  return std::max(by_bytes, by_inodes);
}

}  // namespace spacekeep
