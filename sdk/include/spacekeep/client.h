// Thread safety: every member of Client may be called from any thread, also from its own handlers.
//
// To be a client of the Spacekeep daemon: ask for space, ask how much could be had, read and set
// the daemon's client state. One Client is one connection; requests on it run side by side.
#pragma once

#include <spacekeep/error.h>
#include <spacekeep/value.h>

#include <chrono>  // tidy-allow: durations only, no clock is read
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>

namespace spacekeep::sdk {

inline constexpr const char* kDefaultSocketPath = "/run/spacekeep/spacekeep.sock";

struct ClientOptions {
  std::string socket_path = kDefaultSocketPath;
  /// Runs once, on a worker thread, when the connection has ended and the Client still lives.
  std::function<void()> on_disconnect;
};

/// A request to free space. What is left empty is not sent, and the daemon's default holds.
struct PurgeRequest {
  std::string volume;          ///< mount point of a local volume
  std::uint64_t amount = 0;    ///< bytes to free
  std::optional<int> urgency;  ///< highest urgency used, 1 to 4; default 3
  std::optional<std::uint64_t>
      timeout_seconds;         ///< wait per urgency; default 2 x urgency, at most 300
  std::optional<Value> token;  ///< names the purge in a cancel request
  std::optional<bool>
      finish_early;  ///< end once the amount is reached and nobody is being waited for

  /// The request dictionary as the daemon reads it.
  [[nodiscard]] Dictionary info() const;
};

/// Which entries of the daemon's history are wanted. What is left empty is not sent, and the
/// daemon's default holds.
struct HistoryRequest {
  std::optional<std::uint64_t> before;  ///< entries with a smaller number; default: the newest
  std::optional<std::uint64_t> limit;   ///< most entries, 1 to 1000; default 100
  std::optional<std::string> volume;    ///< only of this one; default: of all

  /// The request dictionary as the daemon reads it.
  [[nodiscard]] Dictionary info() const;
};

/// The answer to a request. Exactly one of three: an outcome, a refusal (neither is set), an error.
struct Reply {
  std::optional<Dictionary> outcome;
  std::optional<Error> error;

  /// The daemon answered with nothing at all: this process has not the right, or the request names
  /// no local volume. The daemon's log tells which.
  [[nodiscard]] bool refused() const { return !outcome && !error; }
};

/// The answer to an operation that gives nothing back.
struct Status {
  std::optional<Error> error;

  [[nodiscard]] bool ok() const { return !error; }
};

/// The answer to a read of the client state: the value (none when the key has none), or an error.
struct StateReply {
  std::optional<Value> value;
  std::optional<Error> error;
};

/// The operations that take a request dictionary and answer with one.
enum class Operation { kPurge, kPurgeableSpace, kItemizedPurgeableSpace };

/// None: wait as long as the daemon takes. A deadline ends the waiting, not the work: the daemon
/// finishes what it has begun.
using Deadline = std::optional<std::chrono::milliseconds>;

class Client {
 public:
  using ReplyHandler = std::function<void(Reply)>;
  using StatusHandler = std::function<void(Status)>;
  using StateHandler = std::function<void(StateReply)>;

  /// Opens a connection. The daemon looks at rights when it accepts ("CLIENT_ENTITLEMENT") and
  /// again for each operation, so a process without any learns it from its first call: kNotAllowed.
  [[nodiscard]] static Result<Client> connect(ClientOptions options = {});

  Client(Client&&) noexcept;
  Client& operator=(Client&&) noexcept;
  /// Ends the connection. Handlers of pending calls run with kDisconnected before this returns;
  /// from one of its own handlers, the Client must not be destroyed.
  ~Client();

  [[nodiscard]] bool connected() const;

  // Blocking.
  [[nodiscard]] Reply purge(const PurgeRequest& request, Deadline deadline = {});
  /// Any of the dictionary operations with a request made by hand.
  [[nodiscard]] Reply call(Operation operation, const Dictionary& info, Deadline deadline = {});
  /// How much the services could free: `info` names "SPACEKEEP_VOLUME". Both answers hold
  /// "SPACEKEEP_TOTAL_AVAILABLE" and the amount of each service under its ID.
  [[nodiscard]] Reply purgeableSpace(const Dictionary& info, Deadline deadline = {});
  [[nodiscard]] Reply itemizedPurgeableSpace(const Dictionary& info, Deadline deadline = {});
  /// The daemon accepts and answers every cancel request; it does not stop a purge that runs.
  [[nodiscard]] Status cancel(const Value& token, Deadline deadline = {});
  /// No value removes the key. When this answers without an error, the change is on the disk.
  [[nodiscard]] Status setState(const std::string& key, std::optional<Value> value,
                                Deadline deadline = {});
  [[nodiscard]] StateReply state(const std::string& key, Deadline deadline = {});
  /// What the daemon has done: "SPACEKEEP_ENTRIES", newest first, at most half a megabyte at once,
  /// and "SPACEKEEP_NEXT", the `before` of the older ones, when there are more. kNotSupported: the
  /// daemon is of a version without a history.
  [[nodiscard]] Reply history(const HistoryRequest& request = {}, Deadline deadline = {});

  // The same without waiting. The handler runs exactly once, on a worker thread, never from within
  // the call that set it off.
  void purgeAsync(const PurgeRequest& request, ReplyHandler handler, Deadline deadline = {});
  void callAsync(Operation operation, const Dictionary& info, ReplyHandler handler,
                 Deadline deadline = {});
  void cancelAsync(const Value& token, StatusHandler handler, Deadline deadline = {});
  void setStateAsync(const std::string& key, std::optional<Value> value, StatusHandler handler,
                     Deadline deadline = {});
  void stateAsync(const std::string& key, StateHandler handler, Deadline deadline = {});
  void historyAsync(const HistoryRequest& request, ReplyHandler handler, Deadline deadline = {});

 private:
  class Impl;
  explicit Client(std::unique_ptr<Impl> impl);
  std::unique_ptr<Impl> impl_;
};

}  // namespace spacekeep::sdk
