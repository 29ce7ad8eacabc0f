#include "sim/world/simulated_peer.h"

#include <algorithm>
#include <utility>

namespace spacekeep::sim {

SimulatedPeer::SimulatedPeer(std::string name, std::set<std::string, std::less<>> entitlements)
    : name_(std::move(name)),
      entitlements_(std::move(entitlements)),
      identity_(access::PeerFacts{.uid = 1000, .gid = 1000, .pid = 4711, .program = name_}) {}

bool SimulatedPeer::holds(std::string_view entitlement) const {
  return entitlements_.contains(entitlement);
}

bool SimulatedAccess::connectionIsEntitled(ipc::PeerConnection* connection,
                                           std::initializer_list<std::string_view> entitlements) {
  const auto* peer = dynamic_cast<const SimulatedPeer*>(connection);
  return peer != nullptr && std::all_of(entitlements.begin(), entitlements.end(),
                                        [&](std::string_view name) { return peer->holds(name); });
}

}  // namespace spacekeep::sim
