// Thread safety: constant after construction, apart from the members that state their own.
//
// What all connections of one server share. Lives until the last handler and answer are gone.
#pragma once

#include <memory>
#include <string>
#include <utility>

#include "support/access/peer_identity.h"
#include "support/ipc/lanes.h"
#include "support/ipc/linux/bus_server.h"
#include "support/ipc/linux/ipc_loop.h"
#include "support/ipc/linux/lane_budget.h"
#include "support/ipc/linux/refusal_log.h"
#include "support/ipc/linux/sockets.h"
#include "support/ipc/linux/user_pace.h"
#include "support/ipc/linux/user_turns.h"
#include "support/ipc/served.h"
#include "support/ipc/serving_gate.h"

namespace spacekeep::ipc {

struct ServerContext {
  ServerContext(IpcLoop& ipc_loop, ConcurrentQueue& global_queue, ServedInterface served,
                ServerOptions server_options)
      : loop(ipc_loop),
        global(global_queue),
        interface(std::move(served)),
        options(std::move(server_options)),
        lanes(std::make_shared<Lanes>(global_queue)),
        lane_budget(std::make_shared<LaneBudget>(options.limits.lanes)),
        turns(options.limits.turns),
        pace(loop, options.limits.shares),
        refusals(loop, RefusalLog::Of::kConnections),
        refused_calls(loop, RefusalLog::Of::kCalls) {
    endpoint_rules.refuse_own_process = options.refuse_own_process;
  }

  /// Why the peer is not served, empty when it is. Only the answer of `admit` decides; what it wrote
  /// counts when it said no.
  [[nodiscard]] std::string admissionRefusal(PeerConnection& peer) const {
    std::string why;
    if (!options.admit || options.admit(peer, why)) return "";
    return why.empty() ? "it is not admitted" : why;
  }

  IpcLoop& loop;
  ConcurrentQueue& global;
  const ServedInterface interface;
  const ServerOptions options;
  const std::shared_ptr<Lanes> lanes;             ///< any thread
  const std::shared_ptr<LaneBudget> lane_budget;  ///< any thread
  ServingGate gate;              ///< any thread; loop is there at least while one is inside
  UserTurns turns;               ///< IPC thread
  UserPace pace;                 ///< IPC thread
  EndpointRules endpoint_rules;  ///< IPC thread
  RefusalLog refusals;           ///< IPC thread
  RefusalLog refused_calls;      ///< IPC thread
};

/// The peer of an accepted connection, as handlers see it.
class AcceptedPeer final : public PeerConnection {
 public:
  explicit AcceptedPeer(std::shared_ptr<const access::PeerIdentity> identity)
      : identity_(std::move(identity)) {}
  [[nodiscard]] const access::PeerIdentity& identity() const override { return *identity_; }

 private:
  const std::shared_ptr<const access::PeerIdentity> identity_;
};

}  // namespace spacekeep::ipc
