// Thread safety: every member may be called from any thread. ID, connection and endpoint are
// constant once the record is in the registry; the other fields may be rewritten by a check-in
// while operations read them from their snapshots.
//
// One registered service.
#pragma once

#include <atomic>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <utility>

#include "support/ipc/arguments.h"
#include "support/runtime/guarded.h"
#include "support/services/call_service.h"
#include "support/values/value.h"

namespace spacekeep {

class SKService : public ServiceReference {
 public:
  explicit SKService(std::string service_id) { ID = std::move(service_id); }

  /// Frees space on request.
  [[nodiscard]] bool doesPurge() const { return does_purge_; }
  void setDoesPurge(bool does_purge) { does_purge_ = does_purge; }
  /// Takes part in the periodic pass.
  [[nodiscard]] bool doesPeriodic() const { return does_periodic_; }
  void setDoesPeriodic(bool does_periodic) { does_periodic_ = does_periodic; }
  /// Is left out of purgeable-space queries.
  [[nodiscard]] bool doNotQuery() const { return do_not_query_; }
  void setDoNotQuery(bool do_not_query) { do_not_query_ = do_not_query; }

  /// An array of notification names: sorted and without doubles from a descriptor, as it was sent
  /// from a check-in.
  [[nodiscard]] std::optional<Value> desiredNotifications() const {
    return desired_notifications_.get();
  }
  void setDesiredNotifications(std::optional<Value> names) {
    desired_notifications_.set(std::move(names));
  }
  [[nodiscard]] bool desires(std::string_view notification_name) const;

  /// Where the service listens; null for a service from a descriptor file.
  [[nodiscard]] const ipc::SharedDescriptor& endpoint() const { return endpoint_; }
  void setEndpoint(ipc::SharedDescriptor endpoint) { endpoint_ = std::move(endpoint); }

 private:
  std::atomic<bool> does_purge_ = false;
  std::atomic<bool> does_periodic_ = false;
  std::atomic<bool> do_not_query_ = false;
  ipc::SharedDescriptor endpoint_;
  rt::Guarded<std::optional<Value>> desired_notifications_;
};

/// The registry and its snapshots. Snapshots share the records.
using ServiceMap = std::map<std::string, std::shared_ptr<SKService>>;

}  // namespace spacekeep
