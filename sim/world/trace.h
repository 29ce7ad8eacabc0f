// Thread safety: every member of Trace may be called from any thread; events are plain values.
//
// What happened in a simulated world, in one order: log lines, calls, answers, free space,
// statistics. Invariants are judged on this record alone, after the run.
#pragma once

#include <cstdint>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <variant>
#include <vector>

#include "support/queues/serial_queue.h"
#include "support/runtime/runtime.h"
#include "support/values/value.h"

namespace spacekeep::sim {

/// An argument of a log line; a null object is std::monostate.
using LogField =
    std::variant<std::monostate, std::int64_t, std::uint64_t, double, std::string, Value>;

/// One line that went through gMOLogWrite. The first of `fields` is the name of the reporting
/// operation.
struct LogLine {
  std::int32_t level = 0;
  std::string format;
  std::vector<LogField> fields;
};

/// A service received a call. `token` is the text form of the request's "SPACEKEEP_TOKEN".
struct ServiceAsked {
  std::string service{};
  std::string member{};
  std::uint64_t call = 0;  ///< names the call, unique within the world
  std::int32_t urgency = 0;
  std::optional<std::uint64_t> amount{};
  std::string token{};
  Dictionary info{};  ///< of members that take one; of "serviceNotify" the notification
};

/// A service sent its answer. `amount` is what it reported, if that was a number.
struct ServiceAnswered {
  std::string service{};
  std::string member{};
  std::uint64_t call = 0;
  std::optional<std::uint64_t> amount{};
  std::uint64_t freed = 0;
  Dictionary answer{};
};

/// A call ended without an answer because its connection failed.
struct ServiceCallFailed {
  std::string service{};
  std::string member{};
  std::uint64_t call = 0;
};

/// The free space of a volume, after it changed or was set up.
struct FreeSpaceIs {
  std::string volume{};
  std::uint64_t free = 0;
};

struct StatisticSent {
  enum class Kind { kDistribution, kReport };
  Kind kind = Kind::kReport;
  std::string domain{};
  std::string key{};
  double value = 0;        ///< of a distribution
  std::int64_t count = 0;  ///< of a report
};

/// The daemon looked at the free space of a volume.
struct FreeSpaceLooked {
  std::string volume{};
  std::uint64_t free = 0;
};

struct ClientAsked {
  std::uint64_t call = 0;
  std::string member{};
  std::optional<Dictionary> info{};
  std::string client{};
  std::vector<std::string> rights{};  ///< sorted
  std::string text{};                 ///< the first string of the arguments: a key, a service ID
  std::optional<Value> value{};       ///< to be set
};

struct ClientAnswered {
  std::uint64_t call = 0;
  std::string member{};
  std::optional<Dictionary> answer{};  ///< the first dictionary of the answer, if it holds one
  std::optional<Value> value{};        ///< the first value of the answer, if it holds one
};

/// A call was refused with an error.
struct ClientRefused {
  std::uint64_t call = 0;
  std::string member{};
  std::string error{};
};

/// The daemon let go of a call and never answers it.
struct ClientDropped {
  std::uint64_t call = 0;
  std::string member{};
};

struct LifeBegan {
  unsigned life = 0;
  std::int64_t wall_clock_ns = 0;  ///< since 1970; runs with `at_ns` except where it jumps
};

struct LifeEnded {
  unsigned life = 0;
  bool killed = false;
};

struct ClockJumped {
  std::int64_t by_ns = 0;
};

/// The disk has confirmed a write of a preferences suite, or refused it.
struct DiskWritten {
  std::string suite{};
  Dictionary contents{};  ///< all of it, as it now stands
};

struct DiskRefused {
  std::string suite{};
  std::string reason{};
};

/// An event of the file-system stream was sent.
struct StreamEventSent {
  Dictionary event{};
  std::vector<std::string> low_volumes{};  ///< at that moment
};

/// The handling of a stream event or of the daily activity began or ended.
struct KeepAliveIs {
  std::int64_t open = 0;  ///< transactions
};

struct ActivityRan {
  std::int32_t state = 0;  ///< as in ActivityState
  std::vector<std::string> local_volumes{};
};

/// Something that a scenario did to the world, in words.
struct WorldChanged {
  std::string what{};
};

using EventBody =
    std::variant<LogLine, ServiceAsked, ServiceAnswered, ServiceCallFailed, FreeSpaceIs,
                 StatisticSent, ClientAsked, ClientAnswered, WorldChanged, FreeSpaceLooked,
                 ClientRefused, ClientDropped, LifeBegan, LifeEnded, ClockJumped, DiskWritten,
                 DiskRefused, StreamEventSent, KeepAliveIs, ActivityRan>;

struct Event {
  std::uint64_t at_ns = 0;  ///< since the trace was made
  unsigned thread = 0;      ///< which thread it happened on; a number is reused after its thread
  EventBody body;
  /// In a task of which serial queue, the innermost one, counted as they come up; 0: in none. A
  /// number is not used again, so it tells apart what looks alike.
  unsigned queue = 0;
};

/// Where a trace goes on that was begun by an earlier one, and when it takes nothing any more.
struct TraceStart {
  std::uint64_t at_ns = 0;
  std::uint64_t last_call = 0;
  bool (*is_over)() = nullptr;  ///< null: never
};

class Trace {
 public:
  Trace() : Trace(TraceStart{}) {}
  explicit Trace(TraceStart start);

  /// Adds nothing once it is over.
  void add(EventBody body);
  [[nodiscard]] std::vector<Event> events() const;
  /// Moves the record out and leaves an empty one.
  [[nodiscard]] std::vector<Event> take();
  /// A number that was not given out before, from 1.
  [[nodiscard]] std::uint64_t nextCall();
  [[nodiscard]] std::uint64_t nowNs() const;

  /// The filled texts of the log lines with exactly this format.
  [[nodiscard]] std::vector<std::string> linesWithFormat(std::string_view format) const;
  /// The filled texts of all log lines of this level.
  [[nodiscard]] std::vector<std::string> linesOfLevel(std::int32_t level) const;
  [[nodiscard]] bool hasLine(std::string_view filled_text) const;

 private:
  [[nodiscard]] unsigned queueNumber();  // with mutex_ held

  const std::uint64_t start_ticks_;
  const std::uint64_t start_ns_;
  bool (*const is_over_)();
  mutable rt::Mutex mutex_;
  // Protected by mutex_.
  std::vector<Event> events_;
  std::map<const void*, unsigned> threads_;
  // Kept as references that hold nothing, so that no other queue can come to stand in its place.
  std::map<std::weak_ptr<const SerialQueue>, unsigned, std::owner_less<>> queues_;
  std::uint64_t last_call_;
};

/// The line as a person reads it.
[[nodiscard]] std::string textOfLine(const LogLine& line);
/// One event on one line, with its time in seconds.
[[nodiscard]] std::string textOfEvent(const Event& event);

}  // namespace spacekeep::sim
