// Thread safety: ServiceHost and Cancellation may be used from any thread. A Service's handlers are
// called from worker threads; see ServiceOptions::handlers for how many at once.
//
// To be a service: a process that owns data it can give up. Derive from Service, override what the
// data needs, and hand the object to a ServiceHost, which speaks with the daemon.
#pragma once

#include <spacekeep/client.h>
#include <spacekeep/error.h>
#include <spacekeep/value.h>

#include <sys/types.h>

#include <chrono>  // tidy-allow: durations only, no clock is read
#include <cstddef>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <vector>

namespace spacekeep::sdk {

/// Tells a running handler that its work is not wanted any more: the daemon asked for it, or is
/// gone, or the host stops. Copies share one state. Once cancelled, always cancelled.
class Cancellation {
 public:
  Cancellation();

  [[nodiscard]] bool cancelled() const;
  /// Waits until cancelled, at most that long; answers cancelled(). A sleep that a cancel ends.
  bool waitFor(std::chrono::milliseconds duration) const;
  /// Also for tests of a service's own handlers.
  void cancel() const;

 private:
  struct State;
  std::shared_ptr<State> state_;
};

/// One request to a service.
struct Job {
  std::string volume;  ///< the mount point that the request concerns; empty when it names none
  std::uint64_t amount = 0;  ///< purge: the bytes asked for. Giving more than this costs cached
                             ///< data for nothing.
  int urgency = 0;           ///< 1, give what nobody will miss, to 4, give all that can be given
  Dictionary info;           ///< the whole request
  Cancellation cancellation;
};

/// A service's answer.
struct Answer {
  std::uint64_t amount = 0;  ///< purge, periodic: bytes freed; purgeable: bytes that could be freed
  Dictionary more;           ///< further keys; "SPACEKEEP_AMOUNT" in here is overruled by `amount`
};

/// The data's owner. Every handler has a default, so override only what applies. A handler that
/// throws is answered to the daemon as a failed call; the host goes on.
class Service {
 public:
  virtual ~Service() = default;

  /// How much could be freed on job.volume at job.urgency. Be quick: the daemon waits a few
  /// seconds.
  [[nodiscard]] virtual Answer purgeable(const Job& job);
  /// Free about job.amount bytes on job.volume. Look at job.cancellation between files, and answer
  /// what was freed so far when cancelled.
  [[nodiscard]] virtual Answer purge(const Job& job);
  /// Daily upkeep. The daemon waits 15 seconds for all services together.
  [[nodiscard]] virtual Answer periodic(const Job& job);
  /// One notification that was asked for at check-in.
  virtual void notify(const std::string& name, const Value& value);
  /// No dictionary by default.
  [[nodiscard]] virtual std::optional<Dictionary> callback(const Dictionary& info);

  // These two run while other handlers run, and must return at once: while they do not, the daemon
  // takes the service for dead.
  /// After the cancellations of the running and waiting purges were set.
  virtual void cancelRequested();
  virtual void pinged();
};

enum class Handlers {
  kOneAtATime,  ///< purgeable, purge, periodic, notify and callback never overlap
  kSideBySide,  ///< each kind at most once at a time, different kinds side by side
};

enum class HostState {
  kConnecting,  ///< reaching for the daemon
  kCheckingIn,  ///< the check-in is on its way; the service already answers
  kServing,     ///< checked in, or listening at the handed-over socket
  kRefused,     ///< the daemon does not take this ID at run time: a descriptor file declares it
  kWaiting,     ///< pausing before the next try
  kStopped,     ///< by stop(), by idleness, or for good by a failure; nothing follows
};
[[nodiscard]] const char* textOf(HostState state);

struct HostStatus {
  HostState state = HostState::kConnecting;
  std::string text;  ///< for a person: why, and what to do about it; may be empty
};

struct ServiceOptions {
  Handlers handlers = Handlers::kOneAtATime;
  /// Each change of state, in order, on a worker thread; one call at a time.
  std::function<void(const HostStatus&)> on_status;
};

/// For a service that makes itself known while it runs. Its user needs "SERVICE_ENTITLEMENT".
struct CheckInOptions : ServiceOptions {
  /// Left as it is, the environment variable SPACEKEEP_SOCKET names another one, for tests.
  std::string socket_path = kDefaultSocketPath;
  bool does_purge = true;
  bool does_periodic = false;
  std::vector<std::string> notifications;  ///< names of the notifications wanted
  /// After this long without an answer to the check-in, on_status says so. The host goes on
  /// waiting, because the daemon may still be about to ping.
  std::chrono::milliseconds patience{10'000};
};

/// For a service that a descriptor file declares and the service manager starts.
struct SocketOptions : ServiceOptions {
  /// A listening unix stream socket, which becomes the host's. None: the one that the service
  /// manager handed over (sd_listen_fds(3): LISTEN_PID, LISTEN_FDS).
  std::optional<int> listening_fd;
  /// Besides root, the account "_spacekeep" of the installed daemon, and the process's own user.
  std::optional<uid_t> allowed_uid;
  /// Stop once nothing has been asked for this long. None: never.
  std::optional<std::chrono::milliseconds> stop_when_idle;
};

/// Serves one Service until it is stopped.
class ServiceHost {
 public:
  /// Checks in under `id`, and again whenever the daemon went away, with a growing, randomised
  /// pause of 0.1 to 30 seconds. Returns at once; fails only for an empty ID or a missing service.
  [[nodiscard]] static Result<ServiceHost> checkIn(std::string id, std::shared_ptr<Service> service,
                                                   CheckInOptions options = {});
  /// Serves at a listening socket. Fails when there is no usable socket.
  [[nodiscard]] static Result<ServiceHost> serveSocket(std::shared_ptr<Service> service,
                                                       SocketOptions options = {});

  ServiceHost(ServiceHost&&) noexcept;
  ServiceHost& operator=(ServiceHost&&) noexcept;
  /// stop(), then waits for the handlers that still run. Not from a handler.
  ~ServiceHost();

  [[nodiscard]] HostStatus status() const;
  /// Cancels what runs and lets the serving end; returns at once. Safe to repeat, and from
  /// handlers.
  void stop();
  /// Until the state is kStopped. What a service's main() does after starting.
  void waitUntilStopped();

 private:
  class Impl;
  explicit ServiceHost(std::unique_ptr<Impl> impl);
  std::unique_ptr<Impl> impl_;
};

}  // namespace spacekeep::sdk
