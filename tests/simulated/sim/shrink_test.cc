// A failing plan is made as small as it gets, in a bounded number of runs.
#include <gtest/gtest.h>

#include <algorithm>

#include "sim/program/shrink.h"

namespace spacekeep::sim {
namespace {

bool holds(const Kept& kept, std::size_t element) {
  return std::find(kept.begin(), kept.end(), element) != kept.end();
}

TEST(Shrink, OneGuiltyElementOfManyIsAllThatStays) {
  for (std::size_t guilty = 0; guilty < 33; ++guilty) {
    const Shrunk shrunk = shrink(
        33, [guilty](const Kept& kept) { return holds(kept, guilty); }, 1000);
    EXPECT_EQ(shrunk.kept, Kept{guilty});
    EXPECT_TRUE(shrunk.is_minimal);
  }
}

TEST(Shrink, ElementsThatOnlyFailTogetherStayTogether) {
  const Shrunk shrunk = shrink(
      20, [](const Kept& kept) { return holds(kept, 2) && holds(kept, 9) && holds(kept, 17); },
      1000);
  EXPECT_EQ(shrunk.kept, (Kept{2, 9, 17}));
}

TEST(Shrink, WhatFailsWithoutAnyElementLosesAll) {
  const Shrunk shrunk = shrink(
      12, [](const Kept&) { return true; }, 1000);
  EXPECT_TRUE(shrunk.kept.empty());
}

TEST(Shrink, WhatOnlyFailsAsAWholeStaysWhole) {
  const Shrunk shrunk = shrink(
      7, [](const Kept& kept) { return kept.size() == 7; }, 1000);
  EXPECT_EQ(shrunk.kept.size(), 7U);
}

// An element may only be needed while another one is there.
TEST(Shrink, ElementsThatCoverForEachOtherGoInALaterRound) {
  const auto fails = [](const Kept& kept) {
    if (!holds(kept, 0)) return false;
    return holds(kept, 5) ? holds(kept, 1) : true;
  };
  EXPECT_EQ(shrink(6, fails, 1000).kept, Kept{0});
}

TEST(Shrink, RunsAreBounded) {
  unsigned runs = 0;
  const Shrunk shrunk = shrink(
      50,
      [&runs](const Kept& kept) {
        ++runs;
        return holds(kept, 7) && holds(kept, 31);
      },
      10);
  EXPECT_EQ(runs, 10U);
  EXPECT_EQ(shrunk.runs, 10U);
  EXPECT_FALSE(shrunk.is_minimal);
  EXPECT_TRUE(holds(shrunk.kept, 7));
  EXPECT_TRUE(holds(shrunk.kept, 31));
}

TEST(Shrink, NoElementsNeedNoRuns) {
  EXPECT_EQ(shrink(
                0, [](const Kept&) { return true; }, 10)
                .runs,
            0U);
}

TEST(ShrinkOverSchedules, APlanThatFailsByAnotherScheduleIsSmaller) {
  // Only the whole plan fails by the seed's own schedule, the fewer elements the later the one that
  // shows it.
  const auto fails = [](const Kept& kept, std::uint64_t schedule) {
    return holds(kept, 4) && schedule == 9 - kept.size();
  };
  const SmallerPlan smaller = shrinkOverSchedules(9, fails, 1000, 10);
  EXPECT_EQ(smaller.shrunk.kept, Kept{4});
  EXPECT_EQ(smaller.schedule, 8U);
}

TEST(ShrinkOverSchedules, TheSeedsOwnScheduleComesFirst) {
  const SmallerPlan smaller = shrinkOverSchedules(
      6, [](const Kept& kept, std::uint64_t) { return holds(kept, 2); }, 1000, 10);
  EXPECT_EQ(smaller.shrunk.kept, Kept{2});
  EXPECT_EQ(smaller.schedule, 0U);
}

TEST(ShrinkOverSchedules, SchedulesAreBounded) {
  std::uint64_t most = 0;
  const auto never = [&most](const Kept&, std::uint64_t schedule) {
    most = std::max(most, schedule);
    return false;
  };
  EXPECT_EQ(shrinkOverSchedules(5, never, 1000, 7).shrunk.kept.size(), 5U);
  EXPECT_EQ(most, 6U);
}

TEST(Shrink, WhatCouldNotBeMadeSmallerIsToldWithWhatWasTried) {
  EXPECT_EQ(limitsText({.kept = {0, 1, 2}, .runs = 12, .is_minimal = true}, 3, 30),
            "could not be made smaller: it failed in none of 12 smaller plans, by 30 schedules "
            "each");
  EXPECT_EQ(limitsText({.kept = {1}, .runs = 300, .is_minimal = false}, 3, 30),
            "may not be the smallest: no more than 300 smaller plans, by 30 schedules each, were "
            "tried");
  EXPECT_EQ(limitsText({.kept = {1}, .runs = 40, .is_minimal = true}, 3, 30), "");
}

}  // namespace
}  // namespace spacekeep::sim
