// How long the daily pass over one volume takes and what it reports, on virtual time.
#include <gtest/gtest.h>

#include <algorithm>

#include "tests/both/operations/periodic_world.h"
#include "tests/helpers/schedules.h"

namespace spacekeep::test {
namespace {

constexpr const char* kTimedOut = "%s timed out waiting for: %@";

/// Runs a pass and answers how much virtual time it took.
std::uint64_t durationOf(PeriodicWorld& world, const Dictionary& expected) {
  const auto operation = world.make();
  const std::uint64_t start_ns = world.world.nowNs();
  EXPECT_EQ(world.run(*operation), expected);
  return world.world.nowNs() - start_ns;
}

TEST(PeriodicWaits, OfTwoAnswersTheLastOneIsTheOutcome) {
  inEverySchedule(kSchedules, [] {
    PeriodicWorld world;
    world.add("a", 100, kSecond);
    world.add("b", 200, 2 * kSecond);
    world.start();
    EXPECT_EQ(durationOf(world, amountOf(200)), 2 * kSecond);
    EXPECT_EQ(world.lines(kTimedOut), 0U);
  });
}

TEST(PeriodicWaits, AlsoWhenTheLastOneIsTheFirstToHaveBeenAsked) {
  inEverySchedule(kSchedules, [] {
    PeriodicWorld world;
    world.add("a", 100, 2 * kSecond);
    world.add("b", 200, kSecond);
    world.start();
    EXPECT_EQ(durationOf(world, amountOf(100)), 2 * kSecond);
  });
}

TEST(PeriodicWaits, AServiceThatNeverAnswersMakesItLastFifteenSecondsAndIsNamed) {
  inEverySchedule(kSchedules, [] {
    PeriodicWorld world;
    world.add("cache", 100, kSecond);
    world.add("silent", 200, sim::CallBehaviour{.answer = sim::Answer::kNever});
    world.start();
    EXPECT_EQ(durationOf(world, amountOf(100)), 15 * kSecond);
    EXPECT_EQ(world.world.trace().linesWithFormat(kTimedOut),
              std::vector<std::string>{"startOperation timed out waiting for: [\"silent\"]"});
    const auto traces = world.world.trace().linesOfLevel(kLogTrace);
    EXPECT_EQ(std::ranges::count(traces, "startOperation timed out waiting for: [\"silent\"]"), 1);
  });
}

TEST(PeriodicWaits, WithoutAnySelectedServiceItLastsFifteenSecondsAndReportsZero) {
  inEverySchedule(kSchedules, [] {
    PeriodicWorld world;
    world.add("periodic", 100, 0, Array{"PERIODIC"});
    world.start();
    EXPECT_EQ(durationOf(world, amountOf(0)), 15 * kSecond);
    EXPECT_EQ(world.world.trace().linesWithFormat(kTimedOut),
              std::vector<std::string>{"startOperation timed out waiting for: []"});
  });
}

TEST(PeriodicWaits, AFailedConnectionStaysInFlightUntilTheLimit) {
  for (const auto answer : {sim::Answer::kFailsBeforeCall, sim::Answer::kFailsDuringCall}) {
    inEverySchedule(kSchedules, [&] {
      PeriodicWorld world;
      world.add("broken", 100, sim::CallBehaviour{.answer = answer});
      world.start();
      EXPECT_EQ(durationOf(world, amountOf(0)), 15 * kSecond);
      EXPECT_EQ(world.world.trace().linesWithFormat("%s connection invalidated"),
                std::vector<std::string>{"startOperation connection invalidated"});
      const auto traces = world.world.trace().linesOfLevel(kLogTrace);
      EXPECT_EQ(std::ranges::count(traces, "startOperation connection invalidated"), 1);
      EXPECT_TRUE(
          world.world.trace().hasLine("startOperation timed out waiting for: [\"broken\"]"));
    });
  }
}

TEST(PeriodicWaits, AServiceThatCannotBeReachedStaysInFlightToo) {
  inEverySchedule(kSchedules, [] {
    PeriodicWorld world;
    world.add("gone", 100, 0);
    world.start();
    world.world.connector().undeclare("gone");
    EXPECT_EQ(durationOf(world, amountOf(0)), 15 * kSecond);
    EXPECT_EQ(world.lines("%s connection invalidated"), 1U);
    EXPECT_EQ(world.lines("%s calling proxy for %@"), 0U);
  });
}

TEST(PeriodicWaits, AnAnswerWithoutANumberLeavesTheAmountAsItWas) {
  for (const auto answer : {sim::Answer::kRepliesWithoutAmount, sim::Answer::kRepliesWithText,
                            sim::Answer::kRepliesNothing}) {
    inEverySchedule(10, [&] {
      PeriodicWorld world;
      world.add("cache", 100, kSecond);
      world.add("vague", 200, sim::CallBehaviour{.answer = answer, .delay_ns = 2 * kSecond});
      world.start();
      EXPECT_EQ(durationOf(world, amountOf(100)), 2 * kSecond);
    });
  }
}

TEST(PeriodicWaits, AnAnswerAfterTheLimitChangesNothingVisible) {
  inEverySchedule(kSchedules, [] {
    PeriodicWorld world;
    world.add("cache", 100, kSecond);
    world.add("late", 200, 20 * kSecond);
    world.start();
    EXPECT_EQ(durationOf(world, amountOf(100)), 15 * kSecond);
    rt::sleepNs(10 * kSecond);
    EXPECT_EQ(world.lines("%s proxy %@ replied, purged: %@"), 2U);
    EXPECT_TRUE(world.world.trace().hasLine("updateInFlight removing late"));
    EXPECT_TRUE(world.world.trace().linesOfLevel(kLogProblem).empty());
  });
}

TEST(PeriodicWaits, AnAnswerJustBeforeTheLimitCounts) {
  inEverySchedule(kSchedules, [] {
    PeriodicWorld world;
    world.add("cache", 100, 15 * kSecond - 1);
    world.start();
    EXPECT_EQ(durationOf(world, amountOf(100)), 15 * kSecond - 1);
  });
}

TEST(PeriodicWaits, TracesItsCourseInTheExactFormats) {
  inEverySchedule(kSchedules, [] {
    PeriodicWorld world;
    world.add("cache", 100, kSecond);
    world.start();
    const auto before =
        static_cast<std::ptrdiff_t>(world.world.trace().linesOfLevel(kLogTrace).size());
    world.daemon->performPeriodicsWithInfo(Dictionary{{keys::kVolume, "/"}});
    const auto lines = world.world.trace().linesOfLevel(kLogTrace);
    EXPECT_EQ(std::vector<std::string>(lines.begin() + before, lines.end()),
              (std::vector<std::string>{
                  "updateInFlight adding cache", "startOperation CallService with serviceID: cache",
                  "startOperation calling proxy for cache",
                  "startOperation proxy cache replied, purged: {\"SIMULATED_CALL\": 1, "
                  "\"SPACEKEEP_AMOUNT\": 100}",
                  "updateInFlight removing cache",
                  "performPeriodicsWithInfo result: {\"SPACEKEEP_AMOUNT\": 100}"}));
    EXPECT_TRUE(world.world.statistics().keys().empty());
  });
}

// A service that answers before the next one is asked leaves nobody in flight for a moment.
TEST(PeriodicWaits, AnAnswerBeforeTheNextServiceIsAskedEndsTheWait) {
  unsigned ended_early = 0;
  inEverySchedule(200, [&ended_early] {
    PeriodicWorld world;
    world.add("a", 100, 0);
    world.add("b", 200, 2 * kSecond);
    world.start();
    const auto operation = world.make();
    const std::uint64_t start_ns = world.world.nowNs();
    const Dictionary outcome = world.run(*operation);
    const std::uint64_t duration_ns = world.world.nowNs() - start_ns;
    if (duration_ns == 0) {
      ++ended_early;
      EXPECT_EQ(outcome, amountOf(100));
    } else {
      EXPECT_EQ(duration_ns, 2 * kSecond);
      EXPECT_EQ(outcome, amountOf(200));
    }
  });
  EXPECT_GT(ended_early, 0U);
}

}  // namespace
}  // namespace spacekeep::test
