#include <utility>

#include "daemon/spacekeep.h"

namespace spacekeep {

std::shared_ptr<const ServiceMap> Spacekeep::copyServices() const {
  std::shared_ptr<const ServiceMap> snapshot;
  collection_queue_->sync([&] { snapshot = registry_.snapshot(); });
  return snapshot;
}

ServiceMap Spacekeep::mutableServices() const {
  ServiceMap copy;
  collection_queue_->sync([&] { copy = registry_.services(); });
  return copy;
}

}  // namespace spacekeep
