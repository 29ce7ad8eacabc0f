#include "support/events/low_space_pace.h"

#include <gtest/gtest.h>

namespace spacekeep {
namespace {

constexpr std::uint64_t kMiB = 1024 * 1024;
constexpr std::uint64_t kGiB = 1024 * kMiB;
constexpr std::uint64_t kMs = 1'000'000;
constexpr std::uint64_t kSecond = 1000 * kMs;
constexpr std::uint64_t kHour = 3600 * kSecond;

SpaceMeasure bytes(std::uint64_t size, std::uint64_t available) {
  const VolumeSpace space{.size_bytes = size, .available_bytes = available};
  return measuresOf({.space = space, .thresholds = spaceThresholds(space, {})}, {})[0];
}

std::uint64_t pauseOf(const SpaceMeasure& measure, VolumeCare care = {}, double rate = 0,
                      std::uint64_t quiet_ns = 0) {
  MeasureHistory history = historyFrom(measure, 0);
  history.rate = rate;
  return pauseForMeasure(measure, history, care, quiet_ns, {});
}

TEST(FastestRate, TheFastestFillingCounts) {
  EXPECT_DOUBLE_EQ(fastestRate(10, 500, 10 * kSecond, kHour), 50);
  EXPECT_NEAR(fastestRate(1000, 500, 10 * kSecond, kHour), 1000, 3);
}

TEST(FastestRate, ItFadesByHalf) {
  EXPECT_DOUBLE_EQ(fastestRate(1000, 0, kHour, kHour), 500);
  EXPECT_DOUBLE_EQ(fastestRate(1000, 0, 2 * kHour, kHour), 250);
}

TEST(FastestRate, TwoLooksAtOneMomentSayNothing) {
  EXPECT_DOUBLE_EQ(fastestRate(10, 500, 0, kHour), 10);
}

TEST(TimeToUseUp, IsTheQuotientAndNeverOverflows) {
  EXPECT_EQ(timeToUseUpNs(0, 5.0), 0U);
  EXPECT_EQ(timeToUseUpNs(10, 5.0), 2 * kSecond);
  EXPECT_EQ(timeToUseUpNs(UINT64_MAX, 1.0), UINT64_MAX);
  EXPECT_EQ(timeToUseUpNs(10, 0.0), UINT64_MAX);
}

TEST(LowSpacePace, ABurstIsWhatADeviceCanDoAndLessOnASmallVolume) {
  EXPECT_DOUBLE_EQ(bytes(64 * kGiB, 0).burst_per_second, 160.0 * kMiB);
  EXPECT_DOUBLE_EQ(bytes(2 * kGiB, 0).burst_per_second, 160.0 * kMiB);
  EXPECT_DOUBLE_EQ(bytes(200 * kMiB, 0).burst_per_second, 16.0 * kMiB);
}

struct PauseCase {
  const char* what;
  std::uint64_t size;
  std::uint64_t available;
  std::uint64_t pause_ns;
};

TEST(LowSpacePace, HowLongAQuietVolumeIsLeftAlone) {
  const PauseCase cases[] = {
      {"very far: hours", 4096 * kGiB, 3000 * kGiB, 4 * kHour},
      {"far: the burst down to half of the threshold", 64 * kGiB, 20 * kGiB + 250 * kMiB,
       128 * kSecond},
      {"just far", 64 * kGiB, 9600 * kMiB + 250 * kMiB, 60 * kSecond},
      {"no more far", 64 * kGiB, 2250 * kMiB, 12'500 * kMs},
      {"at the threshold", 64 * kGiB, 500 * kMiB, 1'562'500'000},
      {"a small volume that is half empty is far", 2 * kGiB, kGiB, 60 * kSecond},
      {"a smaller one too", 64 * kMiB, 32 * kMiB, 60 * kSecond},
      {"below its threshold, though it was not reported yet", 2000 * kMiB, 40 * kMiB, 250 * kMs},
      {"full", 2000 * kMiB, 0, 250 * kMs},
  };
  for (const PauseCase& each : cases) {
    EXPECT_EQ(pauseOf(bytes(each.size, each.available)), each.pause_ns) << each.what;
  }
}

// 2 GiB, low below 102.4 MiB, which 160 MiB/s use up in 0.64 s.
TEST(LowSpacePace, ABurstOutOfTheBlueIsSeenWithHalfOfTheThresholdLeft) {
  constexpr std::uint64_t kLow = 2 * kGiB / 20;
  for (std::uint64_t available = kLow; available < kGiB; available += kMiB) {
    const double pause_seconds = static_cast<double>(pauseOf(bytes(2 * kGiB, available))) / 1e9;
    const double left = static_cast<double>(available) - pause_seconds * 160.0 * kMiB;
    EXPECT_GE(left, kLow / 2 - 1.0) << available;
  }
}

TEST(LowSpacePace, AFasterFillingThatWasSeenIsReckonedWith) {
  EXPECT_EQ(pauseOf(bytes(64 * kGiB, 500 * kMiB), {}, 250.0 * kMiB), kSecond);
  // Far by what is left, but not by how long it lasts.
  EXPECT_EQ(pauseOf(bytes(64 * kGiB, 40 * kGiB + 250 * kMiB), {}, 1.0 * kGiB), 40 * kSecond);
}

TEST(LowSpacePace, AReportedVolumeThatIsQuietIsLeftAloneForLonger) {
  const SpaceMeasure low = bytes(2 * kGiB, 60 * kMiB);
  const VolumeCare reported{.is_reported = true};
  EXPECT_EQ(pauseOf(low, reported, 0, 0), 250 * kMs);
  EXPECT_EQ(pauseOf(low, reported, 0, 40 * kSecond), 10 * kSecond);
  EXPECT_EQ(pauseOf(low, reported, 0, kHour), 60 * kSecond);
  EXPECT_EQ(pauseOf(low, {}, 0, kHour), 250 * kMs) << "nobody has been told yet";
  // Short only by the hysteresis: a purge has helped, so the next one may too.
  EXPECT_LT(pauseOf(bytes(2 * kGiB, 110 * kMiB), reported, 0, kHour), kSecond);
}

TEST(LowSpacePace, WhileAnEventIsHandledOneLookASecondWillDo) {
  const VolumeCare handled{.is_reported = true, .is_handled = true};
  EXPECT_EQ(pauseOf(bytes(2 * kGiB, 60 * kMiB), handled), kSecond);
}

TEST(LowSpacePace, WhatCannotRunShortIsLookedAtRarely) {
  SpaceMeasure never = bytes(2 * kGiB, 0);
  never.low = 0;
  EXPECT_EQ(pauseOf(never), 4 * kHour);
}

TEST(LowSpacePace, InodesAreAMeasureOfTheirOwn) {
  const VolumeSpace space{.size_bytes = kGiB, .inodes = 1'000'000, .available_inodes = 425'000};
  const auto measures = measuresOf({.space = space, .thresholds = spaceThresholds(space, {})}, {});
  ASSERT_EQ(measures.size(), 2U);
  EXPECT_EQ(pauseOf(measures[1]), 20 * kSecond);  // 400,000 to spare at 20,000 a second
}

TEST(LowSpacePace, QuietEndsWithAChangeOfOneSixtyFourthOfTheThreshold) {
  const auto measure = [](std::uint64_t available) {
    return SpaceMeasure{.available = available, .total = 1'000'000, .low = 64'000};
  };
  MeasureHistory history = historyFrom(measure(500'000), 0);
  recordLook(history, measure(500'999), kSecond, kSecond, {});
  EXPECT_EQ(history.quiet_since_ns, 0U);
  recordLook(history, measure(501'000), kSecond, 2 * kSecond, {});
  EXPECT_EQ(history.quiet_since_ns, 2 * kSecond);
}

TEST(LowSpacePace, WhatWasUsedAndGainedAddsUp) {
  const SpaceMeasure before = bytes(2 * kGiB, 100 * kMiB);
  MeasureHistory history = historyFrom(before, 0);
  recordLook(history, bytes(2 * kGiB, 97 * kMiB), kSecond, kSecond, {});
  EXPECT_EQ(history.quiet_since_ns, kSecond);
  recordLook(history, bytes(2 * kGiB, 98 * kMiB), kSecond, 2 * kSecond, {});
  EXPECT_EQ(history.quiet_since_ns, kSecond) << "a mebibyte is no change";
  recordLook(history, bytes(2 * kGiB, 94 * kMiB), kSecond, 3 * kSecond, {});
  EXPECT_EQ(history.used, 7 * kMiB);
  EXPECT_EQ(history.gained, kMiB);
  EXPECT_TRUE(hasBeenUsed(history, before));
  EXPECT_FALSE(hasGained(history, before));
}

}  // namespace
}  // namespace spacekeep
