// Thread safety: runSchedule may be called from one thread at a time; the other functions only from
// code that runs inside a schedule.
//
// Control of the deterministic runtime. A schedule runs `body` and every thread it starts as fibers
// on the calling thread. At every blocking operation, and at every lock, unlock, notification and
// thread start, the scheduler picks who runs next from the seed alone, so the same seed, options
// and code give the same run to the byte. Virtual time moves only when nobody can run, and then
// straight to the earliest deadline.
#pragma once

#include <cstdint>
#include <functional>
#include <string>
#include <vector>

namespace spacekeep::rt {

enum class Strategy {
  kRandom,  ///< at every choice, any runnable fiber with equal chance
  kPct,     ///< random priorities and `pct_depth` - 1 priority change points (Burckhardt et al.,
            ///< "A randomized scheduler with probabilistic guarantees of finding bugs", 2010)
};

struct ScheduleOptions {
  std::uint64_t seed = 1;
  Strategy strategy = Strategy::kRandom;
  unsigned pct_depth = 3;
  std::uint64_t pct_expected_steps = 2000;  ///< change points are spread over this many steps
  std::uint64_t max_steps = 5'000'000;      ///< a longer run is reported as stuck
  std::int64_t wall_clock_start_ns = 1'700'000'000'000'000'000;
};

enum class ScheduleEnd {
  kFinished,  ///< `body` returned
  kDeadlock,  ///< `body` has not returned, nobody can run and no deadline is pending
  kStuck,     ///< max_steps were used up
};

struct ScheduleReport {
  ScheduleEnd end = ScheduleEnd::kFinished;
  std::uint64_t steps = 0;
  std::uint64_t trace_hash = 0;  ///< equal for equal runs
  std::uint64_t virtual_ns = 0;  ///< virtual time when `body` returned, or when nothing went on
  /// Each fiber that was left at the end as "name#number: what it waits for", and each that could
  /// not be unwound.
  std::vector<std::string> blocked;
};

/// Runs one schedule. After `body` has returned (or cannot), the fibers that remain are run until
/// they all wait without a deadline, and are then unwound by an exception from the place where
/// they wait, so that destructors run and nothing leaks. An exception that leaves `body` is
/// rethrown to the caller after that.
ScheduleReport runSchedule(const ScheduleOptions& options, const std::function<void()>& body);

/// True inside runSchedule.
[[nodiscard]] bool insideSchedule();

/// True while what is left of a schedule is unwound: what happens now is no part of the run.
[[nodiscard]] bool clearingAway();

/// In a schedule that is cleared away: every Keeper made in it lets go. To be called when nothing
/// of the run needs them any more.
void letKeepersGo();

/// Moves the wall clock without moving the monotonic counter.
void jumpWallClockNs(std::int64_t by_ns);

/// A choice of the schedule, for simulated worlds: 0 <= result < bound, from the seed.
[[nodiscard]] std::uint64_t choose(std::uint64_t bound);

}  // namespace spacekeep::rt
