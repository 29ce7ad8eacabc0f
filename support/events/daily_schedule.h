// Thread safety: plain values and pure functions.
//
// When a scheduled activity is due. Two clocks go into it. Within one boot only the boot clock
// counts (it goes on during suspend and nobody can set it), so a wall clock that jumps changes
// nothing. Across a restart of the machine only the wall clock can tell how much time has passed;
// when it cannot be right (it stands before the last run) the run counts as missed, which costs at
// most one run too many per boot instead of years without one.
#pragma once

#include <cstdint>
#include <optional>
#include <string>

namespace spacekeep {

/// As the launch file gives it.
struct DailySchedule {
  std::uint64_t interval_seconds = 86400;
  std::uint64_t random_delay_seconds = 0;  ///< each run comes up to so much later
  bool wants_mains_power = false;
  std::uint64_t mains_power_wait_seconds = 0;  ///< then it runs on battery
};

/// Now, by both clocks.
struct Clocks {
  std::int64_t wall_ns = 0;   ///< since 1970
  std::uint64_t boot_ns = 0;  ///< since the machine started, suspend included (CLOCK_BOOTTIME)
  std::string boot_id = {};   ///< different after each start of the machine
};

/// The moment from which the next interval counts: when the last run was to be, or, if that came
/// late, when it was. Kept across restarts.
struct RunRecord {
  std::int64_t wall_ns = 0;
  std::uint64_t boot_ns = 0;
  std::string boot_id = {};
  bool operator==(const RunRecord&) const = default;
};

struct DailyPlan {
  std::optional<RunRecord> last = {};  ///< none: it never ran
  std::uint64_t since_boot_ns = 0;     ///< when this plan was made; nothing is due before
  std::uint64_t delay_ns = 0;          ///< drawn once per plan, below random_delay_seconds
};

enum class DailyStep { kWait, kWaitForPower, kRun };

struct DailyDecision {
  DailyStep step = DailyStep::kWait;
  std::uint64_t wake_boot_ns = 0;  ///< when to decide again, for the two waits
  RunRecord record = {};           ///< what to keep, for kRun
};

/// How often the power is looked at while a run waits for it.
inline constexpr std::uint64_t kPowerLookNs = 600'000'000'000;

/// The boot time at which the run is due.
[[nodiscard]] std::uint64_t dueBootNs(const DailySchedule& schedule, const DailyPlan& plan,
                                      const Clocks& now);

[[nodiscard]] DailyDecision decideDaily(const DailySchedule& schedule, const DailyPlan& plan,
                                        const Clocks& now, bool on_mains_power);

}  // namespace spacekeep
