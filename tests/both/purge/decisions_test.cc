#include "purge/decisions.h"

#include <gtest/gtest.h>

namespace spacekeep::purge {
namespace {

TEST(PurgeShares, TenMissingBytesAmongThreeServicesAskForThreeEach) {
  EXPECT_EQ(donation(10, 0, 3), 3U);
}

TEST(PurgeShares, FewerMissingBytesThanServicesAskForNothing) { EXPECT_EQ(donation(2, 0, 5), 0U); }

TEST(PurgeShares, OnlyWhatIsStillMissingIsShared) { EXPECT_EQ(donation(300, 150, 2), 75U); }

TEST(PurgeShares, ADivisorOfZeroCountsAsOne) { EXPECT_EQ(donation(10, 4, 0), 6U); }

TEST(PurgeShares, ADivisorThatPassedZeroAsksForNothing) {
  EXPECT_EQ(donation(10, 0, UINT64_MAX), 0U);
}

TEST(PurgeShares, TheLargestAmountGoesToOneServiceWhole) {
  EXPECT_EQ(donation(UINT64_MAX, 0, 1), UINT64_MAX);
}

TEST(PurgeWait, IsTwoSecondsPerUrgencyWithoutAUserTimeout) {
  EXPECT_EQ(waitSeconds(0, 1), 2U);
  EXPECT_EQ(waitSeconds(0, 2), 4U);
  EXPECT_EQ(waitSeconds(0, 3), 6U);
  EXPECT_EQ(waitSeconds(0, 4), 8U);
}

TEST(PurgeWait, IsTheUserTimeoutAtEveryUrgency) {
  EXPECT_EQ(waitSeconds(300, 1), 300U);
  EXPECT_EQ(waitSeconds(1, 4), 1U);
}

struct BucketCase {
  std::uint64_t requested;
  std::uint64_t purged;
  std::int32_t bucket;
};

TEST(PurgeBucket, IsTheTenthOfTheRequestThatWasReached) {
  const BucketCase cases[] = {
      {1000, 0, 0},      {1000, 99, 0},     {1000, 100, 10}, {1000, 199, 10},      {1000, 999, 90},
      {1000, 1000, 100}, {1000, 1500, 150}, {1, 10, 1000},   {1000, 10'000, 1000},
  };
  for (const BucketCase& c : cases) {
    EXPECT_EQ(percentBucket(c.requested, c.purged), c.bucket) << c.purged << " of " << c.requested;
  }
}

TEST(PurgeBucket, AlmostEverythingIsCutOffNotCarriedUp) { EXPECT_EQ(percentBucket(1000, 999), 90); }

TEST(PurgeBucket, MoreThanWasAskedForIsABucketAboveAHundred) {
  EXPECT_EQ(percentBucket(1000, 1500), 150);
}

TEST(PurgeBucket, InSinglePrecisionTheLastOfAHundredMillionBytesIsNotSeen) {
  EXPECT_EQ(percentBucket(100'000'000, 99'999'999), 100);
}

// In double precision, or multiplied in single precision, they would be 70 and 90.
TEST(PurgeBucket, InSinglePrecisionSevenAndNineTenthsAreNotQuiteReached) {
  EXPECT_EQ(percentBucket(1000, 700), 60);
  EXPECT_EQ(percentBucket(1000, 900), 80);
}

TEST(PurgeBucket, HasNoUpperLimitButThatOfItsType) {
  EXPECT_EQ(percentBucket(1, INT64_MAX), 2'147'483'640);
}

TEST(PurgeBucket, AmountsAreTakenAsSigned) {
  // 2^63 turns into the most negative number.
  EXPECT_EQ(percentBucket(std::uint64_t{1} << 63, 0), 0);
  EXPECT_EQ(percentBucket(1, std::uint64_t{1} << 63), -2'147'483'640);
}

TEST(PurgeTexts, CarryTheirUrgency) {
  EXPECT_EQ(urgencyInfoKey(1), "SPACEKEEP_URGENCY_1_OPERATION_INFO");
  EXPECT_EQ(urgencyTimeoutKey(2), "SPACEKEEP_URGENCY_2_TIMEOUT_SECONDS");
  EXPECT_EQ(urgencyStatsKey(4), "SPACEKEEP_OPERATION_STATS_URGENCY_4");
}

TEST(PurgeTexts, TheStatisticsLineHasItsExactForm) {
  EXPECT_EQ(urgencyStatsText(1, 2, 3, true),
            "amount reported: 1, amountPurged: 2, purge_amount_needed: 3, cancel: TRUE");
  EXPECT_EQ(urgencyStatsText(UINT64_MAX, 0, 3, false),
            "amount reported: 18446744073709551615, amountPurged: 0, purge_amount_needed: 3, "
            "cancel: FALSE");
}

}  // namespace
}  // namespace spacekeep::purge
