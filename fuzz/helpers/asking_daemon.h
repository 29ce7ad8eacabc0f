// Thread safety: every member may be called from any thread.
//
// What stands behind a fuzzed listener: asks for the rights that the daemon asks for, and answers at
// once. Rights come from rules, as in production: everybody may connect, query, and check in; nobody
// may purge.
#pragma once

#include <string>

#include "client/client_protocol.h"
#include "support/access/entitlement_access.h"

namespace spacekeep::fuzz {

class AskingDaemon final : public SpacekeepClientProtocol {
 public:
  AskingDaemon();

  /// As the daemon's listener asks when a peer connects.
  [[nodiscard]] bool admits(ipc::PeerConnection& peer);

  void clientCheckin(std::string service_id, ipc::SharedDescriptor endpoint, Dictionary info,
                     CheckinReply reply) override;
  void clientPurgeableSpace(Dictionary info, DictionaryReply reply) override;
  void clientItemizedPurgeableSpace(Dictionary info, DictionaryReply reply) override;
  void clientPurge(Dictionary info, DictionaryReply reply) override;
  void clientCancelPurge(Dictionary info, EmptyReply reply) override;
  void clientSetState(ipc::OptionalValue value, std::string key, EmptyReply reply,
                      StoreFailure failed) override;
  void clientGetState(std::string key, ValueReply reply) override;

 private:
  /// Of the connection that is being served.
  [[nodiscard]] bool isEntitled(std::string_view entitlement);

  access::EntitlementAccess access_;
};

}  // namespace spacekeep::fuzz
