#include "support/events/daily_schedule.h"

#include <algorithm>

namespace spacekeep {
namespace {

constexpr std::uint64_t kNsPerSecond = 1'000'000'000;
/// A run that starts so shortly after it was due was on time, and the next one counts from when it
/// was to be: the time of day does not creep forward by the random delays.
constexpr std::uint64_t kPunctualNs = 60 * kNsPerSecond;
constexpr std::uint64_t kShortestKeepingNs = 600 * kNsPerSecond;
constexpr std::uint64_t kLongestKeepingNs = 6 * 3600 * kNsPerSecond;
/// About 70 years, and sums of a few stay in range.
constexpr std::uint64_t kBeyondReasonNs = UINT64_MAX / 8;

std::uint64_t secondsToNs(std::uint64_t seconds) {
  return std::min(seconds, kBeyondReasonNs / kNsPerSecond) * kNsPerSecond;
}

std::uint64_t decrease(std::uint64_t from, std::uint64_t by) { return from > by ? from - by : 0; }

/// None of the clocks is trusted with the size of what it says.
std::uint64_t sum(std::uint64_t first, std::uint64_t second) {
  return std::min(std::min(first, kBeyondReasonNs) + std::min(second, kBeyondReasonNs),
                  kBeyondReasonNs);
}

/// Elapsed time at which the run is to be.
std::uint64_t nominalNs(const DailySchedule& schedule, const DailyPlan& plan) {
  return secondsToNs(schedule.interval_seconds) + plan.delay_ns;
}

std::uint64_t powerWaitNs(const DailySchedule& schedule) {
  if (!schedule.wants_mains_power) return 0;
  return decrease(secondsToNs(schedule.mains_power_wait_seconds), kLongestCatchUpNs);
}

/// The boot time at which `elapsed_ns` will have passed; now when that was before this boot.
std::uint64_t bootNsOf(std::uint64_t elapsed_ns, const DailyPlan& plan, const Clocks& now) {
  const std::uint64_t passed_ns = elapsedSince(plan.record, now);
  return elapsed_ns >= passed_ns ? now.boot_ns + (elapsed_ns - passed_ns)
                                 : decrease(now.boot_ns, passed_ns - elapsed_ns);
}

RunRecord recordOfRun(const DailySchedule& schedule, const DailyPlan& plan, const Clocks& now) {
  const std::uint64_t elapsed_ns = elapsedSince(plan.record, now);
  const bool punctual = elapsed_ns - nominalNs(schedule, plan) <= kPunctualNs;
  return {.wall_ns = now.wall_ns,
          .boot_ns = now.boot_ns,
          .boot_id = now.boot_id,
          .elapsed_ns = punctual ? elapsed_ns - secondsToNs(schedule.interval_seconds) : 0};
}

}  // namespace

std::uint64_t elapsedSince(const RunRecord& record, const Clocks& now) {
  if (record.boot_id == now.boot_id) {
    return sum(record.elapsed_ns, decrease(now.boot_ns, record.boot_ns));
  }
  const std::uint64_t certain_ns = sum(record.elapsed_ns, now.boot_ns);
  if (now.wall_ns < record.wall_ns) return certain_ns;
  const auto off_and_on_ns =
      static_cast<std::uint64_t>(now.wall_ns) - static_cast<std::uint64_t>(record.wall_ns);
  return std::max(certain_ns, sum(record.elapsed_ns, off_and_on_ns));
}

RunRecord recordAsOf(const RunRecord& record, const Clocks& now) {
  return {.wall_ns = now.wall_ns,
          .boot_ns = now.boot_ns,
          .boot_id = now.boot_id,
          .elapsed_ns = elapsedSince(record, now)};
}

RunRecord recordOfNoRun(const DailySchedule& schedule, const Clocks& now) {
  return {.wall_ns = now.wall_ns,
          .boot_ns = now.boot_ns,
          .boot_id = now.boot_id,
          .elapsed_ns = secondsToNs(schedule.interval_seconds)};
}

std::uint64_t nextKeepingBootNs(std::uint64_t boot_ns) {
  return boot_ns + std::clamp(boot_ns, kShortestKeepingNs, kLongestKeepingNs);
}

std::uint64_t dueBootNs(const DailySchedule& schedule, const DailyPlan& plan, const Clocks& now) {
  const std::uint64_t catch_up_ns = plan.since_boot_ns + plan.delay_ns % kLongestCatchUpNs;
  return std::max(bootNsOf(nominalNs(schedule, plan), plan, now), catch_up_ns);
}

DailyDecision decideDaily(const DailySchedule& schedule, const DailyPlan& plan, const Clocks& now,
                          bool on_mains_power) {
  const std::uint64_t due = dueBootNs(schedule, plan, now);
  if (now.boot_ns < due) return {.step = DailyStep::kWait, .wake_boot_ns = due, .record = {}};
  const std::uint64_t give_up =
      bootNsOf(nominalNs(schedule, plan) + powerWaitNs(schedule), plan, now);
  if (schedule.wants_mains_power && !on_mains_power && now.boot_ns < give_up) {
    return {.step = DailyStep::kWaitForPower,
            .wake_boot_ns = std::min(give_up, now.boot_ns + kPowerLookNs),
            .record = {}};
  }
  return {.step = DailyStep::kRun, .wake_boot_ns = 0, .record = recordOfRun(schedule, plan, now)};
}

}  // namespace spacekeep
