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

TEST(FastestRate, TheFastestFillingCounts) {
  EXPECT_DOUBLE_EQ(fastestRate(10, 500, 10 * kSecond, 1, kHour), 50);
  EXPECT_NEAR(fastestRate(1000, 500, 10 * kSecond, 1, kHour), 1000, 3);
}

TEST(FastestRate, ItFadesByHalfAndNotBelowTheSlowest) {
  EXPECT_DOUBLE_EQ(fastestRate(1000, 0, kHour, 1, kHour), 500);
  EXPECT_DOUBLE_EQ(fastestRate(1000, 0, 2 * kHour, 1, kHour), 250);
  EXPECT_DOUBLE_EQ(fastestRate(1000, 0, 100 * kHour, 7, kHour), 7);
}

TEST(FastestRate, TwoLooksAtOneMomentSayNothing) {
  EXPECT_DOUBLE_EQ(fastestRate(10, 500, 0, 1, kHour), 10);
}

TEST(TimeToUseUp, IsTheQuotientAndNeverOverflows) {
  EXPECT_EQ(timeToUseUpNs(0, 5.0), 0U);
  EXPECT_EQ(timeToUseUpNs(10, 5.0), 2 * kSecond);
  EXPECT_EQ(timeToUseUpNs(UINT64_MAX, 1.0), UINT64_MAX);
}

TEST(LowSpaceWatch, WithoutVolumesItLooksRarely) {
  LowSpaceWatch watch;
  const WatchStep step = watch.look({}, 0);
  EXPECT_EQ(step.flags, 0U);
  EXPECT_EQ(step.pause_ns, 4 * kHour);
}

TEST(LowSpaceWatch, HowLongItPauses) {
  struct Case {
    const char* what;
    std::uint64_t available;
    SpaceLevel level;
    std::uint64_t pause_ns;
  };
  using enum SpaceLevel;
  const Case cases[] = {
      {"very far: hours", 500 * kGiB, kEnough, 4 * kHour},
      {"far: what the slowest filling takes", 500 * kMiB + 8 * kMiB * 1000, kEnough,
       1000 * kSecond},
      {"just far: no less than a minute", 1000 * kMiB, kEnough, 62 * kSecond + kSecond / 2},
      {"near: sooner than in a minute", 740 * kMiB, kEnough, 30 * kSecond},
      {"at the threshold: the shortest pause", 500 * kMiB, kEnough, 1 * kSecond},
      {"low: what is left to the very low threshold", 500 * kMiB / 3 + 80 * kMiB, kLow,
       10 * kSecond},
      {"very low: until the event is repeated", 0, kVeryLow, 60 * kSecond},
  };
  for (const Case& each : cases) {
    LowSpaceWatch watch;
    EXPECT_EQ(watch.look(volume(each.available, each.level), 0).pause_ns, each.pause_ns)
        << each.what;
  }
}

TEST(LowSpaceWatch, TheVolumeInGreatestNeedDecides) {
  LowSpaceWatch watch;
  auto samples = volume(500 * kGiB);
  samples.push_back(volume(740 * kMiB, SpaceLevel::kEnough, "/near")[0]);
  EXPECT_EQ(watch.look(samples, 0).pause_ns, 30 * kSecond);
}

TEST(LowSpaceWatch, AFastFillingMakesItLookSooner) {
  LowSpaceWatch watch;
  EXPECT_EQ(watch.look(volume(100 * kGiB + 500 * kMiB), 0).pause_ns, 12800 * kSecond);
  // 80 GiB in 800 s: 0.1 GiB/s; the 20 GiB left above the threshold last for 200 s.
  EXPECT_EQ(watch.look(volume(20 * kGiB + 500 * kMiB), 800 * kSecond).pause_ns, 200 * kSecond);
}

TEST(LowSpaceWatch, FarFromTheThresholdNoRateMakesItLookMoreOftenThanOnceAMinute) {
  LowSpaceWatch watch;
  (void)watch.look(volume(60 * kGiB), 0);
  EXPECT_EQ(watch.look(volume(2 * kGiB), 10 * kSecond).pause_ns, 60 * kSecond);
}

TEST(LowSpaceWatch, InodesAreUsedUpToo) {
  LowSpaceWatch watch;
  auto samples = volume(500 * kGiB);
  samples[0].space.inodes = 1'000'000;
  samples[0].space.available_inodes = 250'000;  // 200,000 above the threshold at 200 a second
  samples[0].thresholds = spaceThresholds(samples[0].space, {});
  EXPECT_EQ(watch.look(samples, 0).pause_ns, 1000 * kSecond);
  samples[0].space.available_inodes = 99'999;  // near
  EXPECT_LE(watch.look(samples, kSecond).pause_ns, 60 * kSecond);
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
  EXPECT_EQ(watch.look(volume(400 * kMiB, SpaceLevel::kLow), 0).flags, 0x4U);
  EXPECT_EQ(watch.look(volume(300 * kMiB, SpaceLevel::kLow), 10 * kSecond).flags, 0U);
  EXPECT_EQ(watch.look(volume(100 * kMiB, SpaceLevel::kVeryLow), 20 * kSecond).flags, 0x200U);
  EXPECT_EQ(watch.look(volume(300 * kMiB, SpaceLevel::kLow), 30 * kSecond).flags, 0U);
  EXPECT_EQ(watch.look(volume(100 * kMiB, SpaceLevel::kVeryLow), 40 * kSecond).flags, 0x200U);
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
