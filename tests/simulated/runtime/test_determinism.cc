#include <gtest/gtest.h>

#include <set>
#include <string>
#include <vector>

#include "support/queues/serial_queue.h"
#include "support/queues/waiting.h"
#include "tests/helpers/simulated/one_schedule.h"

namespace spacekeep {
namespace {

rt::ScheduleOptions withSeed(std::uint64_t seed, rt::Strategy strategy = rt::Strategy::kRandom) {
  rt::ScheduleOptions options;
  options.seed = seed;
  options.strategy = strategy;
  return options;
}

struct Trial {
  rt::ScheduleReport report;
  std::string text;  ///< what the schedule wrote
};

// Three threads that write their letters one by one, with times and random numbers between.
Trial lettersOf(const rt::ScheduleOptions& options) {
  Trial run;
  run.report = runOneSchedule(options, [&run] {
    ConcurrentQueue queue({});
    rt::Mutex mutex;
    TaskGroup group;
    for (const char letter : {'a', 'b', 'c'}) {
      group.async(queue, [&run, &mutex, letter] {
        for (int round = 0; round < 5; ++round) {
          rt::sleepNs(rt::randomNumber() % 3);
          const std::scoped_lock lock(mutex);
          run.text += letter + std::to_string(rt::ticks()) + ":" + std::to_string(rt::choose(10));
        }
      });
    }
    group.wait();
  });
  return run;
}

class Determinism : public ::testing::TestWithParam<rt::Strategy> {};

TEST_P(Determinism, TheSameSeedGivesTheSameTraceAndTheSameBytes) {
  for (std::uint64_t seed = 1; seed <= 50; ++seed) {
    const Trial first = lettersOf(withSeed(seed, GetParam()));
    const Trial second = lettersOf(withSeed(seed, GetParam()));
    EXPECT_EQ(first.report.trace_hash, second.report.trace_hash);
    EXPECT_EQ(first.report.steps, second.report.steps);
    EXPECT_EQ(first.report.virtual_ns, second.report.virtual_ns);
    EXPECT_EQ(first.text, second.text);
  }
}

TEST_P(Determinism, OtherSeedsGiveOtherTraces) {
  std::set<std::uint64_t> hashes;
  std::set<std::string> texts;
  for (std::uint64_t seed = 1; seed <= 50; ++seed) {
    const Trial run = lettersOf(withSeed(seed, GetParam()));
    hashes.insert(run.report.trace_hash);
    texts.insert(run.text);
  }
  EXPECT_EQ(hashes.size(), 50U);
  EXPECT_EQ(texts.size(), 50U);
}

INSTANTIATE_TEST_SUITE_P(Strategies, Determinism,
                         ::testing::Values(rt::Strategy::kRandom, rt::Strategy::kPct),
                         [](const auto& strategy) {
                           return strategy.param == rt::Strategy::kRandom ? "Random" : "Pct";
                         });

TEST(ScheduleNames, SurviveBeingWrittenAndRead) {
  rt::ScheduleOptions options = withSeed(17, rt::Strategy::kPct);
  options.pct_expected_steps = 431;
  EXPECT_EQ(scheduleName(options), "pct:17:431");
  const rt::ScheduleOptions read = scheduleNamed("pct:17:431");
  EXPECT_EQ(read.seed, 17U);
  EXPECT_EQ(read.strategy, rt::Strategy::kPct);
  EXPECT_EQ(read.pct_expected_steps, 431U);
  EXPECT_EQ(scheduleNamed("random:9").seed, 9U);
  EXPECT_EQ(scheduleNamed("random:9").strategy, rt::Strategy::kRandom);
  EXPECT_EQ(scheduleNamed("other:9").seed, 0U);
}

}  // namespace
}  // namespace spacekeep
