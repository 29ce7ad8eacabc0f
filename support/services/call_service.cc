#include "support/services/call_service.h"

#include <algorithm>
#include <mutex>
#include <utility>

#include "support/logging/log.h"
#include "support/queues/waiting.h"

namespace spacekeep {

/// One call to a service: it has failed, or it is done, whichever comes first.
class ServiceCaller::Attempt {
 public:
  Attempt(FailureHandler failure, Invoked invoked)
      : failure_(std::move(failure)), invoked_(std::move(invoked)) {}

  /// The call handler has returned.
  void invoked() {
    Invoked told;
    {
      const std::scoped_lock lock(mutex_);
      told = std::exchange(invoked_, nullptr);
    }
    if (told) told();
  }

  void done() { static_cast<void>(settle()); }

  void fail() {
    if (const FailureHandler failure = settle()) failure();
    invoked();
  }

 private:
  /// Answers the failure handler the first time, and lets go of what it holds.
  FailureHandler settle() {
    const std::scoped_lock lock(mutex_);
    return std::exchange(failure_, nullptr);
  }

  rt::Mutex mutex_;
  // Protected by mutex_.
  FailureHandler failure_;
  Invoked invoked_;
};

ServiceCaller::ServiceCaller(ConcurrentQueue& global, ipc::Connector& connector,
                             const ipc::InterfaceDescription& service_interface)
    : global_(global), connector_(connector), interface_(service_interface) {}

void ServiceCaller::CallServiceAsync(std::shared_ptr<const ServiceReference> service,
                                     CallHandler call, FailureHandler failure) {
  start("CallServiceAsync", std::move(service), std::move(call), std::move(failure), nullptr);
}

void ServiceCaller::CallService(std::shared_ptr<const ServiceReference> service, CallHandler call,
                                FailureHandler failure) {
  // Shared, because the one that signals may still be inside signal() when the wait has ended.
  const auto returned = std::make_shared<CountingSemaphore>(0U);
  start("CallService", std::move(service), std::move(call), std::move(failure),
        [returned] { returned->signal(); });
  returned->wait();
}

/// Nothing runs on the caller's thread. Failures run on the global queue and not in the service's
/// order: they may wait for queues of the operation.
void ServiceCaller::start(const char* operation, std::shared_ptr<const ServiceReference> service,
                          CallHandler call, FailureHandler failure, Invoked invoked) {
  auto attempt = std::make_shared<Attempt>(std::move(failure), std::move(invoked));
  if (service == nullptr) {
    global_.async([attempt] { attempt->fail(); });
    return;
  }
  const auto order = orderOf(service->ID);
  order->async([this, operation, service = std::move(service), call = std::move(call), attempt] {
    const auto connection = reach(*service);
    if (connection == nullptr) {
      logTrace("%s %@ cannot be reached", operation, service->ID);
      global_.async([attempt] { attempt->fail(); });
      return;
    }
    auto proxy =
        connection->remoteProxy([operation, id = service->ID, attempt](const ipc::Error& error) {
          logTrace("%s calling %@ failed: %@", operation, id, error.text);
          attempt->fail();
        });
    call(std::move(proxy), [attempt] { attempt->done(); });
    attempt->invoked();
  });
}

std::shared_ptr<ipc::Connection> ServiceCaller::reach(const ServiceReference& service) const {
  if (service.connection != nullptr) return service.connection;
  return connector_.connectionToDeclared(service.ID, interface_);
}

std::shared_ptr<SerialQueue> ServiceCaller::orderOf(const std::string& service_id) {
  const std::scoped_lock lock(mutex_);
  forgetUnusedOrders();
  if (const auto found = orders_.find(service_id); found != orders_.end()) {
    if (auto order = found->second.lock()) return order;
  }
  auto order = SerialQueue::create("com.quorvel.spacekeep_services." + service_id, global_);
  orders_[service_id] = order;
  return order;
}

std::size_t ServiceCaller::rememberedOrders() const {
  const std::scoped_lock lock(mutex_);
  return orders_.size();
}

/// Looks at all of them only when there are twice as many as were left the last time, so that a
/// call does not cost more the more services there are.
void ServiceCaller::forgetUnusedOrders() {
  if (orders_.size() < forget_at_) return;
  std::erase_if(orders_, [](const auto& entry) { return entry.second.expired(); });
  forget_at_ = std::max(kFewOrders, 2 * orders_.size());
}

}  // namespace spacekeep
