// Thread safety: SimulatedPeer is immutable; SimulatedAccess holds no state.
//
// A client process as the listener sees it: a name and the entitlements it holds.
#pragma once

#include <initializer_list>
#include <set>
#include <string>
#include <string_view>

#include "support/access/access.h"
#include "support/access/peer_identity.h"
#include "support/ipc/served.h"

namespace spacekeep::sim {

class SimulatedPeer final : public ipc::PeerConnection {
 public:
  SimulatedPeer(std::string name, std::set<std::string, std::less<>> entitlements);

  [[nodiscard]] const std::string& name() const { return name_; }
  [[nodiscard]] const std::set<std::string, std::less<>>& entitlements() const {
    return entitlements_;
  }
  [[nodiscard]] bool holds(std::string_view entitlement) const;
  /// Of a made-up process: user 1000, process 4711, its program has the peer's name.
  [[nodiscard]] const access::PeerIdentity& identity() const override { return identity_; }

 private:
  const std::string name_;
  const std::set<std::string, std::less<>> entitlements_;
  const access::PeerIdentity identity_;
};

/// Grants exactly what a SimulatedPeer holds, and nothing to any other connection.
class SimulatedAccess final : public Access {
 public:
  [[nodiscard]] bool connectionIsEntitled(
      ipc::PeerConnection* connection,
      std::initializer_list<std::string_view> entitlements) override;
};

}  // namespace spacekeep::sim
