// Thread safety: plain values; SystemStory refers to the run it was made from.
//
// What the trace of a whole-system run says, put in order: lives, calls of clients, queries, pings,
// check-ins. A position is an index into the events of one life.
#pragma once

#include <cstddef>
#include <cstdint>
#include <map>
#include <optional>
#include <set>
#include <span>
#include <string>
#include <string_view>
#include <vector>

#include "sim/invariants/purge_story.h"
#include "sim/scenarios/system_run.h"

namespace spacekeep::sim {

/// A call of a client, from its arrival to whatever came of it.
struct Call {
  std::uint64_t number = 0;
  std::string member;
  std::string client;
  std::vector<std::string> rights;
  std::string text;  ///< a key, a service ID
  std::optional<Dictionary> info;
  std::optional<Value> value;
  std::size_t asked_at = 0;
  std::vector<std::size_t> answers_at;
  std::optional<Dictionary> answer;  ///< the first one's
  std::optional<Value> result;
  std::size_t refused_at = kNowhere;
  std::string error;
  std::size_t dropped_at = kNowhere;

  [[nodiscard]] bool holds(std::string_view right) const;
  [[nodiscard]] std::size_t answeredAt() const {
    return answers_at.empty() ? kNowhere : answers_at.front();
  }
  [[nodiscard]] std::size_t endedAt() const;
};

/// One look of a query at the record of recent answers.
struct RecordRead {
  std::size_t at = kNowhere;  ///< "servicesToCount"
  unsigned thread = 0;
  Dictionary to_count;
  std::vector<std::string> to_query;
};

struct Query {
  unsigned thread = 0;
  std::size_t begin_at = 0;
  Dictionary request;
  RecordRead first;
  std::vector<std::string> added;  ///< to the in-flight set
  std::size_t waiting_at = kNowhere;
  std::size_t waited_at = kNowhere;
  std::uint64_t ticks = 0;
  std::vector<std::uint64_t> extensions;
  bool beat_the_timeout = false;
  RecordRead second;
  std::size_t end_at = kNowhere;
  double seconds = 0;
  Dictionary result;
};

/// The registry waits for a service to answer its ping.
struct PingWait {
  std::size_t from = 0;
  std::size_t to = kNowhere;
};

/// What a descriptor file makes of a service.
struct Declared {
  bool purges = false;
  bool periodic = false;
  bool do_not_query = false;
  std::set<std::string> notifications;
};

struct Life {
  unsigned number = 0;
  const LifeOfDaemon* facts = nullptr;
  std::span<const Event> events;
  bool cut = false;           ///< killed, or standing still: what was begun may lack its end
  bool stands_still = false;  ///< on a silent ping
  std::vector<Call> calls;
  std::vector<Query> queries;
  std::vector<PingWait> pings;
  std::map<std::uint64_t, std::size_t> asked_at;  ///< of calls of services
  std::optional<PurgeStory> purges;

  [[nodiscard]] std::uint64_t timeAt(std::size_t at) const { return events[at].at_ns; }
  [[nodiscard]] std::int64_t wallAt(std::size_t at) const;
  /// The first and the last position of the same moment.
  [[nodiscard]] std::size_t firstOfMoment(std::size_t at) const;
  [[nodiscard]] std::size_t lastOfMoment(std::size_t at) const;
  /// Whether the registry waited for a ping at some position from `first` to `last`.
  [[nodiscard]] bool registryWaited(std::size_t first, std::size_t last) const;
  /// How long writes to the disk may hold up whoever needs the client state in that span.
  [[nodiscard]] std::uint64_t writingNs(const SystemPlan& plan, std::size_t first,
                                        std::size_t last) const;
  template <class Body>
  [[nodiscard]] const Body* as(std::size_t at) const {
    return std::get_if<Body>(&events[at].body);
  }
};

struct SystemStory {
  explicit SystemStory(const SystemRun& run);
  SystemStory(const SystemStory&) = delete;
  SystemStory& operator=(const SystemStory&) = delete;

  const SystemRun& run;
  std::map<std::string, Declared> declared;
  std::set<std::string> declared_twice;  ///< which of the two holds is left open here
  std::set<std::string> volumes;
  std::vector<Life> lives;
  std::vector<std::string> oddities;

  [[nodiscard]] bool isKnownVolume(const std::optional<Dictionary>& info) const;
};

/// "clientPurge #12 of app-1"
[[nodiscard]] std::string nameOf(const Call& call);
[[nodiscard]] bool isQueryMember(std::string_view member);
/// Requests of the low-space handling, unless a client writes the very same one.
[[nodiscard]] bool isLowSpacePurge(const Dictionary& request);
/// As the request asks for it: 1 to 4, else 3.
[[nodiscard]] std::int32_t urgencyLimitIn(const Dictionary& request);

}  // namespace spacekeep::sim
