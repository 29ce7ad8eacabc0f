#include "operations/periodic_operation.h"

#include <utility>

#include "operations/info_keys.h"
#include "registry/service_protocol.h"
#include "support/logging/log.h"

namespace spacekeep {
namespace {

/// Whatever urgency limit the request has.
constexpr std::int32_t kPeriodicUrgency = 3;
constexpr std::uint64_t kLongestWaitNs = 15'000'000'000;

// Services that declare periodic work of their own are the ones left out, and services that do not
// purge are never asked.
ServiceMap selected(const ServiceMap& services) {
  ServiceMap selection;
  for (const auto& [service_id, service] : services) {
    if (service->doesPurge() && !service->doesPeriodic()) {
      selection.emplace_hint(selection.end(), service_id, service);
    }
  }
  return selection;
}

}  // namespace

bool SpacekeepPeriodicOperation::initWithInfo(const Value& request, ServiceSnapshot snapshot) {
  if (!SpacekeepOperation::initWithInfo(request, std::move(snapshot))) return false;
  setServices(selected(services()));
  return true;
}

std::shared_ptr<SpacekeepPeriodicOperation> SpacekeepPeriodicOperation::self() {
  return std::static_pointer_cast<SpacekeepPeriodicOperation>(shared_from_this());
}

void SpacekeepPeriodicOperation::startOperation(OperationCompletion completion) {
  const auto pass = std::make_shared<Pass>();
  for (const auto& [service_id, service] : services()) {
    if (updateInFlight(service_id, true)) askService(service, pass);
  }
  waitForServices(*pass);
  completion(Dictionary{{keys::kAmount, pass->amount_bytes.load()}});
}

// A service whose connection fails stays in flight: the pass then lasts to its limit.
void SpacekeepPeriodicOperation::askService(const std::shared_ptr<SKService>& service,
                                            const SharedPass& pass) {
  const std::string& service_id = service->ID;
  logTrace("%s CallService with serviceID: %@", "startOperation", service_id);
  platform().services.CallService(
      service,
      [self = self(), service_id, pass](std::shared_ptr<ipc::RemoteProxy> proxy,
                                        ServiceCaller::Done done) {
        self->platform().global.async(
            [self, service_id, pass, proxy = std::move(proxy), done = std::move(done)] {
              self->callProxy(service_id, proxy, done, pass);
            });
      },
      [] { logTrace("%s connection invalidated", "startOperation"); });
}

void SpacekeepPeriodicOperation::callProxy(const std::string& service_id,
                                           std::shared_ptr<ipc::RemoteProxy> proxy,
                                           ServiceCaller::Done done, const SharedPass& pass) {
  logTrace("%s calling proxy for %@", "startOperation", service_id);
  SpacekeepServiceProtocol(std::move(proxy))
      .servicePeriodic(
          kPeriodicUrgency, info(),
          [self = self(), service_id, pass, done = std::move(done)](ipc::OptionalDictionary reply) {
            logTrace("%s proxy %@ replied, purged: %@", "startOperation", service_id,
                     reply ? &*reply : nullptr);
            done();
            self->bookReply(service_id, reply, *pass);
          });
}

// The amounts are not added up: the last answer counts.
void SpacekeepPeriodicOperation::bookReply(const std::string& service_id,
                                           const ipc::OptionalDictionary& reply, Pass& pass) {
  if (reply) {
    if (const auto amount_bytes = unsignedAt(*reply, keys::kAmount)) {
      pass.amount_bytes = *amount_bytes;
    }
  }
  updateInFlight(service_id, false);
  if (inFlightCount() == 0) pass.all_answered.signal();
}

void SpacekeepPeriodicOperation::waitForServices(Pass& pass) {
  if (pass.all_answered.waitForNs(kLongestWaitNs) == WaitResult::kSignalled) return;
  const auto in_flight = copyInFlight();
  logTrace("%s timed out waiting for: %@", "startOperation",
           Value(Array(in_flight.begin(), in_flight.end())));
}

}  // namespace spacekeep
