// Thread safety: call from the thread of the test.
//
// One schedule of the deterministic runtime, for tests that need its report or exact times.
#pragma once

#include <functional>
#include <string>

#include "support/runtime/simulation.h"

namespace spacekeep {

/// Runs `body` once and fails the test unless it finished and left nothing behind.
rt::ScheduleReport runOneSchedule(const rt::ScheduleOptions& options,
                                  const std::function<void()>& body);

/// `strategy:seed` or `pct:seed:expected steps`, as SPACEKEEP_SCHEDULE takes it.
[[nodiscard]] std::string scheduleName(const rt::ScheduleOptions& options);

/// The options of such a name; the seed is 0 when the name is none.
[[nodiscard]] rt::ScheduleOptions scheduleNamed(const std::string& name);

}  // namespace spacekeep
