// One service's part in a query, from the call to the booking of its answer.
#include <utility>

#include "operations/info_keys.h"
#include "purgeable/purgeable_operation.h"
#include "registry/service_protocol.h"
#include "support/logging/log.h"
#include "support/runtime/runtime.h"
#include "support/timebase.h"

namespace spacekeep {
namespace {

constexpr double kNsPerSecond = 1'000'000'000.0;

}  // namespace

void SpacekeepPurgeableOperation::queryService(
    const std::shared_ptr<SKService>& service,
    const std::shared_ptr<const Dictionary>& working_copy) {
  const std::string& service_id = service->ID;
  platform().services.CallServiceAsync(
      service,
      [self = self(), service_id, working_copy](std::shared_ptr<ipc::RemoteProxy> proxy,
                                                ServiceCaller::Done done) {
        logTrace("%s ^^^asking %@ for urgency %d", "startOperation", service_id,
                 self->urgencyLimit());
        const std::uint64_t start_ticks = rt::ticks();
        SpacekeepServiceProtocol(std::move(proxy))
            .servicePurgeable(self->urgencyLimit(), *working_copy,
                              [self, service_id, working_copy, start_ticks,
                               done = std::move(done)](ipc::OptionalDictionary answer) {
                                self->bookAnswer(service_id, *working_copy, start_ticks, answer);
                                done();
                                self->updateInFlight(service_id, false);
                              });
      },
      [self = self(), service_id] {
        logTrace("%s connection invalidated: %@", "startOperation", service_id);
        self->updateInFlight(service_id, false);
      });
}

// The answer is handed over to the memory before the service leaves flight: whoever has left by the
// second pass is counted in it.
void SpacekeepPurgeableOperation::bookAnswer(const std::string& service_id,
                                             const Dictionary& working_copy,
                                             std::uint64_t start_ticks,
                                             const ipc::OptionalDictionary& answer) {
  const double elapsed_ns = elapsedNs(start_ticks, rt::ticks());
  platform().statistics.addDistributionStat(elapsed_ns, kStatisticsDomain,
                                            service_id + "_purgeableElapsedNanoseconds");
  logTrace("%s %@ took %f seconds, returned: %@", "startOperation", service_id,
           elapsed_ns / kNsPerSecond, answer ? &*answer : nullptr);
  updateServiceStats(service_id, entryFor(service_id, working_copy, answer));
}

// A service that opts out is recorded with what it said all the same.
Dictionary SpacekeepPurgeableOperation::entryFor(const std::string& service_id,
                                                 const Dictionary& working_copy,
                                                 const ipc::OptionalDictionary& answer) {
  Dictionary entry;
  entry.set(keys::kAmount, 0);
  if (!answer) {
    entry.set(keys::kVolume, *info().find(keys::kVolume));
    return entry;
  }
  // An answer that names no amount is one of nothing to give.
  if (const Value* amount = answer->find(keys::kAmount)) entry.set(keys::kAmount, *amount);
  entry.set(keys::kVolume, *working_copy.find(keys::kVolume));
  if (answer->contains(keys::kOptOut)) {
    optOutService(service_id, true);
    logTrace("%s %@ has %@, skipping", "startOperation", service_id, *answer);
  }
  return entry;
}

}  // namespace spacekeep
