// Thread safety: one life at a time in a process; the functions belong to the thread that plays it.
//
// One life of the daemon, played as one schedule, and what outlasts it.
#pragma once

#include <cstdint>
#include <map>
#include <string>

#include "sim/scenarios/system_run.h"
#include "sim/scenarios/system_scenario.h"

namespace spacekeep::sim {

/// The world between two lives.
struct Lasting {
  std::uint64_t now_ns = 0;  ///< on the time line of the trace
  std::int64_t wall_clock_ns = 0;
  std::uint64_t last_call = 0;                      ///< the trace's numbers of calls go on
  std::map<std::string, std::uint64_t> free_bytes;  ///< by volume
  std::map<std::string, std::map<std::string, OwnedBytes>> owns;  ///< by service and volume
  InMemoryDisk::Contents disk;
};

[[nodiscard]] Lasting lastingAtFirst(const SystemPlan& plan);

/// Plays life `number` and adds its events to the run.
void playLife(SystemRun& run, unsigned number, Lasting& lasting);

}  // namespace spacekeep::sim
