// Elapsed time, from two readings of the tick counter.
#include "support/timebase.h"

#include <gtest/gtest.h>

#include <cstdint>

namespace spacekeep::test {
namespace {

class ElapsedTime : public testing::Test {
 protected:
  ~ElapsedTime() override { gTimebaseConversion = before_; }

  const double before_ = gTimebaseConversion;
};

TEST_F(ElapsedTime, IsTheTicksBetweenTimesTheConversion) {
  gTimebaseConversion = 125.0 / 3.0;
  EXPECT_DOUBLE_EQ(elapsedNs(1000, 1024), 1000.0);
  EXPECT_EQ(elapsedNs(1000, 1000), 0.0);
}

TEST_F(ElapsedTime, IsTakenOfTheTicksAsDoublesWhichLeavesOutTheLastOnesOfLargeCounts) {
  gTimebaseConversion = 1.0;
  constexpr std::uint64_t kMoreThanADoubleTellsApart = 9'007'199'254'740'992;
  EXPECT_EQ(elapsedNs(kMoreThanADoubleTellsApart, kMoreThanADoubleTellsApart + 1), 0.0);
  EXPECT_EQ(elapsedNs(kMoreThanADoubleTellsApart, kMoreThanADoubleTellsApart + 2), 2.0);
}

TEST_F(ElapsedTime, OfAStartAheadOfNowIsNegative) {
  gTimebaseConversion = 2.0;
  EXPECT_EQ(elapsedNs(10, 3), -14.0);
}

TEST_F(ElapsedTime, IsNothingWithoutATimebase) {
  gTimebaseConversion = 0.0;
  EXPECT_EQ(elapsedNs(0, 1'000'000'000), 0.0);
}

}  // namespace
}  // namespace spacekeep::test
