// What a long run says of itself, and how often.
#include "sim/program/progress.h"

#include <gtest/gtest.h>

#include "sim/program/play.h"

namespace spacekeep::sim {
namespace {

TEST(Progress, TellsWhatIsDoneHowFastAndWhatIsLeft) {
  EXPECT_EQ(progressText({.done = 12'300, .total = 100'000, .failed = 2, .elapsed_seconds = 10}),
            "12300 of 100000 schedules, 2 failed, 1230/s, 1 min 12 s left");
}

TEST(Progress, TimeLeftIsToldInSecondsMinutesOrHours) {
  const auto left = [](std::uint64_t total) {
    const std::string text = progressText({.done = 10, .total = total, .elapsed_seconds = 10});
    return text.substr(text.find("/s, ") + 4);
  };
  EXPECT_EQ(left(10), "0 s left");
  EXPECT_EQ(left(69), "59 s left");
  EXPECT_EQ(left(70), "1 min 00 s left");
  EXPECT_EQ(left(10 + 3599), "59 min 59 s left");
  EXPECT_EQ(left(10 + 3600), "1 h 00 min left");
  EXPECT_EQ(left(10 + 7500), "2 h 05 min left");
}

TEST(Progress, ARateThatIsNotKnownYetIsLeftOut) {
  EXPECT_EQ(progressText({.done = 0, .total = 50, .elapsed_seconds = 3}),
            "0 of 50 schedules, 0 failed");
  EXPECT_EQ(progressText({.done = 7, .total = 50, .elapsed_seconds = 0}),
            "7 of 50 schedules, 0 failed");
}

TEST(Progress, MoreThanWasAskedForLeavesNothing) {
  EXPECT_EQ(progressText({.done = 60, .total = 50, .elapsed_seconds = 1}),
            "60 of 50 schedules, 0 failed, 60/s, 0 s left");
}

TEST(ProgressPace, ATerminalHearsOfItOnceASecond) {
  ProgressPace pace(true, 100);
  EXPECT_FALSE(pace.isDue(100.9));
  EXPECT_TRUE(pace.isDue(101));
  EXPECT_FALSE(pace.isDue(101.9));
  EXPECT_TRUE(pace.isDue(102.1));
}

TEST(ProgressPace, AnythingElseHearsOfItOnceAMinute) {
  ProgressPace pace(false, 100);
  EXPECT_FALSE(pace.isDue(159));
  EXPECT_TRUE(pace.isDue(160));
  EXPECT_FALSE(pace.isDue(219));
  EXPECT_TRUE(pace.isDue(220));
}

TEST(PlaySeeds, TellsAfterEachSeedHowFarItIs) {
  Options options;
  options.seeds = 7;
  options.jobs = 2;
  std::vector<std::uint64_t> runs;
  const auto story = [](const std::string&) {};
  playSeeds(options, 1, story, [&](const Played& played) { runs.push_back(played.runs); });
  EXPECT_EQ(runs, (std::vector<std::uint64_t>{1, 2, 3}));
}

}  // namespace
}  // namespace spacekeep::sim
