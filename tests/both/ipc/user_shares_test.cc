// Shares of users: what was saved may be used at once, then only what comes back, and nobody pays
// for anybody else.
#include "support/ipc/user_shares.h"

#include <gtest/gtest.h>

namespace spacekeep::ipc {
namespace {

constexpr UserShares::Uid kOne = 1001;
constexpr UserShares::Uid kOther = 1002;
constexpr std::uint64_t kStartNs = 5'000'000'000;
constexpr std::uint64_t kMs = 1'000'000;

UserShareLimits limits() {
  UserShareLimits some;
  some.percent = 25;
  some.saved_ns = 100 * kMs;
  return some;
}

TEST(UserShares, AUserWhoNeverSpentAnythingMayGoOn) {
  const UserShares shares(limits());
  EXPECT_TRUE(shares.mayGoOn(kOne, 0));
  EXPECT_EQ(shares.known(), 0U);
}

TEST(UserShares, WhatWasSavedMayBeSpentAtOnceAndNotANanosecondMore) {
  UserShares shares(limits());
  shares.spend(kOne, 100 * kMs, kStartNs);
  EXPECT_TRUE(shares.mayGoOn(kOne, kStartNs));
  shares.spend(kOne, 1, kStartNs);
  EXPECT_FALSE(shares.mayGoOn(kOne, kStartNs));
}

TEST(UserShares, AQuarterOfTheTimeComesBack) {
  UserShares shares(limits());
  shares.spend(kOne, 110 * kMs, kStartNs);
  EXPECT_FALSE(shares.mayGoOn(kOne, kStartNs + 40 * kMs - 100));
  EXPECT_TRUE(shares.mayGoOn(kOne, kStartNs + 40 * kMs));
}

TEST(UserShares, WhatComesBackIsNotForgottenWhenMoreIsSpent) {
  UserShares shares(limits());
  shares.spend(kOne, 100 * kMs, kStartNs);
  shares.spend(kOne, 25 * kMs, kStartNs + 100 * kMs);
  EXPECT_TRUE(shares.mayGoOn(kOne, kStartNs + 100 * kMs));
  shares.spend(kOne, 1, kStartNs + 100 * kMs);
  EXPECT_FALSE(shares.mayGoOn(kOne, kStartNs + 100 * kMs));
}

TEST(UserShares, NoMoreIsSavedThanTheLimitHoweverLongAUserWasQuiet) {
  UserShares shares(limits());
  shares.spend(kOne, 1, kStartNs);
  shares.spend(kOne, 100 * kMs + 1, 1000 * kStartNs);
  EXPECT_FALSE(shares.mayGoOn(kOne, 1000 * kStartNs));
}

TEST(UserShares, OneUserWhoSpendsDoesNotHoldUpAnother) {
  UserShares shares(limits());
  shares.spend(kOne, 1'000'000 * kMs, kStartNs);
  EXPECT_FALSE(shares.mayGoOn(kOne, kStartNs));
  EXPECT_TRUE(shares.mayGoOn(kOther, kStartNs));
  shares.spend(kOther, 100 * kMs, kStartNs);
  EXPECT_TRUE(shares.mayGoOn(kOther, kStartNs));
}

TEST(UserShares, AClockThatGoesBackGivesNothingAndTakesNothing) {
  UserShares shares(limits());
  shares.spend(kOne, 101 * kMs, kStartNs);
  EXPECT_FALSE(shares.mayGoOn(kOne, kStartNs - 1000 * kMs));
  shares.spend(kOne, 1, kStartNs - 1000 * kMs);
  EXPECT_TRUE(shares.mayGoOn(kOne, kStartNs + 5 * kMs));
}

TEST(UserShares, TheLargestClockReadingDoesNotOverflow) {
  UserShares shares(limits());
  shares.spend(kOne, 200 * kMs, 0);
  EXPECT_TRUE(shares.mayGoOn(kOne, UINT64_MAX));
}

TEST(UserShares, UsersWhoAreQuietAgainNeedNoRecord) {
  UserShares shares(limits());
  constexpr std::uint64_t kSecondNs = 1'000'000'000;
  for (UserShares::Uid uid = 0; uid < 10'000; ++uid) {
    shares.spend(uid, kMs, kStartNs + uid * kSecondNs);
    ASSERT_LE(shares.known(), 65U);
  }
}

}  // namespace
}  // namespace spacekeep::ipc
