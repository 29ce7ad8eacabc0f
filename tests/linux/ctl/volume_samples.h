// Thread safety: pure functions.
//
// Volumes as the tool sees them, with the thresholds that hold by default.
#pragma once

#include <cstdint>
#include <string>

#include "support/volumes/low_space.h"
#include "support/volumes/space_source.h"

namespace spacekeep::ctl {

inline constexpr std::uint64_t kGiB = 1ULL << 30;
inline constexpr std::uint64_t kMiB = 1ULL << 20;

inline VolumeSample sampleOf(const std::string& volume, const VolumeSpace& space) {
  const SpaceThresholds thresholds = spaceThresholds(space, LowSpaceSettings{});
  return {.volume = volume,
          .file_system = 1,
          .space = space,
          .thresholds = thresholds,
          .level = spaceLevel(space, thresholds, SpaceLevel::kEnough)};
}

}  // namespace spacekeep::ctl
