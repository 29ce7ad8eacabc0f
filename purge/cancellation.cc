#include <utility>

#include "purge/purge_operation.h"
#include "registry/service_protocol.h"
#include "support/logging/log.h"

namespace spacekeep {
namespace {

void sendCancelPurge(std::shared_ptr<ipc::RemoteProxy> proxy, ServiceCaller::Done done) {
  SpacekeepServiceProtocol(std::move(proxy)).serviceCancelPurge(std::move(done));
}

void noteFailure() { logTrace("%s connection invalidated", "cancelOperation"); }

}  // namespace

void SpacekeepPurgeOperation::cancelOperation() {
  setCancel(true);
  auto self = std::static_pointer_cast<SpacekeepPurgeOperation>(shared_from_this());
  collection_queue()->async([self] {
    for (const std::string& service_id : self->inFlight()) {
      self->platform().global.async([self, service_id] {
        self->platform().services.CallServiceAsync(self->serviceFor(service_id), sendCancelPurge,
                                                   noteFailure);
      });
    }
  });
}

}  // namespace spacekeep
