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

struct DueCase {
  const char* what;
  DailyPlan plan;
  Clocks now;
  std::uint64_t due_boot_ns;
};

TEST(DailySchedule, WhenARunIsDue) {
  const auto ran_this_boot = [](std::uint64_t boot_ns) {
    return RunRecord{.wall_ns = 0, .boot_ns = boot_ns, .boot_id = "now"};
  };
  const auto ran_before_boot = [](std::int64_t wall_ns) {
    return RunRecord{.wall_ns = wall_ns, .boot_ns = 5 * kDay, .boot_id = "before"};
  };
  const std::vector<DueCase> cases = {
      {"never ran: after the random delay from the start",
       {.last = {}, .since_boot_ns = kMinute, .delay_ns = 7 * kMinute},
       at(kMinute),
       8 * kMinute},
      {"a day after the last run",
       {.last = ran_this_boot(kHour), .since_boot_ns = 2 * kHour, .delay_ns = 0},
       at(3 * kHour),
       kHour + kDay},
      {"a day and the random delay after the last run",
       {.last = ran_this_boot(kHour), .since_boot_ns = 2 * kHour, .delay_ns = kMinute},
       at(3 * kHour),
       kHour + kDay + kMinute},
      {"the wall clock of this boot may jump forward",
       {.last = ran_this_boot(kHour), .since_boot_ns = 2 * kHour, .delay_ns = 0},
       at(3 * kHour, wall(100 * std::int64_t{kDay})),
       kHour + kDay},
      {"or back",
       {.last = ran_this_boot(kHour), .since_boot_ns = 2 * kHour, .delay_ns = 0},
       at(3 * kHour, 0),
       kHour + kDay},
      {"missed while the daemon was down: made up for after the random delay",
       {.last = ran_this_boot(kHour), .since_boot_ns = 9 * kDay, .delay_ns = kMinute},
       at(9 * kDay),
       9 * kDay + kMinute},
      {"six hours before the restart of the machine",
       {.last = ran_before_boot(wall(-std::int64_t{6 * kHour})),
        .since_boot_ns = kMinute,
        .delay_ns = 0},
       at(kMinute),
       kMinute + 18 * kHour},
      {"missed while the machine was off",
       {.last = ran_before_boot(wall(-std::int64_t{30 * kDay})),
        .since_boot_ns = kMinute,
        .delay_ns = 3 * kMinute},
       at(kMinute),
       4 * kMinute},
      {"the wall clock stands before the last run: counts as missed",
       {.last = ran_before_boot(wall(1)), .since_boot_ns = kMinute, .delay_ns = 3 * kMinute},
       at(kMinute),
       4 * kMinute},
      {"a machine that has been up for longer than the wall clock says",
       {.last = ran_before_boot(wall(-std::int64_t{kHour})),
        .since_boot_ns = 2 * kHour,
        .delay_ns = 0},
       at(20 * kHour),
       kDay},
      {"the boot clock stands before the last run",
       {.last = ran_this_boot(kDay), .since_boot_ns = kHour, .delay_ns = 0},
       at(kHour),
       kHour},
  };
  for (const DueCase& each : cases) {
    EXPECT_EQ(dueBootNs(daily(), each.plan, each.now), each.due_boot_ns) << each.what;
  }
}

TEST(DailySchedule, TheDueTimeStaysTheSameWhileTimePasses) {
  const DailyPlan plan{
      .last =
          RunRecord{.wall_ns = wall(-std::int64_t{6 * kHour}), .boot_ns = 0, .boot_id = "before"},
      .since_boot_ns = kMinute,
      .delay_ns = 20 * kMinute};
  const std::uint64_t due = dueBootNs(daily(), plan, at(kMinute));
  for (std::uint64_t passed : {kHour, 17 * kHour, 18 * kHour, 18 * kHour + 10 * kMinute, kDay}) {
    EXPECT_EQ(
        dueBootNs(daily(), plan, at(kMinute + passed, wall(static_cast<std::int64_t>(passed)))),
        due)
        << passed;
  }
}

TEST(DailySchedule, ItWaitsAndThenRuns) {
  const DailyPlan plan{.last = {}, .since_boot_ns = kMinute, .delay_ns = kMinute};
  const DailyDecision early = decideDaily(daily(), plan, at(2 * kMinute - 1), true);
  EXPECT_EQ(early.step, DailyStep::kWait);
  EXPECT_EQ(early.wake_boot_ns, 2 * kMinute);
  EXPECT_EQ(decideDaily(daily(), plan, at(2 * kMinute), true).step, DailyStep::kRun);
}

TEST(DailySchedule, APunctualRunCountsFromWhenItWasToBeWithoutItsDelay) {
  const DailyPlan plan{.last = RunRecord{.wall_ns = 0, .boot_ns = 0, .boot_id = "now"},
                       .since_boot_ns = kMinute,
                       .delay_ns = 30 * kMinute};
  const DailyDecision decision =
      decideDaily(daily(), plan, at(kDay + 30 * kMinute + kSecond), true);
  ASSERT_EQ(decision.step, DailyStep::kRun);
  EXPECT_EQ(decision.record.boot_ns, kDay);
  EXPECT_EQ(decision.record.wall_ns, wall(-std::int64_t{30 * kMinute + kSecond}));
  EXPECT_EQ(decision.record.boot_id, "now");
}

TEST(DailySchedule, ALateRunCountsFromWhenItWas) {
  const DailyPlan plan{.last = RunRecord{.wall_ns = 0, .boot_ns = 0, .boot_id = "now"},
                       .since_boot_ns = kMinute,
                       .delay_ns = 0};
  const DailyDecision decision = decideDaily(daily(), plan, at(kDay + 5 * kHour), true);
  ASSERT_EQ(decision.step, DailyStep::kRun);
  EXPECT_EQ(decision.record.boot_ns, kDay + 5 * kHour);
  EXPECT_EQ(decision.record.wall_ns, kWallNow);
}

TEST(DailySchedule, ManyMissedRunsAreMadeUpForByOne) {
  DailyPlan plan{.last = RunRecord{.wall_ns = 0, .boot_ns = 0, .boot_id = "now"},
                 .since_boot_ns = 10 * kDay,
                 .delay_ns = 0};
  const DailyDecision first = decideDaily(daily(), plan, at(10 * kDay), true);
  ASSERT_EQ(first.step, DailyStep::kRun);
  plan = {.last = first.record, .since_boot_ns = 10 * kDay + kMinute, .delay_ns = 0};
  const DailyDecision second = decideDaily(daily(), plan, at(10 * kDay + kMinute), true);
  EXPECT_EQ(second.step, DailyStep::kWait);
  EXPECT_EQ(second.wake_boot_ns, 11 * kDay);
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
  const PowerCase cases[] = {
      {"not wanted", false, false, 0, DailyStep::kRun, 0},
      {"wanted and there", true, true, 0, DailyStep::kRun, 0},
      {"wanted and missing", true, false, 0, DailyStep::kWaitForPower, 10 * kMinute},
      {"looks no later than the end of the wait", true, false, kDay - kMinute,
       DailyStep::kWaitForPower, kMinute},
      {"a further day has passed", true, false, kDay, DailyStep::kRun, 0},
      {"comes back meanwhile", true, true, 5 * kHour, DailyStep::kRun, 0},
  };
  const DailyPlan plan{.last = RunRecord{.wall_ns = 0, .boot_ns = 0, .boot_id = "now"},
                       .since_boot_ns = 0,
                       .delay_ns = 0};
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

TEST(DailySchedule, AWallClockThatIsSetWildlyInOneBootRunsOnceADay) {
  DailyPlan plan{.last = RunRecord{.wall_ns = kWallNow, .boot_ns = 0, .boot_id = "now"},
                 .since_boot_ns = 0,
                 .delay_ns = 0};
  int runs = 0;
  for (std::uint64_t hour = 1; hour <= 24 * 10; ++hour) {
    const std::int64_t wall_ns = hour % 3 == 0 ? 0 : hour % 3 == 1 ? kWallNow : INT64_MAX / 2;
    const DailyDecision decision = decideDaily(daily(), plan, at(hour * kHour, wall_ns), true);
    if (decision.step != DailyStep::kRun) continue;
    ++runs;
    plan.last = decision.record;
  }
  EXPECT_EQ(runs, 10);
}

}  // namespace
}  // namespace spacekeep
