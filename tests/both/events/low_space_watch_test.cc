#include "support/events/low_space_watch.h"

#include <gtest/gtest.h>

namespace spacekeep {
namespace {

constexpr std::uint64_t kMiB = 1024 * 1024;
constexpr std::uint64_t kGiB = 1024 * kMiB;
constexpr std::uint64_t kSecond = 1'000'000'000;
constexpr std::uint64_t kHour = 3600 * kSecond;

/// A volume of 64 GiB (low below 500 MiB, very low below a third of that).
std::vector<VolumeSample> volume(std::uint64_t available, SpaceLevel level = SpaceLevel::kEnough,
                                 const std::string& path = "/data") {
  const VolumeSpace space{.size_bytes = 64 * kGiB, .available_bytes = available};
  return {{.volume = path,
           .file_system = 1,
           .space = space,
           .thresholds = spaceThresholds(space, {}),
           .level = level}};
}

TEST(LowSpaceWatch, WithoutVolumesItLooksRarely) {
  LowSpaceWatch watch;
  const WatchStep step = watch.look({}, 0);
  EXPECT_EQ(step.flags, 0U);
  EXPECT_EQ(step.pause_ns, 4 * kHour);
}

TEST(LowSpaceWatch, TheVolumeInGreatestNeedDecides) {
  LowSpaceWatch watch;
  auto samples = volume(60 * kGiB);
  samples.push_back(volume(890 * kMiB, SpaceLevel::kEnough, "/near")[0]);
  EXPECT_EQ(watch.look(samples, 0).pause_ns, 4 * kSecond);
}

TEST(LowSpaceWatch, AFastFillingMakesItLookSooner) {
  LowSpaceWatch watch;
  EXPECT_EQ(watch.look(volume(40 * kGiB + 250 * kMiB), 0).pause_ns, 256 * kSecond);
  // 20 GiB in 100 s: 0.2 GiB/s; the 20 GiB that are left last for 100 s.
  EXPECT_EQ(watch.look(volume(20 * kGiB + 250 * kMiB), 100 * kSecond).pause_ns, 100 * kSecond);
}

TEST(LowSpaceWatch, WhatIsFilledWithinAMinuteIsNotFarHoweverMuchIsLeft) {
  LowSpaceWatch watch;
  (void)watch.look(volume(60 * kGiB), 0);
  // 20 GiB in 20 s; the 40 GiB that are left last for 40 s.
  EXPECT_EQ(watch.look(volume(40 * kGiB + 250 * kMiB), 20 * kSecond).pause_ns / kSecond, 40U);
}

TEST(LowSpaceWatch, ALowVolumeIsReportedAtOnceAndAgainWithGrowingPauses) {
  LowSpaceWatch watch;
  std::vector<std::uint64_t> reported_at_s;
  for (std::uint64_t second = 0; second < 15000; second += 10) {
    const WatchStep step = watch.look(volume(0, SpaceLevel::kVeryLow), second * kSecond);
    if (step.flags == 0) continue;
    EXPECT_EQ(step.flags, kVqVeryLowDisk);
    reported_at_s.push_back(second);
  }
  EXPECT_EQ(reported_at_s,
            (std::vector<std::uint64_t>{0, 60, 180, 420, 900, 1860, 3780, 7380, 10980, 14580}));
}

TEST(LowSpaceWatch, WhichFlagsAnEventCarries) {
  using enum SpaceLevel;
  EXPECT_EQ(LowSpaceWatch().look(volume(0, kLow), 0).flags, 0x4U);
  EXPECT_EQ(LowSpaceWatch().look(volume(0, kVeryLow), 0).flags, 0x200U);
  auto both = volume(0, kLow);
  both.push_back(volume(0, kVeryLow, "/other")[0]);
  EXPECT_EQ(LowSpaceWatch().look(both, 0).flags, 0x204U);
  EXPECT_EQ(LowSpaceWatch().look(volume(kGiB, kEnough), 0).flags, 0U);
}

TEST(LowSpaceWatch, GettingWorseIsReportedAtOnce) {
  LowSpaceWatch watch;
  EXPECT_EQ(watch.look(volume(180 * kMiB, SpaceLevel::kLow), 0).flags, 0x4U);
  EXPECT_EQ(watch.look(volume(175 * kMiB, SpaceLevel::kLow), 10 * kSecond).flags, 0U);
  EXPECT_EQ(watch.look(volume(160 * kMiB, SpaceLevel::kVeryLow), 20 * kSecond).flags, 0x200U);
  EXPECT_EQ(watch.look(volume(175 * kMiB, SpaceLevel::kLow), 30 * kSecond).flags, 0U);
  EXPECT_EQ(watch.look(volume(160 * kMiB, SpaceLevel::kVeryLow), 40 * kSecond).flags, 0x200U);
}

TEST(LowSpaceWatch, WhileAnEventIsHandledNothingIsReportedAndAfterwardsTheWorstIs) {
  using enum SpaceLevel;
  LowSpaceWatch watch;
  EXPECT_EQ(watch.look(volume(400 * kMiB, kLow), 0).flags, 0x4U);
  EXPECT_EQ(watch.look(volume(100 * kMiB, kVeryLow), kSecond, true).flags, 0U);
  watch.handlingEnded(2 * kSecond);
  EXPECT_EQ(watch.look(volume(100 * kMiB, kVeryLow), 2 * kSecond).flags, 0x200U);
}

TEST(LowSpaceWatch, AVolumeThatWasEnoughMeanwhileAndIsShortAgainIsNew) {
  using enum SpaceLevel;
  LowSpaceWatch watch;
  EXPECT_EQ(watch.look(volume(400 * kMiB, kLow), 0).flags, 0x4U);
  EXPECT_EQ(watch.look(volume(900 * kMiB, kEnough), kSecond, true).flags, 0U);
  EXPECT_EQ(watch.look(volume(400 * kMiB, kLow), 2 * kSecond, true).flags, 0U);
  watch.handlingEnded(3 * kSecond);
  EXPECT_EQ(watch.look(volume(400 * kMiB, kLow), 3 * kSecond).flags, 0x4U);
}

TEST(LowSpaceWatch, ThePauseBetweenEventsCountsFromTheEndOfTheHandling) {
  LowSpaceWatch watch;
  EXPECT_NE(watch.look(volume(0, SpaceLevel::kVeryLow), 0).flags, 0U);
  EXPECT_EQ(watch.look(volume(0, SpaceLevel::kVeryLow), 899 * kSecond, true).flags, 0U);
  watch.handlingEnded(900 * kSecond);
  EXPECT_EQ(watch.look(volume(0, SpaceLevel::kVeryLow), 900 * kSecond).flags, 0U);
  EXPECT_EQ(watch.look(volume(0, SpaceLevel::kVeryLow), 959 * kSecond).flags, 0U);
  EXPECT_NE(watch.look(volume(0, SpaceLevel::kVeryLow), 960 * kSecond).flags, 0U);
}

TEST(LowSpaceWatch, WhenAPurgeHelpedButNotEnoughTheNextEventFollowsAtOnce) {
  LowSpaceWatch watch;
  EXPECT_NE(watch.look(volume(10 * kMiB, SpaceLevel::kVeryLow), 0).flags, 0U);
  EXPECT_EQ(watch.look(volume(200 * kMiB, SpaceLevel::kLow), 899 * kSecond, true).flags, 0U);
  watch.handlingEnded(900 * kSecond);
  EXPECT_NE(watch.look(volume(200 * kMiB, SpaceLevel::kLow), 900 * kSecond).flags, 0U);
}

TEST(LowSpaceWatch, WhatAPurgeFreedAndOthersUsedUpMeanwhileIsNotMissed) {
  LowSpaceWatch watch;
  EXPECT_NE(watch.look(volume(10 * kMiB, SpaceLevel::kVeryLow), 0).flags, 0U);
  EXPECT_EQ(watch.look(volume(200 * kMiB, SpaceLevel::kLow), kSecond, true).flags, 0U);
  EXPECT_EQ(watch.look(volume(10 * kMiB, SpaceLevel::kLow), 2 * kSecond, true).flags, 0U);
  watch.handlingEnded(900 * kSecond);
  EXPECT_NE(watch.look(volume(10 * kMiB, SpaceLevel::kLow), 900 * kSecond).flags, 0U);
}

TEST(LowSpaceWatch, WhileSpaceIsUsedUpFurtherTheNextEventComesSoon) {
  LowSpaceWatch watch;
  EXPECT_NE(watch.look(volume(400 * kMiB, SpaceLevel::kLow), 0).flags, 0U);
  watch.handlingEnded(100 * kSecond);
  EXPECT_EQ(watch.look(volume(400 * kMiB, SpaceLevel::kLow), 100 * kSecond).flags, 0U);
  // Less than a sixteenth of the threshold, and then more.
  EXPECT_EQ(watch.look(volume(370 * kMiB, SpaceLevel::kLow), 101 * kSecond).flags, 0U);
  EXPECT_NE(watch.look(volume(360 * kMiB, SpaceLevel::kLow), 102 * kSecond).flags, 0U);
}

TEST(LowSpaceWatch, EventsThatDoNotHelpComeRarerThoughSpaceIsUsedUp) {
  LowSpaceWatch watch;
  std::vector<std::uint64_t> reported_at_s;
  // A tebibyte that is short all the way down, with services that have nothing to give.
  for (std::uint64_t second = 0; second < 4000; ++second) {
    auto samples = volume((4000 - second) * 40 * kMiB, SpaceLevel::kLow);
    samples[0].space.size_bytes = 1024 * kGiB;
    const WatchStep step = watch.look(samples, second * kSecond);
    if (step.flags == 0) continue;
    reported_at_s.push_back(second);
    watch.handlingEnded(second * kSecond);
  }
  EXPECT_EQ(reported_at_s,
            (std::vector<std::uint64_t>{0, 1, 3, 7, 15, 31, 63, 123, 243, 483, 963, 1923, 3843}));
}

TEST(LowSpaceWatch, InodesThatAreUsedUpCountAsMuchAsBytes) {
  LowSpaceWatch watch;
  const auto inodes = [](std::uint64_t available) {
    auto samples = volume(60 * kGiB, SpaceLevel::kLow);
    samples[0].space.inodes = 1'000'000;  // low below 50,000
    samples[0].space.available_inodes = available;
    samples[0].thresholds = spaceThresholds(samples[0].space, {});
    return samples;
  };
  EXPECT_NE(watch.look(inodes(40'000), 0).flags, 0U);
  watch.handlingEnded(kSecond);
  EXPECT_EQ(watch.look(inodes(38'000), 2 * kSecond).flags, 0U);
  EXPECT_NE(watch.look(inodes(36'000), 3 * kSecond).flags, 0U);
}

TEST(LowSpaceWatch, AfterRecoveryTheNextShortageIsNew) {
  LowSpaceWatch watch;
  EXPECT_NE(watch.look(volume(0, SpaceLevel::kLow), 0).flags, 0U);
  EXPECT_EQ(watch.look(volume(kGiB), 10 * kSecond).flags, 0U);
  EXPECT_NE(watch.look(volume(0, SpaceLevel::kLow), 20 * kSecond).flags, 0U);
}

TEST(LowSpaceWatch, AnotherFileSystemAtTheSamePlaceIsNew) {
  LowSpaceWatch watch;
  auto samples = volume(0, SpaceLevel::kLow);
  EXPECT_NE(watch.look(samples, 0).flags, 0U);
  samples[0].file_system = 2;
  EXPECT_NE(watch.look(samples, kSecond).flags, 0U);
}

}  // namespace
}  // namespace spacekeep
