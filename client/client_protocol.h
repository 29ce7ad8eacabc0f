// Thread safety: every member may be called from any thread; replies may run on any thread.
//
// The interface that the daemon offers to its clients. What clients program against is what the
// daemon object implements.
#pragma once

#include <functional>
#include <string>

#include "support/ipc/arguments.h"

namespace spacekeep {

/// "com.quorvel.SpacekeepClientProtocol", its operations in order.
[[nodiscard]] const ipc::InterfaceDescription& spacekeepClientInterface();

class SpacekeepClientProtocol {
 public:
  /// No dictionary means that the request was refused.
  using DictionaryReply = std::function<void(ipc::OptionalDictionary)>;
  using CheckinReply = std::function<void(ipc::OptionalDictionary, ipc::OptionalString error)>;
  using EmptyReply = std::function<void()>;
  using ValueReply = std::function<void(ipc::OptionalValue)>;
  /// Gets, in words, why a value could not be stored.
  using StoreFailure = std::function<void(std::string why)>;

  virtual ~SpacekeepClientProtocol() = default;

  /// A service makes itself known: it serves SpacekeepServiceProtocol on the other end of
  /// `endpoint`. A caller without "SERVICE_ENTITLEMENT" never gets a reply.
  virtual void clientCheckin(std::string service_id, ipc::SharedDescriptor endpoint,
                             Dictionary info, CheckinReply reply) = 0;
  virtual void clientPurgeableSpace(Dictionary info, DictionaryReply reply) = 0;
  virtual void clientItemizedPurgeableSpace(Dictionary info, DictionaryReply reply) = 0;
  /// Blocks until the purge has ended; the reply comes on another thread.
  virtual void clientPurge(Dictionary info, DictionaryReply reply) = 0;
  /// `reply` may be empty.
  virtual void clientCancelPurge(Dictionary info, EmptyReply reply) = 0;
  /// No value removes the key. Exactly one of the two runs: `reply` once the change is on the disk,
  /// `failed` when it could not be brought there; the state is then as it was.
  virtual void clientSetState(ipc::OptionalValue value, std::string key, EmptyReply reply,
                              StoreFailure failed) = 0;
  virtual void clientGetState(std::string key, ValueReply reply) = 0;
};

}  // namespace spacekeep
