// Thread safety: none; the daemon's registry is confined to its collection_queue.
//
// The registered services by ID, and the snapshot that operations share: it is made anew only after
// a change, since there may be thousands of services and an operation for each request.
#pragma once

#include <memory>
#include <string>
#include <utility>

#include "registry/service.h"

namespace spacekeep {

class ServiceRegistry {
 public:
  [[nodiscard]] const ServiceMap& services() const { return services_; }
  /// Null when the ID is not registered.
  [[nodiscard]] std::shared_ptr<SKService> find(const std::string& service_id) const {
    const auto found = services_.find(service_id);
    return found == services_.end() ? nullptr : found->second;
  }

  void replaceAll(ServiceMap services) {
    services_ = std::move(services);
    snapshot_ = nullptr;
  }
  /// Adds or replaces.
  void set(const std::string& service_id, std::shared_ptr<SKService> service) {
    services_.insert_or_assign(service_id, std::move(service));
    snapshot_ = nullptr;
  }
  void remove(const std::string& service_id) {
    services_.erase(service_id);
    snapshot_ = nullptr;
  }

  /// The services as they are now. Later changes do not show in it.
  [[nodiscard]] std::shared_ptr<const ServiceMap> snapshot() {
    if (!snapshot_) snapshot_ = std::make_shared<const ServiceMap>(services_);
    return snapshot_;
  }

 private:
  ServiceMap services_;
  std::shared_ptr<const ServiceMap> snapshot_;  // of services_, null after a change
};

}  // namespace spacekeep
