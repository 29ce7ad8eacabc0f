// Thread safety: every member may be called from any thread; replies arrive on other threads.
//
// The interface that every service implements, and the typed way to call it.
#pragma once

#include <cstdint>
#include <functional>
#include <memory>

#include "support/ipc/arguments.h"
#include "support/ipc/connection.h"

namespace spacekeep {

/// "com.quorvel.SpacekeepServiceProtocol", its operations in order.
[[nodiscard]] const ipc::InterfaceDescription& spacekeepServiceInterface();

/// Each reply runs once if the service answers and never if it does not; failures of a call go to
/// the error handler of the proxy.
class SpacekeepServiceProtocol {
 public:
  using DictionaryReply = std::function<void(ipc::OptionalDictionary)>;
  using EmptyReply = std::function<void()>;

  explicit SpacekeepServiceProtocol(std::shared_ptr<ipc::RemoteProxy> proxy)
      : proxy_(std::move(proxy)) {}

  /// How much could be freed at `urgency` (1 to 4).
  void servicePurgeable(std::int32_t urgency, Dictionary info, DictionaryReply reply) const;
  /// Free "SPACEKEEP_AMOUNT" bytes now; the reply's "SPACEKEEP_AMOUNT" is what was freed.
  void servicePurge(std::int32_t urgency, Dictionary info, DictionaryReply reply) const;
  void servicePeriodic(std::int32_t urgency, Dictionary info, DictionaryReply reply) const;
  void serviceCancelPurge(EmptyReply reply) const;
  void servicePing(EmptyReply reply) const;
  /// `notification` holds one entry, name to value.
  void serviceNotify(Dictionary notification, EmptyReply reply) const;
  /// Part of the interface for the services' sake; the daemon never calls it.
  void serviceCallback(Dictionary info, DictionaryReply reply) const;

 private:
  std::shared_ptr<ipc::RemoteProxy> proxy_;
};

}  // namespace spacekeep
