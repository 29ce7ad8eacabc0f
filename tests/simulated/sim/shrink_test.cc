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

}  // namespace
}  // namespace spacekeep::sim
