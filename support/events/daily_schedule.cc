#include "support/events/daily_schedule.h"

#include <algorithm>

namespace spacekeep {
namespace {

constexpr std::uint64_t kNsPerSecond = 1'000'000'000;
/// A run that starts so shortly after it was due was on time, and the next one counts from when it
/// was to be: the time of day does not creep forward by the random delays.
constexpr std::uint64_t kPunctualNs = 60 * kNsPerSecond;

std::uint64_t secondsToNs(std::uint64_t seconds) {
  return seconds > UINT64_MAX / 4 / kNsPerSecond ? UINT64_MAX / 4 : seconds * kNsPerSecond;
}

/// Time since the recorded run. None when the clocks cannot tell.
std::optional<std::uint64_t> elapsedSince(const RunRecord& last, const Clocks& now) {
  if (last.boot_id == now.boot_id) {
    if (now.boot_ns < last.boot_ns) return std::nullopt;
    return now.boot_ns - last.boot_ns;
  }
  if (now.wall_ns < last.wall_ns) return std::nullopt;
  const auto by_wall =
      static_cast<std::uint64_t>(now.wall_ns) - static_cast<std::uint64_t>(last.wall_ns);
  return std::max(by_wall, now.boot_ns);  // at least as long as the machine has been up since
}

/// When the interval is over, without the random delay.
std::uint64_t nominalBootNs(const DailySchedule& schedule, const DailyPlan& plan,
                            const Clocks& now) {
  if (!plan.last) return plan.since_boot_ns;
  const auto elapsed = elapsedSince(*plan.last, now);
  if (!elapsed) return plan.since_boot_ns;
  const std::uint64_t over_at = now.boot_ns + secondsToNs(schedule.interval_seconds);
  return std::max(plan.since_boot_ns, over_at > *elapsed ? over_at - *elapsed : 0);
}

RunRecord recordOf(std::uint64_t nominal_boot_ns, std::uint64_t due_boot_ns, const Clocks& now) {
  const bool punctual = now.boot_ns - due_boot_ns <= kPunctualNs;
  const std::uint64_t from = punctual ? nominal_boot_ns : now.boot_ns;
  return {.wall_ns = now.wall_ns - static_cast<std::int64_t>(now.boot_ns - from),
          .boot_ns = from,
          .boot_id = now.boot_id};
}

}  // namespace

std::uint64_t dueBootNs(const DailySchedule& schedule, const DailyPlan& plan, const Clocks& now) {
  return nominalBootNs(schedule, plan, now) + plan.delay_ns;
}

DailyDecision decideDaily(const DailySchedule& schedule, const DailyPlan& plan, const Clocks& now,
                          bool on_mains_power) {
  const std::uint64_t due = dueBootNs(schedule, plan, now);
  if (now.boot_ns < due) return {.step = DailyStep::kWait, .wake_boot_ns = due, .record = {}};
  const std::uint64_t give_up = due + secondsToNs(schedule.mains_power_wait_seconds);
  if (schedule.wants_mains_power && !on_mains_power && now.boot_ns < give_up) {
    return {.step = DailyStep::kWaitForPower,
            .wake_boot_ns = std::min(give_up, now.boot_ns + kPowerLookNs),
            .record = {}};
  }
  return {.step = DailyStep::kRun,
          .wake_boot_ns = 0,
          .record = recordOf(due - plan.delay_ns, due, now)};
}

}  // namespace spacekeep
