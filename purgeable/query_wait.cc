// The short wait for services that have been asked and have not answered yet.
#include "purgeable/purgeable_operation.h"
#include "support/logging/log.h"
#include "support/queues/concurrent_queue.h"
#include "support/runtime/runtime.h"

namespace spacekeep {
namespace {

constexpr std::uint64_t kPollNs = 10'000'000;
constexpr std::uint64_t kTicks = 15;
constexpr std::uint64_t kExtensionTick = 14;
constexpr int kMaxExtensions = 5;
constexpr std::int32_t kExtendedUrgency = 4;  // the most aggressive level is worth more patience

void sleepOnWorker(std::uint64_t duration_ns) {
  const BlockingRegion waiting;
  rt::sleepNs(duration_ns);
}

}  // namespace

// An extension starts again at tick 1, so it is worth 14 ticks: at most 15 sleeps, or 15 + 5 x 14
// at the most aggressive urgency.
void SpacekeepPurgeableOperation::waitForServices() {
  logTrace("%s ^^^waiting for a little bit", "startOperation");
  int extensions = kMaxExtensions;
  std::uint64_t tick = 0;
  while (tick < kTicks) {
    if (nobodyInFlight()) {
      logTrace("%s ^^^beat the timeout, woohoo!", "startOperation");
      break;
    }
    logTrace("%s --------- %s --------- %llu ---------", "startOperation",
             tick % 2 == 0 ? "tick" : "tock", tick);
    sleepOnWorker(kPollNs);
    if (urgencyLimit() == kExtendedUrgency && extensions != 0 && tick == kExtensionTick) {
      logTrace("%s maxExtensions: %d", "startOperation", extensions);
      --extensions;
      tick = 1;
    } else {
      ++tick;
    }
  }
  const auto in_flight = copyInFlight();
  logTrace("%s ^^^done waiting, inFlight: %@", "startOperation",
           Value(Array(in_flight.begin(), in_flight.end())));
}

bool SpacekeepPurgeableOperation::nobodyInFlight() const { return inFlightCount() == 0; }

}  // namespace spacekeep
