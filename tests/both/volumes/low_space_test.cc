#include "support/volumes/low_space.h"

#include <gtest/gtest.h>

#include <vector>

namespace spacekeep {
namespace {

constexpr std::uint64_t kMiB = 1024 * 1024;
constexpr std::uint64_t kGiB = 1024 * kMiB;
using enum SpaceLevel;

TEST(SpaceThresholds, FivePercentUpToFiveHundredMebibytes) {
  EXPECT_EQ(spaceThresholds({.size_bytes = 1000}).low_bytes, 50U);
  EXPECT_EQ(spaceThresholds({.size_bytes = 10000 * kMiB}).low_bytes, 500 * kMiB);
  EXPECT_EQ(spaceThresholds({.size_bytes = 10000 * kMiB - 20}).low_bytes, 500 * kMiB - 1);
  EXPECT_EQ(spaceThresholds({.size_bytes = 100'000 * kGiB}).low_bytes, 500 * kMiB);
  EXPECT_EQ(spaceThresholds({.size_bytes = UINT64_MAX}).low_bytes, 500 * kMiB);
}

TEST(SpaceThresholds, VeryLowIsAThird) {
  EXPECT_EQ(spaceThresholds({.size_bytes = 6000}).very_low_bytes, 100U);
  EXPECT_EQ(spaceThresholds({.size_bytes = kGiB * 100}).very_low_bytes, 500 * kMiB / 3);
}

TEST(SpaceThresholds, InodesFivePercentAndOnePointSeven) {
  const SpaceThresholds thresholds = spaceThresholds({.inodes = 10000});
  EXPECT_EQ(thresholds.low_inodes, 500U);
  EXPECT_EQ(thresholds.very_low_inodes, 170U);
  EXPECT_EQ(spaceThresholds({.inodes = UINT64_MAX}).very_low_inodes,
            UINT64_MAX / 1000 * 17 + UINT64_MAX % 1000 * 17 / 1000);
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
    EXPECT_EQ(spaceLevel({.size_bytes = 12000, .available_bytes = each.available}, each.previous),
              each.expected)
        << each.what;
  }
}

TEST(SpaceLevel, ByInodesThoughThereAreBytes) {
  const auto level = [](std::uint64_t inodes_left, SpaceLevel previous) {
    return spaceLevel({.size_bytes = 1000,
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
      spaceLevel(
          {.size_bytes = 12000, .available_bytes = 199, .inodes = 10000, .available_inodes = 499},
          kEnough),
      kVeryLow);
}

TEST(SpaceLevel, AFileSystemThatDoesNotCountInodesIsNotShortOfThem) {
  EXPECT_EQ(spaceLevel({.size_bytes = 1000, .available_bytes = 1000}, kEnough), kEnough);
}

TEST(SpaceLevel, AFileSystemWithoutALimitIsNeverShort) {
  EXPECT_EQ(spaceLevel({}, kEnough), kEnough);
}

}  // namespace
}  // namespace spacekeep
