#include "support/volumes/low_space.h"

#include <algorithm>
#include <cmath>

namespace spacekeep {
namespace {

constexpr std::uint64_t kMillion = 1'000'000;

/// Parts per million: a product of floating numbers would be off by bytes that tests can see. What
/// is not 0 does not become 0.
std::uint64_t millionthsOf(double percent) {
  if (!(percent > 0)) return 0;
  return std::max<std::uint64_t>(1, static_cast<std::uint64_t>(std::llround(percent * 10'000)));
}

/// The share of `number`, cut off, without the overflow of multiplying first.
std::uint64_t shareOf(std::uint64_t number, std::uint64_t millionths) {
  return number / kMillion * millionths + number % kMillion * millionths / kMillion;
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

std::uint64_t exitThreshold(std::uint64_t threshold) {
  const std::uint64_t half = threshold / 2 + threshold % 2;
  return threshold > UINT64_MAX - half ? UINT64_MAX : threshold + half;
}

SpaceThresholds spaceThresholds(const VolumeSpace& space, const LowSpaceSettings& settings) {
  const std::uint64_t low_bytes =
      std::min(shareOf(space.size_bytes, millionthsOf(settings.percent)), settings.bytes);
  return {
      .low_bytes = low_bytes,
      .very_low_bytes = low_bytes / 3,
      .low_inodes = shareOf(space.inodes, millionthsOf(settings.inodes_percent)),
      .very_low_inodes = shareOf(space.inodes, millionthsOf(settings.inodes_percent / 5 * 1.7))};
}

SpaceLevel spaceLevel(const VolumeSpace& space, const SpaceThresholds& thresholds,
                      SpaceLevel previous) {
  const SpaceLevel by_bytes =
      levelOf(space.available_bytes, thresholds.low_bytes, thresholds.very_low_bytes, previous);
  if (space.inodes == 0) return by_bytes;
  const SpaceLevel by_inodes =
      levelOf(space.available_inodes, thresholds.low_inodes, thresholds.very_low_inodes, previous);
  return std::max(by_bytes, by_inodes);
}

}  // namespace spacekeep
