// Thread safety: plain values and pure functions.
//
// What happens to the daemon in one purge run, derived from a seed.
//
// Faults that a scenario may inject, because the real world does:
// - A service gives less than it was asked for, exactly that, or more; it reports more or less than
//   it freed; it answers late, in the very instant of a deadline, after the purge has ended,
//   without an amount, with an amount that is no number, or never.
// - A connection fails as a call arrives or while it is being worked on, as an invalidation or as
// an
//   interruption, once or every time. A service process dies, closes its connections, starts again,
//   checks in again, checks in twice, or turns purging off at its second check-in.
// - Space comes back later than the service says. Other writers take space, also more than was
//   freed, or give some back.
// - Requests carry a bad urgency limit, an amount of 0, an amount that is no number or none, a
// volume
//   that nobody knows, a huge time limit; several clients purge at once; a client cancels.
//
// Faults that would be unfair, because then nothing could be promised:
// - A service that is silent to its ping for good, or whose connection fails before it has answered
//   it: by its description the daemon then waits for ever, and with it everybody. Pings are late
//   here, never lost.
// - A service that for ever claims what it did not free, in no time at all: it is asked again and
//   again until the wait runs out, and in virtual time a wait does not run out while there is work.
//   Services claim falsely a few times here and then tell the truth.
// - A clock that runs backwards, memory that runs out, threads that get no turn at all.
// - A volume whose free space is read wrong: what the volume shows is the truth here.
// - Two purges that need the very same number of bytes: the log tells purges apart by it.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "sim/world/service_behaviour.h"
#include "support/values/value.h"

namespace spacekeep::sim {

struct PlannedVolume {
  std::string path;
  std::uint64_t size_bytes = 0;
  std::uint64_t free_bytes = 0;
};

struct PlannedEnd {
  std::uint64_t after_ns = 0;  ///< from the start, at the earliest after its check-in was answered
  bool dies = false;           ///< else it closes its connections and lives on
  std::optional<std::uint64_t>
      returns_after_ns;  ///< it starts, and checks in where it is not declared
};

struct PlannedService {
  std::string id;
  bool declared = false;  ///< by a descriptor file, else it checks in
  bool purges = true;
  std::uint64_t check_in_after_ns = 0;
  std::optional<bool> purges_after_second_check_in;
  ServiceBehaviour behaviour;
  std::optional<PlannedEnd> end;
};

struct PlannedPurge {
  std::uint64_t after_ns = 0;
  Dictionary info;
  bool entitled = true;
  std::optional<std::uint64_t> cancelled_after_ns;  ///< from its start; cancelling changes nothing
};

struct PlannedWrite {
  std::uint64_t after_ns = 0;
  std::string volume;
  std::uint64_t bytes = 0;
  bool frees = false;
};

struct PurgeScenario {
  std::size_t parallelism = 4;
  std::vector<PlannedVolume> volumes;
  std::vector<PlannedService> services;
  std::vector<PlannedPurge> purges;
  std::vector<PlannedWrite> writes;
};

[[nodiscard]] PurgeScenario derivePurgeScenario(std::uint64_t seed);

/// For a person, several lines.
[[nodiscard]] std::string textOf(const PurgeScenario& scenario);

}  // namespace spacekeep::sim
