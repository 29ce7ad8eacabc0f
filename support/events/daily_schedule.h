// Thread safety: plain values and pure functions.
//
// When a scheduled activity is due. What counts is the time since the last run, kept as a record on
// disk. Within one boot only the boot clock adds to it (it goes on during suspend and nobody can
// set it), so a wall clock that jumps changes nothing. Across a restart of the machine the wall
// clock tells how long it was off; where that cannot be (it stands before the record) only what is
// certain counts: what had passed when the record was kept, and the time since this start. A record
// is therefore kept anew now and then, and whenever the wall clock is set.
#pragma once

#include <cstdint>
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

/// By these clocks, `elapsed_ns` had passed since the moment from which the interval counts: when
/// the last run was to be or, if that came late, when it was.
struct RunRecord {
  std::int64_t wall_ns = 0;
  std::uint64_t boot_ns = 0;
  std::string boot_id = {};
  std::uint64_t elapsed_ns = 0;
  bool operator==(const RunRecord&) const = default;
};

/// Time passed at `now`, at least what is certain.
[[nodiscard]] std::uint64_t elapsedSince(const RunRecord& record, const Clocks& now);
/// The same record, by the clocks of now.
[[nodiscard]] RunRecord recordAsOf(const RunRecord& record, const Clocks& now);
/// For an activity that never ran: it counts as missed.
[[nodiscard]] RunRecord recordOfNoRun(const DailySchedule& schedule, const Clocks& now);
/// When a record that was kept at `boot_ns` is to be kept anew: at half of the machine's time up or
/// more it is good enough. Often at first, a few times a day later on.
[[nodiscard]] std::uint64_t nextKeepingBootNs(std::uint64_t boot_ns);

struct DailyPlan {
  RunRecord record = {};            ///< of this boot
  std::uint64_t since_boot_ns = 0;  ///< when this plan was made; what was missed by then is made
                                    ///< up for a little later, not while everything starts
  std::uint64_t delay_ns = 0;       ///< drawn once per plan, below random_delay_seconds
};

enum class DailyStep { kWait, kWaitForPower, kRun };

struct DailyDecision {
  DailyStep step = DailyStep::kWait;
  std::uint64_t wake_boot_ns = 0;  ///< when to decide again, for the two waits
  RunRecord record = {};           ///< what to keep, for kRun
};

/// How often the power is looked at while a run waits for it.
inline constexpr std::uint64_t kPowerLookNs = 600'000'000'000;
/// A missed run is made up for within this time of a start. The wait for mains power is shorter by
/// as much, so that a start at its very end does not make the run later than it may be.
inline constexpr std::uint64_t kLongestCatchUpNs = 600'000'000'000;

/// The boot time at which the run is due.
[[nodiscard]] std::uint64_t dueBootNs(const DailySchedule& schedule, const DailyPlan& plan,
                                      const Clocks& now);

[[nodiscard]] DailyDecision decideDaily(const DailySchedule& schedule, const DailyPlan& plan,
                                        const Clocks& now, bool on_mains_power);

}  // namespace spacekeep
