// Thread safety: plain values; PurgeStory refers to the events it was made from.
//
// What a trace says about purges, put in order: operations with their urgencies, share
// computations, replies and failures. A position is an index into the events of the run.
#pragma once

#include <cstddef>
#include <cstdint>
#include <map>
#include <optional>
#include <set>
#include <span>
#include <string>
#include <utility>
#include <vector>

#include "sim/scenarios/purge_run.h"
#include "sim/world/trace.h"

namespace spacekeep::sim {

inline constexpr std::size_t kNowhere = SIZE_MAX;

/// What purges are read from: a run of a purge scenario, or one life of the whole daemon.
struct PurgeView {
  std::span<const Event> events;
  const PurgeScenario* scenario = nullptr;  ///< null in a life of the whole daemon
  rt::ScheduleEnd end = rt::ScheduleEnd::kFinished;
  std::vector<std::string> blocked;
  std::vector<std::string> service_ids;
  std::map<std::string, std::uint64_t> asked_twice;  ///< as the services counted it
  bool cut = false;  ///< the process was killed, or stands still: what was begun may lack its end
  /// In a life of the whole daemon: requests that do not say it may end as soon as they can.
  bool may_finish_early_by_default = false;
  /// A write to the disk takes that long, and may keep the thread busy that a purge needs next.
  std::uint64_t disk_write_ns = 0;
};

[[nodiscard]] PurgeView viewOf(const PurgeRun& run);

/// A line "donation (...) = ...".
struct Share {
  std::size_t at = 0;
  std::uint64_t donation = 0;
  std::uint64_t needed = 0;
  std::uint64_t purged = 0;
  std::uint64_t divisor = 0;
};

/// One share computation, from "queuing service" to its last line.
struct ShareTask {
  std::size_t at = 0;
  std::size_t last_at = 0;
  unsigned thread = 0;
  std::string service;
  std::optional<Share> share;
  std::size_t adding_at = kNowhere;
  bool added = false;
  unsigned queue = 0;      ///< on which it is computed
  unsigned set_queue = 0;  ///< that of the in-flight set, if it got so far
  std::size_t operation = kNowhere;
};

/// One booked reply.
struct Reply {
  std::size_t booked_at = 0;  ///< "service purged"
  unsigned thread = 0;
  std::string service;
  std::uint64_t amount = 0;
  std::uint64_t call = 0;                          ///< 0 until the answer names it
  std::optional<std::uint64_t> logged_donation{};  ///< "donated ... of ..."
  std::uint64_t donation = 0;
  std::int32_t urgency = 0;
  std::size_t completion_at = kNowhere;
  std::size_t removing_at = kNowhere;
  unsigned removals = 0;
  unsigned signals = 0;
  std::size_t signalled_at = kNowhere;
  std::size_t done_at = kNowhere;    ///< "took ... seconds"
  unsigned set_queue = 0;            ///< that of the in-flight set it left
  std::size_t operation = kNowhere;  ///< kNowhere: cut off before it was told
};

/// A failed connection, as a purge noted it.
struct Failure {
  std::size_t at = 0;
  std::string service;  ///< empty until its removal names it
  std::size_t removing_at = kNowhere;
  unsigned set_queue = 0;
  std::size_t operation = kNowhere;
};

/// One purge call that reached a service.
struct PurgeCall {
  std::uint64_t number = 0;
  std::string service;
  std::uint64_t amount = 0;
  std::int32_t urgency = 0;
  std::size_t asked_at = 0;
  std::size_t ended_at = kNowhere;
  bool failed = false;
  /// Whose request it looks like. Purges of the low-space handling name nothing but volume and free
  /// space, so there may be several.
  std::vector<std::size_t> alike;
  std::size_t operation = kNowhere;
};

/// One urgency.
struct Pass {
  std::int32_t urgency = 0;
  std::size_t begin_at = 0;         ///< "IN QUEUE"
  std::size_t asked_at = kNowhere;  ///< "Urgency: %d"
  std::size_t waiting_at = kNowhere;
  std::uint64_t wait_seconds = 0;
  std::size_t timed_out_at = kNowhere;
  std::size_t stats_at = kNowhere;
};

struct Operation {
  std::string token;
  Dictionary request;
  std::uint64_t needed = 0;
  std::int32_t limit = 0;
  unsigned thread = 0;
  std::size_t before_begin_at = 0;       ///< what its thread did last before that
  std::size_t begin_at = 0;              ///< "urgencyLimit: ..."
  std::size_t measured_at = kNowhere;    ///< the statistic of the elapsed time
  std::size_t cancelling_at = kNowhere;  ///< "cancelling purge"
  std::size_t end_at = kNowhere;         ///< "result"
  Dictionary outcome;
  std::uint64_t free_at_begin = 0;  ///< what the volume showed
  std::vector<Pass> passes;
  std::set<std::string> services;  ///< those that were offered a share
};

struct PurgeStory {
  explicit PurgeStory(PurgeView view);
  explicit PurgeStory(const PurgeRun& whole) : PurgeStory(viewOf(whole)) {}

  const PurgeView run;
  std::vector<Operation> operations;
  std::vector<ShareTask> tasks;
  std::vector<Reply> replies;
  std::vector<Failure> failures;
  std::vector<PurgeCall> calls;
  std::vector<std::string> oddities;  ///< lines that stand where they cannot be

  [[nodiscard]] std::uint64_t timeAt(std::size_t at) const { return run.events[at].at_ns; }
  /// Of a purge call of a service; kNowhere when that number is none.
  [[nodiscard]] std::size_t operationOfCall(std::uint64_t number) const;
  /// Every value that the volume's free space had from `first` to `last`.
  [[nodiscard]] std::vector<std::uint64_t> freeBetween(const std::string& volume, std::size_t first,
                                                       std::size_t last) const;
  /// Whether the operation had freed `bytes` at some moment from `first` to `last`.
  [[nodiscard]] bool hadFreed(const Operation& operation, std::uint64_t bytes, std::size_t first,
                              std::size_t last) const;
  /// Whether it had freed what it needs, likewise.
  [[nodiscard]] bool hadReached(const Operation& operation, std::size_t first,
                                std::size_t last) const;
  /// Successful additions less removals of the service before `at`.
  [[nodiscard]] int inFlightBefore(std::size_t operation, const std::string& service,
                                   std::size_t at) const;
  /// Whether nobody was in flight at some moment from `first` to `last`. A service that was added
  /// with a share of 0 has nothing to answer; `asked_only` leaves those out.
  [[nodiscard]] bool wasIdle(std::size_t operation, std::size_t first, std::size_t last,
                             bool asked_only) const;
  /// Whether nobody was in flight at any moment from just after `first` to `last`.
  [[nodiscard]] bool staysIdle(std::size_t operation, std::size_t first, std::size_t last) const;
  /// The fewest and the most in flight from `first` to `last`.
  [[nodiscard]] std::pair<int, int> inFlightBetween(std::size_t operation, std::size_t first,
                                                    std::size_t last) const;
  /// Whether each of its services was offered a share by the end of the run: a purge may end while
  /// its offers are still being computed, and the process be killed before they are.
  [[nodiscard]] bool namedAllServices(const Operation& operation) const;
  /// How long writes to the disk may hold up a purge in that span.
  [[nodiscard]] std::uint64_t writingNs(std::size_t first, std::size_t last) const;
  [[nodiscard]] std::string name(const Operation& operation) const;
  /// Asked for by the request, or by the client state for requests that say nothing.
  [[nodiscard]] bool mayFinishEarly(const Operation& operation) const;

 private:
  /// By how many the in-flight set grows or shrinks, by position.
  [[nodiscard]] std::map<std::size_t, int> flightChanges(std::size_t operation,
                                                         bool asked_only) const;
};

/// Whether the operation named what it is about as `request` does: token, volume and free space.
[[nodiscard]] bool isRequestOf(const Operation& operation, const Dictionary& request);

/// A reply that met its share is followed by another offer.
[[nodiscard]] inline bool metItsShare(const Reply& reply) { return reply.amount >= reply.donation; }

}  // namespace spacekeep::sim
