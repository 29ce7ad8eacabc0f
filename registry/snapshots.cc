#include <utility>

#include "daemon/spacekeep.h"

namespace spacekeep {

std::shared_ptr<const ServiceMap> Spacekeep::copyServices() const {
  return std::make_shared<const ServiceMap>(mutableServices());
}

ServiceMap Spacekeep::mutableServices() const {
  ServiceMap copy;
  collection_queue_->sync([&] { copy = services_; });
  return copy;
}

}  // namespace spacekeep
