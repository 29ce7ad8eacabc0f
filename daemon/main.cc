// The daemon's process: the Linux platform, put under the daemon's own start-up. It takes neither a
// command line nor environment variables of its own.
#include <cstdint>
#include <memory>
#include <vector>

#include "daemon/spacekeep.h"
#include "daemon/start_up.h"
#include "registry/service_protocol.h"
#include "support/events/queue_probe.h"
#include "support/linux/linux_platform.h"
#include "support/linux/process_limits.h"
#include "support/logging/linux/log_level.h"

namespace spacekeep {
namespace {

/// The queues whose tasks are short by design. The queues that run whole operations are left out:
/// they are busy for minutes while all is well.
std::unique_ptr<QueueProbe> probeOfShortQueues() {
  const auto daemon = Spacekeep::sharedSpacekeep();
  return std::make_unique<QueueProbe>(
      std::vector<std::shared_ptr<SerialQueue>>{daemon->collection_queue(), daemon->daemons_queue(),
                                                daemon->defaults_queue(), daemon->notify_queue()});
}

int run() {
  limitHeapArenas();
  static LogHandle log_handle;
  setUpLogging(log_handle, LinuxPaths().log_level_file);
  raiseDescriptorLimit();
  LinuxPlatform linux_platform(spacekeepServiceInterface());
  // Asked only once the daemon is parked, when its queues exist.
  linux_platform.events().setWatchdogProbe([](std::uint64_t wait_ns) {
    static const std::unique_ptr<QueueProbe> probe = probeOfShortQueues();
    return probe->answersWithin(wait_ns);
  });
  startUp(linux_platform.platform(), linux_platform.events(), linux_platform.keepAlive());
  return 0;
}

}  // namespace
}  // namespace spacekeep

int main() { return spacekeep::run(); }
