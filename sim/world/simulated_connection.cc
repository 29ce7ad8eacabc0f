#include "sim/world/simulated_connection.h"
#include "support/runtime/locks.h"

#include <utility>

namespace spacekeep::sim {
namespace {

constexpr std::string_view kPing = "servicePing";

}  // namespace

class SimulatedConnection::Proxy final : public ipc::RemoteProxy {
 public:
  Proxy(std::shared_ptr<SimulatedConnection> connection, ErrorHandler on_error)
      : connection_(std::move(connection)), on_error_(std::move(on_error)) {}

  void call(std::string_view member, ipc::Arguments arguments, ReplyHandler reply) override {
    connection_->call(member, std::move(arguments), std::move(reply), on_error_);
  }

 private:
  const std::shared_ptr<SimulatedConnection> connection_;
  const ErrorHandler on_error_;
};

SimulatedConnection::SimulatedConnection(ConcurrentQueue& global,
                                         std::shared_ptr<SimulatedService> service)
    : global_(global),
      service_(std::move(service)),
      wire_(SerialQueue::create("simulated connection", global)) {}

void SimulatedConnection::setInvalidationHandler(Handler handler) {
  const std::scoped_lock lock(mutex_);
  on_invalidation_ = std::move(handler);
}

void SimulatedConnection::setInterruptionHandler(Handler handler) {
  const std::scoped_lock lock(mutex_);
  on_interruption_ = std::move(handler);
}

void SimulatedConnection::setRemoteInterface(const ipc::InterfaceDescription& interface) {
  const std::scoped_lock lock(mutex_);
  interface_ = &interface;
}

void SimulatedConnection::resume() {
  if (service_ == nullptr) {
    end(ConnectionEnd::kInvalidated);
    return;
  }
  if (!service_->alive()) {
    end(ConnectionEnd::kInterrupted);
    return;
  }
  std::deque<std::uint64_t> held;
  {
    const std::scoped_lock lock(mutex_);
    resumed_ = true;
    held.swap(held_);
  }
  for (const std::uint64_t call : held) send(call);
}

std::shared_ptr<ipc::RemoteProxy> SimulatedConnection::remoteProxy(
    ipc::RemoteProxy::ErrorHandler on_error) {
  return std::make_shared<Proxy>(shared_from_this(), std::move(on_error));
}

void SimulatedConnection::invalidate() { end(ConnectionEnd::kInvalidated); }

void SimulatedConnection::call(std::string_view member, ipc::Arguments arguments,
                               ipc::RemoteProxy::ReplyHandler reply,
                               ipc::RemoteProxy::ErrorHandler on_error) {
  std::uint64_t number = 0;
  bool held = false;
  {
    const std::scoped_lock lock(mutex_);
    if (ended_ && member == kPing) keepPing(std::move(reply));
    if (!ended_) {
      number = ++last_call_;
      held = !resumed_;
      pending_.emplace(number, PendingCall{std::string(member), std::move(arguments),
                                           std::move(reply), on_error});
      if (held) held_.push_back(number);
    }
  }
  if (number == 0) {
    post(on_error, {"com.quorvel.Error.Disconnected", "the connection has ended"});
  } else if (!held) {
    send(number);
  }
}

void SimulatedConnection::send(std::uint64_t call) {
  wire_->async([self = shared_from_this(), call] { self->deliver(call); });
}

void SimulatedConnection::deliver(std::uint64_t call) {
  IncomingCall incoming;
  std::string member;
  {
    const std::scoped_lock lock(mutex_);
    const auto found = pending_.find(call);
    if (found == pending_.end()) return;
    member = found->second.member;
    incoming.arguments = std::move(found->second.arguments);
    if (interface_ != nullptr) incoming.method = interface_->method(member);
  }
  if (incoming.method == nullptr) {
    failCall(call, "org.freedesktop.DBus.Error.UnknownMethod", "no method " + member);
    return;
  }
  if (!ipc::matches(incoming.method->in, incoming.arguments)) {
    failCall(call, "org.freedesktop.DBus.Error.InvalidArgs", "wrong arguments for " + member);
    return;
  }
  const auto self = shared_from_this();
  incoming.connection = this;
  incoming.reply = [self, call](ipc::Arguments answer) { self->replied(call, std::move(answer)); };
  incoming.fail = [self](ConnectionEnd how) { self->end(how); };
  service_->receive(std::move(incoming));
}

void SimulatedConnection::replied(std::uint64_t call, ipc::Arguments answer) {
  ipc::RemoteProxy::ReplyHandler reply;
  {
    const std::scoped_lock lock(mutex_);
    const auto found = pending_.find(call);
    if (found == pending_.end()) return;
    reply = std::move(found->second.reply);
    pending_.erase(found);
  }
  global_.async([reply = std::move(reply), answer = std::move(answer)] { reply(answer); });
}

void SimulatedConnection::failCall(std::uint64_t call, const char* name, std::string text) {
  ipc::RemoteProxy::ErrorHandler on_error;
  {
    const std::scoped_lock lock(mutex_);
    const auto found = pending_.find(call);
    if (found == pending_.end()) return;
    on_error = std::move(found->second.on_error);
    pending_.erase(found);
  }
  post(on_error, {name, std::move(text)});
}

void SimulatedConnection::post(const ipc::RemoteProxy::ErrorHandler& on_error, ipc::Error error) {
  if (!on_error) return;
  global_.async([on_error, error = std::move(error)] { on_error(error); });
}

void SimulatedConnection::end(ConnectionEnd how) {
  std::map<std::uint64_t, PendingCall> failed;
  Handler ending;
  Handler unused;
  {
    const std::scoped_lock lock(mutex_);
    if (ended_) return;
    ended_ = true;
    failed.swap(pending_);
    held_.clear();
    const bool invalidated = how == ConnectionEnd::kInvalidated;
    ending = std::move(invalidated ? on_invalidation_ : on_interruption_);
    unused = std::move(invalidated ? on_interruption_ : on_invalidation_);
    on_invalidation_ = nullptr;
    on_interruption_ = nullptr;
  }
  if (service_ != nullptr) service_->connectionEnded(this);
  for (auto& [call, pending] : failed) {
    if (pending.member == kPing) {
      const std::scoped_lock lock(mutex_);
      keepPing(std::move(pending.reply));
    }
    post(pending.on_error, {"com.quorvel.Error.Disconnected", "the connection has ended"});
  }
  if (ending) global_.async(std::move(ending));
}

bool SimulatedConnection::ended() const {
  const std::scoped_lock lock(mutex_);
  return ended_;
}

void SimulatedConnection::keepPing(ipc::RemoteProxy::ReplyHandler reply) {
  if (abandoned_) {
    global_.async([reply = std::move(reply)] { reply({}); });
  } else {
    if (service_ != nullptr) service_->pingLost();
    lost_pings_.push_back(std::move(reply));
  }
}

void SimulatedConnection::abandon() {
  std::map<std::uint64_t, PendingCall> dropped;
  Handler invalidation;
  Handler interruption;
  const std::scoped_lock lock(mutex_);
  ended_ = true;
  abandoned_ = true;
  dropped.swap(pending_);
  held_.clear();
  invalidation = std::exchange(on_invalidation_, nullptr);
  interruption = std::exchange(on_interruption_, nullptr);
  for (auto& [call, pending] : dropped) {
    if (pending.member == kPing) keepPing(std::move(pending.reply));
  }
  for (auto& reply : lost_pings_) keepPing(std::move(reply));
  lost_pings_.clear();
}

}  // namespace spacekeep::sim
