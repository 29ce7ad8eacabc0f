// Thread safety: plain values and pure functions.
//
// What counts as short of space, as far as an administrator may say. The settings stand in the
// client state under the keys below; where a key is absent its default holds.
#pragma once

#include <cstdint>
#include <functional>
#include <string>

#include "support/values/value.h"

namespace spacekeep {

/// Number of bytes: a volume with more than that available is never short of bytes.
inline constexpr const char* kLowSpaceBytesKey = "SPACEKEEP_LOW_SPACE_BYTES";
/// Number, percent of the volume's size, fractions included. 0: never short of bytes.
inline constexpr const char* kLowSpacePercentKey = "SPACEKEEP_LOW_SPACE_PERCENT";
/// Number, percent of the volume's inodes, fractions included. 0: never short of inodes.
inline constexpr const char* kLowSpaceInodesPercentKey = "SPACEKEEP_LOW_SPACE_INODES_PERCENT";

inline constexpr std::uint64_t kLeastLowSpaceBytes = 1ULL << 20;
inline constexpr std::uint64_t kMostLowSpaceBytes = 1ULL << 60;
/// Beyond half of its size a volume would be short for most of its life.
inline constexpr double kMostLowSpacePercent = 50;

/// A volume is low below min(`percent` of its size, `bytes`), or with less than `inodes_percent` of
/// its inodes left.
struct LowSpaceSettings {
  std::uint64_t bytes = 500 * 1024 * 1024;
  double percent = 5;
  double inodes_percent = 5;
  bool operator==(const LowSpaceSettings&) const = default;
};

/// Told what is wrong with one value, in words for a person.
using RefuseLowSpaceSetting = std::function<void(const std::string& problem)>;

/// What stands in `state`. A value of the wrong kind or out of its range is told to `refuse` (once
/// per key), and the default holds in its place.
[[nodiscard]] LowSpaceSettings lowSpaceSettingsFrom(const Dictionary& state,
                                                    const RefuseLowSpaceSetting& refuse);

}  // namespace spacekeep
