// Thread safety: every public member may be called from any thread; startOperation once.
//
// The daily upkeep on one volume: asks services for their periodic work at a fixed urgency and
// reports what the last one to answer said it freed.
#pragma once

#include <atomic>
#include <cstdint>
#include <memory>
#include <string>

#include "operations/operation.h"
#include "support/ipc/arguments.h"
#include "support/queues/waiting.h"

namespace spacekeep {

class SpacekeepPeriodicOperation : public SpacekeepOperation {
 public:
  using SpacekeepOperation::SpacekeepOperation;

  [[nodiscard]] bool initWithInfo(const Value& info, ServiceSnapshot services) override;

  /// Runs the pass on the calling thread, for 15 seconds at most. `completion` gets
  /// {"SPACEKEEP_AMOUNT": bytes} once, before this returns.
  void startOperation(OperationCompletion completion) override;

 private:
  /// What the callbacks of services share with the pass; it may end before them.
  struct Pass {
    CountingSemaphore all_answered{0};
    std::atomic<std::uint64_t> amount_bytes = 0;
  };
  using SharedPass = std::shared_ptr<Pass>;

  void askService(const std::shared_ptr<SKService>& service, const SharedPass& pass);
  void callProxy(const std::string& service_id, std::shared_ptr<ipc::RemoteProxy> proxy,
                 ServiceCaller::Done done, const SharedPass& pass);
  void bookReply(const std::string& service_id, const ipc::OptionalDictionary& reply, Pass& pass);
  void waitForServices(Pass& pass);
  [[nodiscard]] std::shared_ptr<SpacekeepPeriodicOperation> self();
};

}  // namespace spacekeep
