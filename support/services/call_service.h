// Thread safety: every function may be called from any thread.
//
// The act of calling a registered service.
#pragma once

#include <cstddef>
#include <functional>
#include <map>
#include <memory>
#include <string>

#include "support/ipc/connection.h"
#include "support/queues/concurrent_queue.h"
#include "support/queues/serial_queue.h"
#include "support/runtime/runtime.h"

namespace spacekeep {

/// What it takes to reach a service: its ID, and its open connection when it checked in.
struct ServiceReference {
  std::string ID;
  std::shared_ptr<ipc::Connection> connection;  ///< constant once the record is in the registry
};

class ServiceCaller {
 public:
  using Done = std::function<void()>;
  /// Calls the service through the proxy, and `done` once it has handled the service's reply.
  using CallHandler = std::function<void(std::shared_ptr<ipc::RemoteProxy>, Done)>;
  using FailureHandler = std::function<void()>;

  ServiceCaller(ConcurrentQueue& global, ipc::Connector& connector,
                const ipc::InterfaceDescription& service_interface);

  /// Returns at once. Later, on another thread, runs `call`; runs `failure` instead (or as well,
  /// once, when the connection fails before `done`) if there is no record, the service cannot be
  /// reached or the connection fails. Neither ever runs from within this function: callers may
  /// hold a queue that the failure handler needs. Call handlers of one service run in the order of
  /// these calls, one at a time, so that a cancel never overtakes the request that it is about;
  /// therefore a call handler must not wait for a later call to the same service.
  void CallServiceAsync(std::shared_ptr<const ServiceReference> service, CallHandler call,
                        FailureHandler failure);

  /// The same, but returns only once `call` has been invoked or `failure` has run.
  void CallService(std::shared_ptr<const ServiceReference> service, CallHandler call,
                   FailureHandler failure);

  /// Of how many services the order of calls is remembered: of those that are being called, and of
  /// so many others again, but some at least.
  [[nodiscard]] std::size_t rememberedOrders() const;

 private:
  class Attempt;
  using Invoked = std::function<void()>;

  /// `operation` is the literal by which the log names the form of the call.
  void start(const char* operation, std::shared_ptr<const ServiceReference> service,
             CallHandler call, FailureHandler failure, Invoked invoked);
  [[nodiscard]] std::shared_ptr<ipc::Connection> reach(const ServiceReference& service) const;
  [[nodiscard]] std::shared_ptr<SerialQueue> orderOf(const std::string& service_id);
  void forgetUnusedOrders();

  static constexpr std::size_t kFewOrders = 64;

  ConcurrentQueue& global_;
  ipc::Connector& connector_;
  const ipc::InterfaceDescription& interface_;
  mutable rt::Mutex mutex_;
  /// Protected by mutex_. One for each service that is being called; a queue lives while it has
  /// tasks.
  std::map<std::string, std::weak_ptr<SerialQueue>> orders_;
  std::size_t forget_at_ = kFewOrders;  // protected by mutex_
};

}  // namespace spacekeep
