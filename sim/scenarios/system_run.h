// Thread safety: plain values; one run at a time in a process.
//
// Plays a plan: the whole daemon, from its start-up, in as many lives as the plan has.
#pragma once

#include <cstdint>
#include <map>
#include <optional>
#include <set>
#include <string>
#include <vector>

#include "sim/scenarios/system_scenario.h"
#include "sim/world/in_memory_preferences.h"
#include "sim/world/simulated_listener.h"
#include "sim/world/simulated_service.h"
#include "sim/world/trace.h"
#include "support/runtime/simulation.h"

namespace spacekeep::sim {

enum class SystemEnd {
  kFinished,    ///< every call has ended and nothing is left to do
  kSilentPing,  ///< the daemon waits for a ping that was never answered, as it does
  kDeadlock,    ///< somebody waits who ought not to
  kStuck,       ///< goes round in circles
};

/// A call of a client, as the trace tells of it when its life ended.
struct CallOfClient {
  unsigned life = 0;
  std::string client;
  std::string member;
  ClientCall::State state = ClientCall::State::kOpen;  ///< open: the kill came first
  unsigned answers = 0;
  std::string error;
  std::optional<Dictionary> answer;  ///< the first one, of members that answer with one
  std::optional<Value> value;        ///< of "clientGetState"
};

/// What a service saw in one life.
struct ServiceOfLife {
  std::uint64_t asked_twice = 0;  ///< by one purge at once
  std::map<std::string, OwnedBytes> owns_at_end;
};

struct LifeOfDaemon {
  rt::ScheduleReport report;
  SystemEnd end = SystemEnd::kFinished;
  bool killed = false;         ///< at a step of the schedule; else it came to its end
  std::uint64_t began_ns = 0;  ///< on the time line of the trace
  std::int64_t wall_clock_began_ns = 0;
  InMemoryDisk::Contents disk_at_start;  ///< of the daemon's suite
  InMemoryDisk::Contents disk_at_end;
  std::map<std::string, ServiceOfLife> services;
  std::int64_t keep_alive_open = 0;  ///< at the end
  bool keep_alive_went_negative = false;
  std::map<std::string, std::uint64_t> free_at_end;
};

/// One run, for the invariants to judge. The events of all lives are on one time line, between
/// LifeBegan and LifeEnded; what happens while a dead process is cleared away is not in it.
struct SystemRun {
  SystemPlan plan;
  std::uint64_t seed = 0;
  std::uint64_t schedule = 0;
  SystemEnd end = SystemEnd::kFinished;  ///< of the first life that did not finish, if any
  std::vector<std::string> blocked;      ///< who waits for what in that life
  std::vector<LifeOfDaemon> lives;
  std::vector<Event> events;
  std::map<std::uint64_t, CallOfClient> calls;  ///< by the number that the trace names
  std::uint64_t steps = 0;                      ///< of all lives
  std::uint64_t trace_hash = 0;                 ///< over schedules and events
};

/// The same plan, seed and schedule give the same run to the byte. Schedule 0 is the one that the
/// seed itself stands for; each other number is another order of events, drawn in the same way.
[[nodiscard]] SystemRun playSystem(const SystemPlan& plan, std::uint64_t seed,
                                   std::uint64_t schedule = 0);

}  // namespace spacekeep::sim
