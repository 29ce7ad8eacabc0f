#include "sdk/client_link.h"

#include <fmt/core.h>

#include <algorithm>
#include <optional>
#include <utility>
#include <vector>

#include "client/history_protocol.h"
#include "sdk/deadline_timer.h"
#include "sdk/failure.h"
#include "support/ipc/linux/connector.h"
#include "support/runtime/locks.h"

namespace spacekeep::sdk {
namespace {

/// On a busy machine a killed daemon's sockets close long before its process is gone. A program would
/// take the wrong answer for a missing right and give up, which is worse than to be told late.
constexpr std::uint64_t kDeathOfTheDaemonNs = 2'000'000'000;

}  // namespace

/// What the link shares with handlers that may run while it is being destroyed.
struct ClientLink::Shared {
  explicit Shared(ClientOptions given) : options(std::move(given)) {}

  const ClientOptions options;
  TaskGroup pending;  ///< calls, and the disconnect handler, that have not run to their end
  mutable rt::Mutex mutex;
  // Protected by mutex.
  bool answered = false;  ///< the daemon has answered a call of this connection
  bool ended = false;
  bool turned_away = false;  ///< ended by a daemon that lives and has never answered anything
  bool closing = false;      ///< by this side
  std::vector<std::function<void()>> waiting_for_end;

  void noteAnswer() {
    const std::scoped_lock lock(mutex);
    answered = true;
  }

  void noteEnd(bool daemon_lives) {
    std::vector<std::function<void()>> explanations;
    bool tell = false;
    {
      const std::scoped_lock lock(mutex);
      ended = true;
      turned_away = daemon_lives && !answered && !closing;
      tell = !closing && options.on_disconnect;
      explanations.swap(waiting_for_end);
    }
    for (const auto& explanation : explanations) explanation();
    if (tell) options.on_disconnect();
  }

  /// Runs `fail` with the error, later if the connection has ended and why is not known yet: the
  /// daemon turns a peer away by closing, which looks like any other disconnect until its process is
  /// found to live. A person needs to hear of the missing right.
  void explain(Error error, bool at_end, std::function<void(Error)> fail) {
    {
      const std::scoped_lock lock(mutex);
      if (error.kind == ErrorKind::kDisconnected && at_end && !answered && !closing) {
        if (!ended) {
          waiting_for_end.emplace_back(
              [this, error = std::move(error), fail = std::move(fail)] { fail(explained(error)); });
          return;
        }
        error = explained(error);
      }
    }
    fail(std::move(error));
  }

 private:
  /// Only once the connection has ended.
  [[nodiscard]] Error explained(const Error& error) const {
    if (!turned_away) return error;
    return {ErrorKind::kNotAllowed,
            fmt::format("the daemon at {} closed the connection without an answer; it does so when "
                        "this user does not hold \"CLIENT_ENTITLEMENT\"",
                        options.socket_path)};
  }
};

class ClientLink::Call {
 public:
  Call(std::shared_ptr<Shared> shared, EndHandler on_end)
      : shared_(std::move(shared)), on_end_(std::move(on_end)) {
    shared_->pending.enter();
  }

  void setTimer(std::unique_ptr<DeadlineTimer> timer) {
    const std::scoped_lock lock(mutex_);
    if (on_end_) timer_ = std::move(timer);
  }

  /// The first end counts. Runs the program's handler, so never on the IPC thread.
  void end(End how) {
    EndHandler on_end;
    std::unique_ptr<DeadlineTimer> timer;
    {
      const std::scoped_lock lock(mutex_);
      on_end = std::exchange(on_end_, nullptr);
      timer = std::move(timer_);
    }
    if (!on_end) return;
    timer.reset();
    on_end(std::move(how));
    on_end = nullptr;  // what the handler holds is gone before the link may be
    shared_->pending.leave();
  }

 private:
  const std::shared_ptr<Shared> shared_;
  rt::Mutex mutex_;
  // Protected by mutex_.
  EndHandler on_end_;
  std::unique_ptr<DeadlineTimer> timer_;
};

ClientLink::ClientLink(ClientOptions options)
    : shared_(std::make_shared<Shared>(std::move(options))) {}

Result<std::unique_ptr<ClientLink>> ClientLink::open(ClientOptions options) {
  std::unique_ptr<ClientLink> link(new ClientLink(std::move(options)));
  const std::string& path = link->shared_->options.socket_path;
  std::string why;
  ipc::ConnectionLimits limits;
  limits.peer_death_ns = kDeathOfTheDaemonNs;
  link->connection_ =
      ipc::connectToPath(link->engine_.loop, link->engine_.queue, path, why, limits);
  if (!link->connection_) {
    return Error{ErrorKind::kUnreachable,
                 fmt::format("cannot connect to the daemon at {}: {}", path, why)};
  }
  link->connection_->setRemoteInterface(spacekeepClientInterfaces());
  link->connection_->setInvalidationHandler([shared = link->shared_] { shared->noteEnd(true); });
  link->connection_->setInterruptionHandler([shared = link->shared_] { shared->noteEnd(false); });
  link->connection_->resume();
  return link;
}

ClientLink::~ClientLink() {
  if (!connection_) return;
  {
    const std::scoped_lock lock(shared_->mutex);
    shared_->closing = true;
  }
  connection_->invalidate();
  shared_->pending.wait();
}

bool ClientLink::connected() const {
  const std::scoped_lock lock(shared_->mutex);
  return !shared_->ended && !shared_->closing;
}

void ClientLink::call(const std::string& member, ipc::Arguments arguments, Deadline deadline,
                      EndHandler on_end) {
  const auto call = std::make_shared<Call>(shared_, std::move(on_end));
  const auto on_error = [call, member, shared = shared_,
                         weak = std::weak_ptr(connection_)](const ipc::Error& e) {
    // An answer of the daemon's may be called what it likes: the connection goes on.
    const auto connection = weak.lock();
    const bool at_end = connection == nullptr || connection->ended();
    shared->explain(failureOf(e, member), at_end,
                    [call](Error error) { call->end(std::move(error)); });
  };
  const auto proxy = connection_->remoteProxy(on_error);
  proxy->call(member, std::move(arguments), [call, shared = shared_](ipc::Arguments out) {
    shared->noteAnswer();
    call->end(std::move(out));
  });
  if (!deadline) return;
  const auto wait_ns = static_cast<std::uint64_t>(std::max<std::int64_t>(
      0, std::chrono::duration_cast<std::chrono::nanoseconds>(*deadline).count()));
  call->setTimer(std::make_unique<DeadlineTimer>(engine_.loop, wait_ns, [call, member, this] {
    engine_.queue.async([call, member] {
      call->end(
          Error{ErrorKind::kTimedOut, fmt::format("no answer to {} before the deadline", member)});
    });
  }));
}

}  // namespace spacekeep::sdk
