#include <utility>

#include "daemon/spacekeep.h"

namespace spacekeep {

std::shared_ptr<const ServiceMap> Spacekeep::copyServices() const {
  std::shared_ptr<const ServiceMap> snapshot;
  collection_queue_->sync([&] {
    if (!snapshot_) snapshot_ = std::make_shared<const ServiceMap>(services_);
    snapshot = snapshot_;
  });
  return snapshot;
}

ServiceMap Spacekeep::mutableServices() const {
  ServiceMap copy;
  collection_queue_->sync([&] { copy = services_; });
  return copy;
}

}  // namespace spacekeep
