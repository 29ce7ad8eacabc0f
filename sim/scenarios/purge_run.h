// Thread safety: one run at a time in a process.
//
// Plays one purge scenario against the daemon's own code in the deterministic runtime.
#pragma once

#include <cstdint>
#include <map>
#include <set>
#include <string>
#include <vector>

#include "sim/scenarios/purge_scenario.h"
#include "sim/world/trace.h"
#include "support/runtime/simulation.h"

namespace spacekeep::sim {

/// One run, for the invariants to judge. The trace ends before the world is taken down.
struct PurgeRun {
  PurgeScenario scenario;
  rt::ScheduleReport report;
  std::vector<Event> events;
  std::map<std::uint64_t, unsigned> answers;         ///< of each call of a client, by its number
  std::map<std::string, std::uint64_t> asked_twice;  ///< as the services counted it
};

/// Random and PCT schedules take turns.
[[nodiscard]] rt::ScheduleOptions scheduleFor(std::uint64_t seed);
[[nodiscard]] PurgeRun playPurgeScenario(PurgeScenario scenario,
                                         const rt::ScheduleOptions& options);
/// The scenario and the schedule of that seed.
[[nodiscard]] PurgeRun runPurgeScenario(std::uint64_t seed);

}  // namespace spacekeep::sim
