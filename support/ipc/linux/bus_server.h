// Thread safety: every member may be called from any thread but the IPC thread. Handlers run on the
// global concurrent queue.
//
// Serves one interface over D-Bus: peer to peer on every connection of a listening unix socket or on
// connected sockets handed to it, and on a message bus. The daemon's listener and the services'
// library stand on it.
#pragma once

#include <cstddef>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>

#include "support/ipc/arguments.h"
#include "support/ipc/linux/bus_options.h"
#include "support/ipc/linux/ipc_loop.h"
#include "support/ipc/linux/user_turns.h"
#include "support/ipc/served.h"
#include "support/ipc/user_shares.h"
#include "support/queues/concurrent_queue.h"

namespace spacekeep::ipc {

/// Everything that one peer, or all of them together, may use up.
struct ServerLimits {
  std::size_t connections = 1024;
  std::size_t connections_per_uid = 256;  ///< root included
  std::uint64_t authentication_ns = 5'000'000'000;
  std::size_t message_bytes = 1024 * 1024;
  std::size_t unanswered_calls = 64;           ///< per connection
  std::size_t queued_messages = 256;           ///< per connection, not yet taken by the peer
  std::size_t queued_bytes = 4 * 1024 * 1024;  ///< per connection, estimated
  UserTurnLimits turns;
  /// Of one user: purges, queries, cancels and what brings a descriptor, until they are answered.
  UserTurnLimits lanes;
  UserShareLimits shares;
  std::uint64_t accept_pause_ns = 1'000'000'000;  ///< after running out of descriptors
};

/// What a connection may serve, besides the limits.
struct ServerOptions {
  ServerLimits limits;
  /// Asked once per connection, on the IPC thread, before a byte is read: it must not block. False
  /// closes the connection; `why` goes into the log. Not set: every peer is served.
  std::function<bool(PeerConnection& peer, std::string& why)> admit;
  /// Descriptor arguments whose peer is this very process are refused, since the process would then
  /// wait for itself. Programs that are daemon and service at once (tests) turn it off.
  bool refuse_own_process = true;
  /// Where a listener also serves, besides its socket.
  std::optional<BusOptions> bus = {};
};

class BusServer {
 public:
  /// `interface` needs one handler per described method: a panic otherwise.
  BusServer(IpcLoop& loop, ConcurrentQueue& global, ServedInterface interface,
            ServerOptions options = {});
  /// Closes every connection and waits for the handlers that run.
  ~BusServer();
  BusServer(const BusServer&) = delete;
  BusServer& operator=(const BusServer&) = delete;

  /// Accepts connections from now on. `listening` is a listening AF_UNIX stream socket.
  void serveListening(SharedDescriptor listening);
  /// Serves one connected AF_UNIX stream socket; the descriptor is duplicated. `on_end` runs once,
  /// on the global queue, when the connection has ended (it may run before this returns).
  void serveConnected(SharedDescriptor connected, std::function<void()> on_end = {});

  /// Serves on a message bus as well, whenever there is one. Once.
  void serveOnBus(BusOptions options);

  [[nodiscard]] std::size_t connections() const;

 private:
  struct State;
  std::shared_ptr<State> state_;
};

}  // namespace spacekeep::ipc
