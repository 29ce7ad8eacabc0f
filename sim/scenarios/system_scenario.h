// Thread safety: plain values and pure functions.
//
// What happens to the whole daemon in one run, derived from a seed: a plan of small elements, each
// of which can be taken away, so that a failing plan can be made smaller.
//
// A run has one life of the daemon or several. A life ends when its clients have been served, or at
// a step of the schedule where the process is killed; the next one starts on what the disk holds.
// Killing and stopping are one thing here: the termination signal tears nothing down either.
//
// Faults that a plan may inject, because the real world does:
// - Services give less than they were asked for, exactly that, or more; report more or less than
//   they freed; answer late, in the instant of a deadline, after the operation has ended, twice,
//   without an amount, with no number, with nothing, or never. Their connection fails as a call
//   arrives or while it is worked on. They die, close their connections, start again, check in
//   again, check in with other roles, opt out, and come back with their data grown again.
// - Descriptor files that are no property lists, hold no ID, name a service twice, cannot be read.
// - Other writers take and give back space; space comes back later than the service says. Volumes
//   are reported low, one or several, also while a purge for low space runs, also with one of the
//   two flags only, with none, or with a flags word that is no number.
// - Clients without the rights that they need; requests with missing, wrong or odd keys; state of
//   every kind under every key, also under those that the daemon acts on.
// - The disk of the state store fails or is full for a while, or the store cannot be opened at a
//   start. The process is killed between any two steps, also in the middle of a write: whether a
//   write that was under way landed is open then, and what was not yet written is lost.
// - The wall clock jumps both ways, by seconds to years. The daily activity fires, also twice close
//   together, also in a state in which nothing is to be done.
//
// Faults that would be unfair, because then nothing could be promised:
// - A service that for ever claims what it did not free, in no time at all: it is asked again and
//   again until the wait runs out, and in virtual time a wait does not run out while there is work.
//   Services claim falsely a few times here and then tell the truth.
// - A monotonic clock that runs backwards, memory that runs out, threads that get no turn at all.
// - A disk that forgets what it has confirmed, or that lands a half of one write.
// - A volume whose free space is read wrong: what the volume shows is the truth here.
// - Two purges of clients that need the very same number of bytes: the log tells purges apart by it.
//
// One fault is known to block: a service that never answers its ping holds the registry, and
// with it everybody who needs that (Fault::kSilentPing; a connection that ends before the ping is
// answered is the same thing). Runs without that fault let a service die only after its check-in
// has been answered; runs with it end as SystemEnd::kSilentPing where that has come to pass.
#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <set>
#include <string>
#include <string_view>
#include <variant>
#include <vector>

#include "sim/scenarios/purge_scenario.h"
#include "sim/world/service_behaviour.h"
#include "support/events/events.h"
#include "support/values/value.h"

namespace spacekeep::sim {

/// Kinds of fault; each seed switches a random part of them on.
enum class Fault : std::uint8_t {
  kForeignWrites,     ///< other writers take and give back space
  kLateSpace,         ///< freed space comes back late
  kSlowServices,      ///< answers take long, and may come after the end
  kSilentServices,    ///< some calls are never answered (pings are)
  kLyingServices,     ///< reports differ from what was freed
  kGenerousServices,  ///< more is freed than was asked for
  kOddAnswers,        ///< answers without an amount, with text, with nothing
  kFailingCalls,      ///< the connection fails before or during a call
  kDoubleAnswers,     ///< calls are answered twice
  kDyingServices,     ///< services die or close their connections, and come back
  kSecondCheckIns,    ///< services check in again, with other roles
  kRegrownData,       ///< services own more again
  kOptOuts,           ///< answers that opt out of being asked
  kBadDescriptors,    ///< descriptor files that are not as they should be
  kMissingRights,     ///< clients without the rights they need
  kOddRequests,       ///< requests with missing, wrong or odd keys
  kFailingDisk,       ///< state cannot be written for a while, or not opened at a start
  kCrashes,           ///< the process is killed and starts again
  kClockJumps,        ///< the wall clock jumps
  kOddEvents,         ///< events without flags, activities in other states, twice at once
  kSilentPing,        ///< a service never answers its ping; rare, since everything blocks
};
inline constexpr std::size_t kFaultCount = static_cast<std::size_t>(Fault::kSilentPing) + 1;

/// As it is written, without the k: "ForeignWrites".
[[nodiscard]] std::string_view nameOf(Fault fault);

struct SystemService {
  std::string id;
  /// With a descriptor file, which holds these keys besides the ID. Else it checks in.
  std::optional<Dictionary> descriptor;
  Dictionary check_in_info;  ///< roles and notifications
  std::uint64_t check_in_after_ns = 0;
  ServiceBehaviour behaviour;
};

struct BadDescriptor {
  enum class Kind {
    kNoPropertyList,
    kNoDictionary,
    kNoId,
    kIdIsNoString,
    kUnreadable,
    kSecondOfId
  };
  Kind kind = Kind::kNoPropertyList;
  std::string file_name;  ///< in the descriptor directory
  std::string of_id;      ///< of kSecondOfId
};

/// A client calls the daemon. Calls of one client name are served as one connection's.
struct CallAction {
  std::string client;
  std::set<std::string, std::less<>> rights;  ///< besides "CLIENT_ENTITLEMENT"
  std::string member;                         ///< one of SpacekeepClientProtocol except check-in
  Dictionary info;                            ///< of queries, purges and cancels
  std::string key;                            ///< of state calls
  std::optional<Value> value;                 ///< of "clientSetState"
};

struct SpaceAction {
  std::string volume;
  std::uint64_t bytes = 0;
  bool frees = false;  ///< else somebody takes it
};

/// From now on these volumes are low; then the event is sent.
struct LowSpaceAction {
  std::vector<std::string> volumes;
  Dictionary event;
};

struct DailyAction {
  ActivityState state = ActivityState::kRun;
};

struct ClockAction {
  std::int64_t by_ns = 0;
};

/// Empty text: writes work again.
struct DiskAction {
  std::string failure;
};

struct ServiceAction {
  enum class Kind {
    kDies,
    kCloses,    ///< its connections; lives on
    kStarts,    ///< and checks in, unless it is declared
    kChecksIn,  ///< again, with `info`
    kRegrows,   ///< owns `bytes` more on `volume` at `urgency`
    kIntrudes,  ///< checks in without the right to
  };
  Kind kind = Kind::kDies;
  std::string service;
  Dictionary info;
  std::string volume;
  std::uint64_t bytes = 0;
  std::size_t urgency = 1;
};

struct PlannedAction {
  unsigned life = 0;        ///< from 0; in a life that does not come nothing happens
  std::uint64_t at_ns = 0;  ///< since that life began
  std::variant<CallAction, SpaceAction, LowSpaceAction, DailyAction, ClockAction, DiskAction,
               ServiceAction>
      what;
};

/// The n-th crash ends life n.
struct PlannedCrash {
  std::uint64_t at_step = 0;      ///< of the schedule of that life; when it ends earlier, there
  std::uint64_t down_for_ns = 0;  ///< until the next life
  bool store_refuses_to_open = false;  ///< in the next life
};

struct SystemPlan {
  std::size_t parallelism = 4;
  std::uint64_t disk_write_ns = 0;  ///< how long a write of the state takes
  std::set<Fault> faults;
  std::vector<PlannedVolume> volumes;
  std::vector<SystemService> services;
  std::vector<BadDescriptor> bad_descriptors;
  std::vector<PlannedAction> actions;
  std::vector<PlannedCrash> crashes;
};

[[nodiscard]] SystemPlan deriveSystemScenario(std::uint64_t seed);

// For making a plan smaller. Elements are services, bad descriptors, actions and crashes; what
// names an element that is gone does nothing. Volumes stay.
[[nodiscard]] std::size_t elementCount(const SystemPlan& plan);
[[nodiscard]] SystemPlan withoutElement(const SystemPlan& plan, std::size_t index);
/// One element in words, on one line.
[[nodiscard]] std::string textOfElement(const SystemPlan& plan, std::size_t index);
/// For a person, several lines.
[[nodiscard]] std::string textOf(const SystemPlan& plan);

}  // namespace spacekeep::sim
