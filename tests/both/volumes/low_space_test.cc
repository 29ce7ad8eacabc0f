#include "support/volumes/low_space.h"

#include <gtest/gtest.h>

#include <vector>

namespace spacekeep {
namespace {

constexpr std::uint64_t kMiB = 1024 * 1024;
constexpr std::uint64_t kGiB = 1024 * kMiB;
using enum SpaceLevel;

SpaceThresholds defaults(const VolumeSpace& space) { return spaceThresholds(space, {}); }

SpaceLevel levelByDefaults(const VolumeSpace& space, SpaceLevel previous) {
  return spaceLevel(space, defaults(space), previous);
}

TEST(SpaceThresholds, FivePercentUpToFiveHundredMebibytes) {
  EXPECT_EQ(defaults({.size_bytes = 1000}).low_bytes, 50U);
  EXPECT_EQ(defaults({.size_bytes = 10000 * kMiB}).low_bytes, 500 * kMiB);
  EXPECT_EQ(defaults({.size_bytes = 10000 * kMiB - 20}).low_bytes, 500 * kMiB - 1);
  EXPECT_EQ(defaults({.size_bytes = 100'000 * kGiB}).low_bytes, 500 * kMiB);
  EXPECT_EQ(defaults({.size_bytes = UINT64_MAX}).low_bytes, 500 * kMiB);
}

TEST(SpaceThresholds, VeryLowIsAThird) {
  EXPECT_EQ(defaults({.size_bytes = 6000}).very_low_bytes, 100U);
  EXPECT_EQ(defaults({.size_bytes = kGiB * 100}).very_low_bytes, 500 * kMiB / 3);
}

TEST(SpaceThresholds, InodesFivePercentAndOnePointSeven) {
  const SpaceThresholds thresholds = defaults({.inodes = 10000});
  EXPECT_EQ(thresholds.low_inodes, 500U);
  EXPECT_EQ(thresholds.very_low_inodes, 170U);
  EXPECT_EQ(defaults({.inodes = UINT64_MAX}).very_low_inodes,
            UINT64_MAX / 1000 * 17 + UINT64_MAX % 1000 * 17 / 1000);
}

TEST(SpaceThresholds, SettingsMoveThem) {
  const VolumeSpace space{.size_bytes = 100 * kGiB, .inodes = 1'000'000};
  EXPECT_EQ(spaceThresholds(space, {.bytes = 3 * kGiB, .percent = 50, .inodes_percent = 10}),
            (SpaceThresholds{.low_bytes = 3 * kGiB,
                             .very_low_bytes = kGiB,
                             .low_inodes = 100'000,
                             .very_low_inodes = 34'000}));
  EXPECT_EQ(spaceThresholds(space, {.bytes = 100 * kGiB, .percent = 12.5}).low_bytes,
            12 * kGiB + kGiB / 2);
  EXPECT_EQ(spaceThresholds(space, {.percent = 0.01}).low_bytes, 100 * kGiB / 10'000);
  EXPECT_EQ(spaceThresholds(space, {.percent = 1e-9}).low_bytes, 100 * kGiB / 1'000'000);
}

TEST(SpaceThresholds, ZeroPercentIsNeverLowByThatMeasure) {
  const VolumeSpace full{.size_bytes = kGiB, .available_bytes = 0, .inodes = 1000};
  const auto level = [&](const LowSpaceSettings& settings) {
    return spaceLevel(full, spaceThresholds(full, settings), kEnough);
  };
  EXPECT_EQ(level({.percent = 0, .inodes_percent = 0}), kEnough);
  EXPECT_EQ(level({.percent = 0, .inodes_percent = 5}), kVeryLow);
  EXPECT_EQ(level({.percent = 5, .inodes_percent = 0}), kVeryLow);
}

struct LevelCase {
  const char* what;
  std::uint64_t available;
  SpaceLevel previous;
  SpaceLevel expected;
};

// Size 12000: low below 600, very low below 200; left again at 900 and at 300.
TEST(SpaceLevel, ByBytesWithHysteresis) {
  const std::vector<LevelCase> cases = {
      {"enough", 12000, kEnough, kEnough},
      {"at the threshold", 600, kEnough, kEnough},
      {"below the threshold", 599, kEnough, kLow},
      {"at the very low threshold", 200, kEnough, kLow},
      {"below the very low threshold", 199, kEnough, kVeryLow},
      {"nothing left", 0, kEnough, kVeryLow},
      {"stays low at the threshold", 600, kLow, kLow},
      {"stays low up to one and a half", 899, kLow, kLow},
      {"left at one and a half", 900, kLow, kEnough},
      {"gets worse at once", 199, kLow, kVeryLow},
      {"stays very low up to one and a half", 299, kVeryLow, kVeryLow},
      {"low again at one and a half", 300, kVeryLow, kLow},
      {"from very low it stays low up to one and a half", 899, kVeryLow, kLow},
      {"from very low straight to enough", 900, kVeryLow, kEnough},
  };
  for (const LevelCase& each : cases) {
    EXPECT_EQ(
        levelByDefaults({.size_bytes = 12000, .available_bytes = each.available}, each.previous),
        each.expected)
        << each.what;
  }
}

TEST(SpaceLevel, ByInodesThoughThereAreBytes) {
  const auto level = [](std::uint64_t inodes_left, SpaceLevel previous) {
    return levelByDefaults({.size_bytes = 1000,
                            .available_bytes = 1000,
                            .inodes = 10000,
                            .available_inodes = inodes_left},
                           previous);
  };
  EXPECT_EQ(level(500, kEnough), kEnough);
  EXPECT_EQ(level(499, kEnough), kLow);
  EXPECT_EQ(level(169, kEnough), kVeryLow);
  EXPECT_EQ(level(749, kLow), kLow);
  EXPECT_EQ(level(750, kLow), kEnough);
}

TEST(SpaceLevel, TheWorseOfBytesAndInodesCounts) {
  EXPECT_EQ(
      levelByDefaults(
          {.size_bytes = 12000, .available_bytes = 199, .inodes = 10000, .available_inodes = 499},
          kEnough),
      kVeryLow);
}

TEST(SpaceLevel, AFileSystemThatDoesNotCountInodesIsNotShortOfThem) {
  EXPECT_EQ(levelByDefaults({.size_bytes = 1000, .available_bytes = 1000}, kEnough), kEnough);
}

TEST(SpaceLevel, AFileSystemWithoutALimitIsNeverShort) {
  EXPECT_EQ(levelByDefaults({}, kEnough), kEnough);
}

}  // namespace
}  // namespace spacekeep
