#include "support/events/daily_schedule.h"

#include <gtest/gtest.h>

namespace spacekeep {
namespace {

constexpr std::uint64_t kSecond = 1'000'000'000;
constexpr std::uint64_t kMinute = 60 * kSecond;
constexpr std::uint64_t kHour = 60 * kMinute;
constexpr std::uint64_t kDay = 24 * kHour;
constexpr std::int64_t kWallNow = 1'800'000'000'000'000'000;

std::int64_t wall(std::int64_t offset_ns) { return kWallNow + offset_ns; }

DailySchedule daily() { return {.interval_seconds = 86400, .random_delay_seconds = 3600}; }

/// At `boot_ns` of the boot "now", with the wall clock at `wall_ns`.
Clocks at(std::uint64_t boot_ns, std::int64_t wall_ns = kWallNow) {
  return {.wall_ns = wall_ns, .boot_ns = boot_ns, .boot_id = "now"};
}

/// The record of a run, as it stands after that time.
RunRecord ranAgo(std::uint64_t elapsed_ns, const Clocks& now) {
  return {.wall_ns = now.wall_ns,
          .boot_ns = now.boot_ns,
          .boot_id = now.boot_id,
          .elapsed_ns = elapsed_ns};
}

struct ElapsedCase {
  const char* what;
  RunRecord record;
  Clocks now;
  std::uint64_t elapsed_ns;
};

TEST(RunRecord, HowMuchTimeHasPassed) {
  const auto kept = [](std::string boot_id) {
    return RunRecord{.wall_ns = kWallNow,
                     .boot_ns = 5 * kHour,
                     .boot_id = std::move(boot_id),
                     .elapsed_ns = 2 * kHour};
  };
  const std::vector<ElapsedCase> cases = {
      {"in one boot the boot clock counts", kept("now"), at(6 * kHour), 3 * kHour},
      {"whatever the wall clock says", kept("now"), at(6 * kHour, wall(std::int64_t{40 * kDay})),
       3 * kHour},
      {"or said", kept("now"), at(6 * kHour, 0), 3 * kHour},
      {"a boot clock that stands earlier adds nothing", kept("now"), at(kHour), 2 * kHour},
      {"across boots the wall clock counts", kept("before"),
       at(kMinute, wall(std::int64_t{30 * kHour})), 32 * kHour},
      {"at least the time since the start", kept("before"), at(20 * kHour, wall(1)), 22 * kHour},
      {"and that alone when the clock was set back", kept("before"), at(20 * kHour, 0), 22 * kHour},
      {"nothing runs over",
       {.wall_ns = INT64_MIN, .boot_ns = 0, .boot_id = "before", .elapsed_ns = UINT64_MAX},
       at(UINT64_MAX, INT64_MAX),
       UINT64_MAX / 8},
  };
  for (const ElapsedCase& each : cases) {
    EXPECT_EQ(elapsedSince(each.record, each.now), each.elapsed_ns) << each.what;
  }
}

TEST(RunRecord, KeptAnewItTellsTheSameByTheClocksOfNow) {
  const RunRecord kept = recordAsOf(
      {.wall_ns = kWallNow, .boot_ns = 5 * kHour, .boot_id = "before", .elapsed_ns = 2 * kHour},
      at(kMinute, wall(std::int64_t{kHour})));
  EXPECT_EQ(kept, (RunRecord{.wall_ns = wall(std::int64_t{kHour}),
                             .boot_ns = kMinute,
                             .boot_id = "now",
                             .elapsed_ns = 3 * kHour}));
}

TEST(RunRecord, ItIsKeptAnewOftenAtFirstAndAFewTimesADayLater) {
  EXPECT_EQ(nextKeepingBootNs(0), 10 * kMinute);
  EXPECT_EQ(nextKeepingBootNs(10 * kMinute), 20 * kMinute);
  EXPECT_EQ(nextKeepingBootNs(kHour), 2 * kHour);
  EXPECT_EQ(nextKeepingBootNs(30 * kHour), 36 * kHour);
}

struct DueCase {
  const char* what;
  std::uint64_t elapsed_ns;  // when the plan was made, an hour after the start of the machine
  std::uint64_t delay_ns;
  std::uint64_t due_after_ns;  // from then
};

TEST(DailySchedule, WhenARunIsDue) {
  const DueCase cases[] = {
      {"a day after the last run", 2 * kHour, 0, 22 * kHour},
      {"a day and the random delay", 2 * kHour, kMinute, 22 * kHour + kMinute},
      {"at once", kDay, 0, 0},
      {"missed: made up for after the random delay", 9 * kDay, 3 * kMinute, 3 * kMinute},
      {"but within ten minutes", 9 * kDay, 33 * kMinute, 3 * kMinute},
      {"a start shortly before it is due", kDay + 30 * kMinute, 32 * kMinute, 2 * kMinute},
  };
  for (const DueCase& each : cases) {
    const DailyPlan plan{.record = ranAgo(each.elapsed_ns, at(kHour)),
                         .since_boot_ns = kHour,
                         .delay_ns = each.delay_ns};
    // It stays the same while time passes, whatever becomes of the wall clock.
    for (const std::uint64_t passed : {0 * kHour, kMinute, 20 * kHour, 3 * kDay}) {
      EXPECT_EQ(dueBootNs(daily(), plan, at(kHour + passed, wall(-std::int64_t{kDay}))),
                kHour + each.due_after_ns)
          << each.what;
    }
  }
}

TEST(DailySchedule, WhatNeverRanCountsAsMissed) {
  const DailyPlan plan{.record = recordOfNoRun(daily(), at(kMinute)),
                       .since_boot_ns = kMinute,
                       .delay_ns = 7 * kMinute};
  EXPECT_EQ(dueBootNs(daily(), plan, at(kMinute)), 8 * kMinute);
}

TEST(DailySchedule, ItWaitsAndThenRuns) {
  const DailyPlan plan{
      .record = ranAgo(kDay, at(kMinute)), .since_boot_ns = kMinute, .delay_ns = kMinute};
  const DailyDecision early = decideDaily(daily(), plan, at(2 * kMinute - 1), true);
  EXPECT_EQ(early.step, DailyStep::kWait);
  EXPECT_EQ(early.wake_boot_ns, 2 * kMinute);
  EXPECT_EQ(decideDaily(daily(), plan, at(2 * kMinute), true).step, DailyStep::kRun);
}

TEST(DailySchedule, APunctualRunCountsFromWhenItWasToBeWithoutItsDelay) {
  const DailyPlan plan{
      .record = ranAgo(0, at(0)), .since_boot_ns = kMinute, .delay_ns = 30 * kMinute};
  const DailyDecision decision =
      decideDaily(daily(), plan, at(kDay + 30 * kMinute + kSecond), true);
  ASSERT_EQ(decision.step, DailyStep::kRun);
  EXPECT_EQ(decision.record, ranAgo(30 * kMinute + kSecond, at(kDay + 30 * kMinute + kSecond)));
}

TEST(DailySchedule, ALateRunCountsFromWhenItWas) {
  const DailyPlan plan{.record = ranAgo(0, at(0)), .since_boot_ns = kMinute, .delay_ns = 0};
  const DailyDecision decision = decideDaily(daily(), plan, at(kDay + 5 * kHour), true);
  ASSERT_EQ(decision.step, DailyStep::kRun);
  EXPECT_EQ(decision.record, ranAgo(0, at(kDay + 5 * kHour)));
}

TEST(DailySchedule, ManyMissedRunsAreMadeUpForByOne) {
  DailyPlan plan{.record = ranAgo(10 * kDay, at(kHour)), .since_boot_ns = kHour, .delay_ns = 0};
  const DailyDecision first = decideDaily(daily(), plan, at(kHour), true);
  ASSERT_EQ(first.step, DailyStep::kRun);
  plan = {.record = first.record, .since_boot_ns = kHour + kMinute, .delay_ns = 0};
  const DailyDecision second = decideDaily(daily(), plan, at(kHour + kMinute), true);
  EXPECT_EQ(second.step, DailyStep::kWait);
  EXPECT_EQ(second.wake_boot_ns, kHour + kDay);
}

struct PowerCase {
  const char* what;
  bool wants_mains;
  bool on_mains;
  std::uint64_t late_ns;
  DailyStep step;
  std::uint64_t wake_after_ns;  // from now
};

TEST(DailySchedule, HowItWaitsForMainsPower) {
  constexpr std::uint64_t kWaitNs = kDay - 10 * kMinute;
  const PowerCase cases[] = {
      {"not wanted", false, false, 0, DailyStep::kRun, 0},
      {"wanted and there", true, true, 0, DailyStep::kRun, 0},
      {"wanted and missing", true, false, 0, DailyStep::kWaitForPower, 10 * kMinute},
      {"looks no later than the end of the wait", true, false, kWaitNs - kMinute,
       DailyStep::kWaitForPower, kMinute},
      {"the wait is over", true, false, kWaitNs, DailyStep::kRun, 0},
      {"comes back meanwhile", true, true, 5 * kHour, DailyStep::kRun, 0},
  };
  const DailyPlan plan{.record = ranAgo(0, at(0)), .since_boot_ns = 0, .delay_ns = 0};
  for (const PowerCase& each : cases) {
    DailySchedule schedule = daily();
    schedule.wants_mains_power = each.wants_mains;
    schedule.mains_power_wait_seconds = 86400;
    const std::uint64_t now = kDay + each.late_ns;
    const DailyDecision decision = decideDaily(schedule, plan, at(now), each.on_mains);
    EXPECT_EQ(decision.step, each.step) << each.what;
    if (each.step == DailyStep::kRun) continue;
    EXPECT_EQ(decision.wake_boot_ns, now + each.wake_after_ns) << each.what;
  }
}

TEST(DailySchedule, ARestartDoesNotMakeItWaitForMainsPowerAllOverAgain) {
  DailySchedule schedule = daily();
  schedule.wants_mains_power = true;
  schedule.mains_power_wait_seconds = 86400;
  const DailyPlan plan{
      .record = ranAgo(47 * kHour, at(kHour)), .since_boot_ns = kHour, .delay_ns = 5 * kMinute};
  const DailyDecision decision = decideDaily(schedule, plan, at(kHour + 55 * kMinute), false);
  EXPECT_EQ(decision.step, DailyStep::kRun);
}

}  // namespace
}  // namespace spacekeep
