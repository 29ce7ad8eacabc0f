// What the record of recent answers believes, to the border.
#include "purgeable/recent_info.h"

#include <gtest/gtest.h>

#include <limits>

namespace spacekeep::test {
namespace {

constexpr std::int64_t kNow = 1'700'000'000'000'000'000;
constexpr std::int64_t kMicrosecond = 1'000;
constexpr std::int64_t kSecond = 1'000'000'000;
constexpr std::uint64_t kFree = 100'000'000;
constexpr std::uint64_t kThreshold = 5'242'880;

constexpr std::int32_t kInvalid = 2;
constexpr std::int32_t kChanged = 3;

SpacekeepRecentServiceInfo answerOf(Value amount, std::int64_t age_ns) {
  return {.amount = std::move(amount), .timestamp = Date{kNow - age_ns}};
}

/// A volume that was looked at `age_ns` ago, with `services`.
SpacekeepRecentVolumeInfo volumeOf(const std::string& path, std::int64_t age_ns,
                                   std::map<std::string, SpacekeepRecentServiceInfo> services) {
  return {.services = std::move(services),
          .freespace = kFree,
          .timestamp = Date{kNow - age_ns},
          .volumeName = path};
}

/// Judged by the limits that the daemon uses; `free_bytes` is what every volume has now.
std::int32_t judge(SpacekeepRecentInfo& record, std::uint64_t free_bytes = kFree) {
  return record.validate(
      120.0, kThreshold,
      {.now = Date{kNow}, .freespace = [free_bytes](const std::string&) { return free_bytes; }});
}

SpacekeepRecentInfo oneAnswer(std::int64_t age_ns) {
  return SpacekeepRecentInfo({{"/", volumeOf("/", age_ns, {{"cache", answerOf(5, age_ns)}})}});
}

bool isUsable(std::int32_t code) { return code != kInvalid && code != kChanged; }

TEST(RecentInfo, WhatIsFreshMayBeUsedAsItIs) {
  SpacekeepRecentInfo record = oneAnswer(0);
  const SpacekeepRecentInfo before = record;
  EXPECT_TRUE(isUsable(judge(record)));
  EXPECT_EQ(record, before);
}

TEST(RecentInfo, AnAgeOfExactlyTwoMinutesStays) {
  SpacekeepRecentInfo record = oneAnswer(120 * kSecond);
  const SpacekeepRecentInfo before = record;
  EXPECT_TRUE(isUsable(judge(record)));
  EXPECT_EQ(record, before);
}

TEST(RecentInfo, AnAgeOfAMicrosecondMoreGoes) {
  SpacekeepRecentInfo record = oneAnswer(120 * kSecond + kMicrosecond);
  EXPECT_EQ(judge(record), kInvalid);
  EXPECT_TRUE(record.volumes().empty());
}

TEST(RecentInfo, AVolumeOfTheFutureGoes) {
  SpacekeepRecentInfo record = oneAnswer(-kMicrosecond);
  EXPECT_EQ(judge(record), kInvalid);
  EXPECT_TRUE(record.volumes().empty());
}

TEST(RecentInfo, AnAnswerOfTheFutureGoesFromAVolumeThatStays) {
  SpacekeepRecentInfo record(
      {{"/", volumeOf("/", 0, {{"early", answerOf(1, -kMicrosecond)}, {"now", answerOf(2, 0)}})}});
  EXPECT_EQ(judge(record), kChanged);
  EXPECT_EQ(record, SpacekeepRecentInfo({{"/", volumeOf("/", 0, {{"now", answerOf(2, 0)}})}}));
}

TEST(RecentInfo, FreeSpaceThatMovedByTheThresholdStaysInBothDirections) {
  for (const std::uint64_t free_bytes : {kFree + kThreshold, kFree - kThreshold}) {
    SpacekeepRecentInfo record = oneAnswer(0);
    EXPECT_TRUE(isUsable(judge(record, free_bytes))) << free_bytes;
    EXPECT_EQ(record, oneAnswer(0));
  }
}

TEST(RecentInfo, FreeSpaceThatMovedByAByteMoreGoesInBothDirections) {
  for (const std::uint64_t free_bytes : {kFree + kThreshold + 1, kFree - kThreshold - 1}) {
    SpacekeepRecentInfo record = oneAnswer(0);
    EXPECT_EQ(judge(record, free_bytes), kInvalid) << free_bytes;
    EXPECT_TRUE(record.volumes().empty());
  }
}

TEST(RecentInfo, TheDifferenceOfFreeSpaceDoesNotWrapRound) {
  SpacekeepRecentInfo record = oneAnswer(0);
  EXPECT_EQ(judge(record, UINT64_MAX), kInvalid);
}

TEST(RecentInfo, AnOldAnswerGoesAndTheOthersOfItsVolumeStay) {
  SpacekeepRecentInfo record({{"/", volumeOf("/", 0,
                                             {{"old", answerOf(1, 121 * kSecond)},
                                              {"fresh", answerOf(2, 119 * kSecond)}})}});
  EXPECT_EQ(judge(record), kChanged);
  EXPECT_EQ(record, SpacekeepRecentInfo(
                        {{"/", volumeOf("/", 0, {{"fresh", answerOf(2, 119 * kSecond)}})}}));
}

TEST(RecentInfo, AnOldVolumeGoesWithAllItsAnswersAndTheOtherStays) {
  SpacekeepRecentInfo record(
      {{"/", volumeOf("/", 0, {{"cache", answerOf(1, 0)}})},
       {"/data", volumeOf("/data", 121 * kSecond, {{"cache", answerOf(2, 0)}})}});
  EXPECT_EQ(judge(record), kChanged);
  EXPECT_NE(record.volume("/"), nullptr);
  EXPECT_EQ(record.volume("/data"), nullptr);
}

TEST(RecentInfo, AVolumeWhoseLastAnswerWentGoesToo) {
  SpacekeepRecentInfo record(
      {{"/", volumeOf("/", 0, {{"cache", answerOf(1, 0)}})},
       {"/data", volumeOf("/data", 0, {{"cache", answerOf(2, 121 * kSecond)}})}});
  EXPECT_EQ(judge(record), kChanged);
  EXPECT_EQ(record.volumes().size(), 1U);
}

TEST(RecentInfo, ARecordOfNothingIsInvalid) {
  SpacekeepRecentInfo record;
  EXPECT_EQ(judge(record), kInvalid);
}

TEST(RecentInfo, EachVolumeIsComparedWithItsOwnFreeSpace) {
  SpacekeepRecentInfo record({{"/", volumeOf("/", 0, {{"cache", answerOf(1, 0)}})},
                              {"/data", volumeOf("/data", 0, {{"cache", answerOf(2, 0)}})}});
  const RecentInfoContext context{.now = Date{kNow}, .freespace = [](const std::string& path) {
                                    return path == "/data" ? kFree : std::uint64_t{0};
                                  }};
  EXPECT_EQ(record.validate(120.0, kThreshold, context), kChanged);
  EXPECT_EQ(record.volume("/"), nullptr);
  EXPECT_NE(record.volume("/data"), nullptr);
}

TEST(RecentInfo, TheFurthestDatesThatThereAreGo) {
  using Limits = std::numeric_limits<std::int64_t>;
  for (const std::int64_t far_ns : {Limits::min(), Limits::max()}) {
    SpacekeepRecentVolumeInfo volume = volumeOf("/", 0, {{"cache", answerOf(1, 0)}});
    volume.timestamp = Date{far_ns};
    SpacekeepRecentInfo record({{"/", volume}});
    EXPECT_EQ(judge(record), kInvalid) << far_ns;
    volume.timestamp = Date{kNow};
    volume.services.at("cache").timestamp = Date{far_ns};
    record.setVolumes({{"/", volume}});
    EXPECT_EQ(judge(record), kInvalid) << far_ns;
  }
}

TEST(RecentInfo, ASecondAnswerKeepsTheFirstAndRenewsFreeSpaceAndDate) {
  SpacekeepRecentInfo record;
  record.update("/", "one", answerOf(1, 10 * kSecond), 700);
  record.update("/", "two", answerOf(2, 0), 900);
  ASSERT_EQ(record.volumes().size(), 1U);
  const SpacekeepRecentVolumeInfo& volume = *record.volume("/");
  EXPECT_EQ(volume.freespace, 900U);
  EXPECT_EQ(volume.timestamp, Date{kNow});
  EXPECT_EQ(volume.volumeName, "/");
  EXPECT_EQ(volume.services.at("one"), answerOf(1, 10 * kSecond));
  EXPECT_EQ(volume.services.at("two"), answerOf(2, 0));
}

// Validation remembers between which dates all answers are, and must not go by that for too long.
TEST(RecentInfo, AnOldAnswerGoesThoughYoungerOnesWereValidatedSince) {
  SpacekeepRecentInfo record;
  record.update("/", "young", answerOf(1, 0), kFree);
  EXPECT_TRUE(isUsable(judge(record)));
  record.update("/", "old", answerOf(2, 121 * kSecond), kFree);
  record.update("/", "younger", answerOf(3, 0), kFree);
  EXPECT_EQ(judge(record), kChanged);
  EXPECT_FALSE(record.volume("/")->services.contains("old"));
  EXPECT_EQ(record.volume("/")->services.size(), 2U);
  EXPECT_TRUE(isUsable(judge(record)));
}

TEST(RecentInfo, AnAnswerOfTheFutureGoesThoughOlderOnesWereValidatedSince) {
  SpacekeepRecentInfo record = oneAnswer(60 * kSecond);
  EXPECT_TRUE(isUsable(judge(record)));
  record.update("/", "ahead", answerOf(2, -kSecond), kFree);
  record.update("/", "now", answerOf(3, 0), kFree);
  EXPECT_EQ(judge(record), kChanged);
  EXPECT_FALSE(record.volume("/")->services.contains("ahead"));
}

TEST(RecentInfo, TheAmountsFollowEveryChange) {
  SpacekeepRecentInfo record = oneAnswer(120 * kSecond);
  EXPECT_EQ(record.amounts("/data"), nullptr);
  const auto first = record.amounts("/");
  EXPECT_EQ(*first, (Dictionary{{"cache", 5}}));
  EXPECT_EQ(record.amounts("/"), first) << "made again without a change";
  record.update("/", "other", answerOf(7, 0), kFree);
  EXPECT_EQ(*record.amounts("/"), (Dictionary{{"cache", 5}, {"other", 7}}));
  EXPECT_EQ(*first, (Dictionary{{"cache", 5}})) << "what was handed out does not change";
  EXPECT_EQ(record.validate(119.0, kThreshold,
                            {.now = Date{kNow}, .freespace = [](const auto&) { return kFree; }}),
            kChanged);
  EXPECT_EQ(*record.amounts("/"), (Dictionary{{"other", 7}}));
  record.setVolumes({});
  EXPECT_EQ(record.amounts("/"), nullptr);
}

TEST(RecentInfo, AnAnswerForANewVolumeAddsAnEntryBesideTheOthers) {
  SpacekeepRecentInfo record = oneAnswer(0);
  const SpacekeepRecentVolumeInfo before = *record.volume("/");
  record.update("/data", "cache", answerOf(9, 0), 42);
  EXPECT_EQ(*record.volume("/"), before);
  EXPECT_EQ(*record.volume("/data"),
            (SpacekeepRecentVolumeInfo{.services = {{"cache", answerOf(9, 0)}},
                                       .freespace = 42,
                                       .timestamp = Date{kNow},
                                       .volumeName = "/data"}));
}

TEST(RecentInfo, DatesKeepWholeMicroseconds) {
  EXPECT_EQ(recentDate(1'999), Date{1'000});
  EXPECT_EQ(recentDate(kNow), Date{kNow});
}

}  // namespace
}  // namespace spacekeep::test
