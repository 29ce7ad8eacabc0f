// Thread safety: every public member may be called from any thread unless it says otherwise.
//
// What all operations share: validation of the request, the volume, the urgency limit, the result
// under construction, the services with an unanswered request, two private serial queues, and
// cancellation.
#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <utility>

#include "registry/service.h"
#include "support/platform.h"
#include "support/queues/serial_queue.h"
#include "support/values/value.h"

namespace spacekeep {

/// Receives an outcome, to keep. May be called more than once, on any thread.
using OperationCompletion = std::function<void(Dictionary)>;

/// A snapshot of the registry. Operations share it, since it may hold thousands of services.
class ServiceSnapshot {
 public:
  ServiceSnapshot() : ServiceSnapshot(ServiceMap()) {}
  ServiceSnapshot(ServiceMap services)  // NOLINT: a map is a snapshot of its own
      : services_(std::make_shared<const ServiceMap>(std::move(services))) {}
  ServiceSnapshot(std::shared_ptr<const ServiceMap> services)  // NOLINT: the same, not null
      : services_(std::move(services)) {}

  [[nodiscard]] const ServiceMap& operator*() const { return *services_; }

 private:
  std::shared_ptr<const ServiceMap> services_;
};

/// What the daemon starts and cancels operations through.
class OperationInterface {
 public:
  virtual ~OperationInterface() = default;
  virtual void startOperation(OperationCompletion completion) = 0;
  /// Cancelling is optional: ask before calling.
  [[nodiscard]] virtual bool implementsCancelOperation() const { return false; }
  virtual void cancelOperation() {}
};

/// Make it with std::make_shared and call initWithInfo once before anything else; makeOperation
/// does both. Callbacks of services hold it until the last of them has run.
class SpacekeepOperation : public OperationInterface,
                           public std::enable_shared_from_this<SpacekeepOperation> {
 public:
  explicit SpacekeepOperation(Platform& platform) : platform_(platform) {}

  /// False when the request is refused; result() then holds only "SPACEKEEP_ERROR".
  [[nodiscard]] virtual bool initWithInfo(const Value& info, ServiceSnapshot services);

  /// Answers whether the set was changed. Not from a task on collection_queue().
  bool updateInFlight(const std::string& service_id, bool add);
  [[nodiscard]] std::uint64_t inFlightCount() const;
  /// A copy. Not from a task on collection_queue().
  [[nodiscard]] std::set<std::string> copyInFlight() const;
  /// Only on collection_queue().
  [[nodiscard]] const std::set<std::string>& inFlight() const;

  [[nodiscard]] bool implementsCancelOperation() const override { return true; }
  /// Returns at once; asks each service in flight to stop.
  void cancelOperation() override;

  [[nodiscard]] const Dictionary& info() const { return info_; }
  [[nodiscard]] const ServiceMap& services() const { return *services_; }
  [[nodiscard]] const Dictionary& result() const { return result_; }
  /// "SPACEKEEP_VOLUME" as it came, before it was checked.
  [[nodiscard]] const std::optional<Value>& volume() const { return volume_; }
  /// The highest urgency that may be used, 1 to 4.
  [[nodiscard]] std::int32_t urgencyLimit() const { return urgency_limit_; }
  [[nodiscard]] const std::shared_ptr<SerialQueue>& collection_queue() const {
    return collection_queue_;
  }
  [[nodiscard]] const std::shared_ptr<SerialQueue>& message_queue() const { return message_queue_; }

 protected:
  // Before the operation is started.
  void setInfo(Dictionary info) { info_ = std::move(info); }
  void setServices(ServiceSnapshot services) { services_ = std::move(services); }
  void setResult(Dictionary result) { result_ = std::move(result); }
  void setInFlight(std::set<std::string> service_ids) { in_flight_ = std::move(service_ids); }
  void setVolume(std::optional<Value> volume) { volume_ = std::move(volume); }
  void setUrgencyLimit(std::int32_t urgency_limit) { urgency_limit_ = urgency_limit; }
  void setCollection_queue(std::shared_ptr<SerialQueue> queue) {
    collection_queue_ = std::move(queue);
  }
  void setMessage_queue(std::shared_ptr<SerialQueue> queue) { message_queue_ = std::move(queue); }

  /// Null when the snapshot does not hold the ID.
  [[nodiscard]] std::shared_ptr<SKService> serviceFor(const std::string& service_id) const;
  [[nodiscard]] Platform& platform() const { return platform_; }

 private:
  bool refuse(const char* error_text);
  bool addInFlight(const std::string& service_id);
  bool removeInFlight(const std::string& service_id);
  void askToCancel(const std::string& service_id);

  Platform& platform_;
  // Constant after construction.
  Dictionary info_;
  ServiceSnapshot services_;
  Dictionary result_;
  std::optional<Value> volume_;
  std::int32_t urgency_limit_ = 0;
  std::shared_ptr<SerialQueue> collection_queue_;
  std::shared_ptr<SerialQueue> message_queue_;
  // Confined to collection_queue_.
  std::set<std::string> in_flight_;
};

/// The urgency limit that a request asks for: "SPACEKEEP_URGENCY", in its absence
/// "SPACEKEEP_URGENCY_LIMIT". 3 unless the value found is a number from 1 to 4.
[[nodiscard]] std::int32_t urgencyLimitOf(const Dictionary& info);

/// Null when the request is refused. `rest` goes to the operation's constructor.
template <class Operation, class... Rest>
[[nodiscard]] std::shared_ptr<Operation> makeOperation(Platform& platform, const Value& info,
                                                       ServiceSnapshot services, Rest... rest) {
  auto operation = std::make_shared<Operation>(platform, std::move(rest)...);
  if (!operation->initWithInfo(info, std::move(services))) return nullptr;
  return operation;
}

}  // namespace spacekeep
