#include "support/ipc/linux/bus_server.h"

#include <sys/socket.h>
#include <sys/un.h>

#include <atomic>
#include <cstring>
#include <map>
#include <utility>
#include <vector>

#include "support/access/linux/capture_peer_identity.h"
#include "support/ipc/linux/acceptor.h"
#include "support/ipc/linux/bus_front.h"
#include "support/ipc/linux/served_connection.h"
#include "support/ipc/linux/server_context.h"
#include "support/logging/log.h"

namespace spacekeep::ipc {

namespace {

/// As in sun_path, empty when it has no name.
std::string addressOfSocket(int fd) {
  sockaddr_un address{};
  socklen_t length = sizeof address;
  auto* generic = reinterpret_cast<sockaddr*>(&address);  // NOLINT: sockets API
  if (::getsockname(fd, generic, &length) != 0) return "";
  if (length <= offsetof(sockaddr_un, sun_path)) return "";
  return {address.sun_path, ::strnlen(address.sun_path, length - offsetof(sockaddr_un, sun_path))};
}

}  // namespace

// Everything but `open` is confined to the IPC thread.
struct BusServer::State : public std::enable_shared_from_this<BusServer::State> {
  explicit State(std::shared_ptr<ServerContext> shared) : context(std::move(shared)) {}

  void serve(const SharedDescriptor& connected, std::function<void()> on_end);
  bool mustWait(const SharedDescriptor& connected, std::function<void()>& on_end);
  std::string refusal(const AcceptedPeer& peer) const;
  void ended(std::uint64_t id, std::uint32_t uid, std::function<void()> on_end);
  void close();

  const std::shared_ptr<ServerContext> context;
  std::atomic<std::size_t> open{0};
  std::vector<std::unique_ptr<Acceptor>> acceptors;
  std::unique_ptr<BusFront> front;
  std::map<std::uint64_t, std::shared_ptr<ServedConnection>> connections;
  std::map<std::uint32_t, std::size_t> open_by_uid;
  std::uint64_t last_id = 0;
  bool closed = false;
};

/// A user whose share is used up has new connections as soon as it has come back. Nothing but the
/// user is looked at before. Answers false when the connection is to be served now.
bool BusServer::State::mustWait(const SharedDescriptor& connected, std::function<void()>& on_end) {
  UserPace& pace = context->pace;
  const auto uid = access::peerUid(connected->fd());
  if (closed || !uid || pace.mayGoOn(*uid)) return false;
  const ServerLimits& limits = context->options.limits;
  if (pace.waiting(*uid) < limits.connections_per_uid && pace.waiting() < limits.connections) {
    pace.wait(*uid, [self = weak_from_this(), connected, on_end = std::move(on_end)] {
      if (const auto alive = self.lock()) alive->serve(connected, on_end);
    });
    return true;
  }
  context->refusals.write("user " + std::to_string(*uid), "too many of its connections wait");
  if (on_end) context->global.async(std::move(on_end));
  return true;
}

/// The order matters: who the peer is comes before anything that it says, and whatever goes wrong
/// costs this one peer its connection and nobody else.
void BusServer::State::serve(const SharedDescriptor& connected, std::function<void()> on_end) {
  if (mustWait(connected, on_end)) return;
  auto identity = closed ? nullptr : access::capturePeerIdentity(connected->fd());
  if (identity == nullptr) {
    if (!closed) context->refusals.write("an unknown peer", "the kernel does not tell who it is");
    if (on_end) context->global.async(std::move(on_end));
    return;
  }
  const auto peer = std::make_shared<AcceptedPeer>(std::move(identity));
  context->pace.spendOnConnection(peer->identity().uid());
  std::string why = refusal(*peer);
  if (why.empty()) why = context->admissionRefusal(*peer);
  if (!why.empty()) {
    context->refusals.write(peer->identity().describe(), why);
    if (on_end) context->global.async(std::move(on_end));
    return;
  }
  const std::uint64_t id = ++last_id;
  const std::uint32_t uid = peer->identity().uid();
  open.fetch_add(1);
  ++open_by_uid[uid];
  auto connection = std::make_shared<ServedConnection>(
      context, peer, [self = weak_from_this(), id, uid, on_end = std::move(on_end)]() mutable {
        if (const auto alive = self.lock()) alive->ended(id, uid, std::move(on_end));
      });
  connections.emplace(id, connection);
  connection->start(connected->fd());
}

std::string BusServer::State::refusal(const AcceptedPeer& peer) const {
  const ServerLimits& limits = context->options.limits;
  if (open >= limits.connections) {
    return std::to_string(limits.connections) + " connections are open";
  }
  const auto of_uid = open_by_uid.find(peer.identity().uid());
  if (of_uid != open_by_uid.end() && of_uid->second >= limits.connections_per_uid) {
    return std::to_string(of_uid->second) + " connections of this user are open";
  }
  return "";
}

/// Its place is free at once; the object itself goes later, since it may be on the stack.
void BusServer::State::ended(std::uint64_t id, std::uint32_t uid, std::function<void()> on_end) {
  open.fetch_sub(1);
  if (--open_by_uid[uid] == 0) open_by_uid.erase(uid);
  if (on_end) context->global.async(std::move(on_end));
  context->loop.post([self = shared_from_this(), id] { self->connections.erase(id); });
}

void BusServer::State::close() {
  closed = true;
  acceptors.clear();
  front.reset();
  for (const auto& [id, connection] : connections) connection->close();
  connections.clear();
  context->turns.clear();
  context->pace.close();
  context->refusals.close();
  context->refused_calls.close();
  open = 0;
}

BusServer::BusServer(IpcLoop& loop, ConcurrentQueue& global, ServedInterface interface,
                     ServerOptions options) {
  if (const std::string problem = problemOf(interface); !problem.empty()) {
    rt::panic(("IPC: the served interface is incomplete: " + problem).c_str());
  }
  state_ = std::make_shared<State>(
      std::make_shared<ServerContext>(loop, global, std::move(interface), std::move(options)));
}

BusServer::~BusServer() {
  const auto& context = *state_->context;
  context.loop.runAndWait([this] { state_->close(); });
  state_->context->gate.closeAndWait();
}

void BusServer::serveListening(SharedDescriptor listening) {
  state_->context->loop.post([state = state_, listening = std::move(listening)] {
    if (state->closed) return;
    state->context->endpoint_rules.own_address = addressOfSocket(listening->fd());
    auto acceptor = std::make_unique<Acceptor>(
        state->context->loop, listening, state->context->options.limits.accept_pause_ns,
        // The acceptor belongs to the state.
        [state = state.get()](const SharedDescriptor& fd) { state->serve(fd, {}); });
    if (!acceptor->start()) {
      logProblem("%s The listening socket cannot be watched", "SpacekeepListener");
      return;
    }
    state->acceptors.push_back(std::move(acceptor));
  });
}

void BusServer::serveConnected(SharedDescriptor connected, std::function<void()> on_end) {
  state_->context->loop.post([state = state_, connected = std::move(connected),
                              on_end = std::move(on_end)] { state->serve(connected, on_end); });
}

void BusServer::serveOnBus(BusOptions options) {
  state_->context->loop.post([state = state_, options = std::move(options)] {
    if (state->closed || state->front != nullptr) return;
    state->front = std::make_unique<BusFront>(state->context, options);
    state->front->start();
  });
}

std::size_t BusServer::connections() const { return state_->open; }

}  // namespace spacekeep::ipc
