#include "daemon/start_up.h"

#include <cstdlib>
#include <cstring>
#include <memory>
#include <utility>

#include "daemon/names.h"
#include "daemon/spacekeep.h"
#include "operations/info_keys.h"
#include "support/logging/log.h"
#include "support/queues/waiting.h"
#include "support/timebase.h"

namespace spacekeep {
namespace {

constexpr const char* kFileSystemStream = "com.quorvel.dispatch.vfs";
constexpr const char* kLaunchedNotification = "com.quorvel.spacekeep.launched";

void announceLaunch(EventSources& events) {
  const int error_number = events.postNotification(kLaunchedNotification);
  if (error_number == 0) return;
  logProblem("%s Failed to post the launched notification: %s", "main",
             std::strerror(error_number));
}

void runSynchronously(ConcurrentQueue& queue, Task task) {
  const auto group = std::make_shared<TaskGroup>();
  asyncInGroup(group, queue, std::move(task));
  group->wait();
}

void performPeriodics(Platform& platform) {
  const auto daemon = Spacekeep::sharedSpacekeep();
  for (const std::string& volume : platform.volumes.getLocalVolumes()) {
    daemon->performPeriodicsWithInfo(Dictionary{{keys::kVolume, volume}});
  }
}

}  // namespace

void startUp(Platform& platform, EventSources& events, KeepAlive& keep_alive) {
  {
    const KeepAliveTransaction starting(keep_alive);
    setTimebaseConversion(rt::timebase());
    Spacekeep::setSharedPlatform(platform);
    static_cast<void>(Spacekeep::sharedSpacekeep());
    events.registerActivity(kDailyActivity, [&platform, &keep_alive](Activity& activity) {
      handleDailyActivity(platform, keep_alive, activity);
    });
    events.setStreamHandler(
        kFileSystemStream, platform.global,
        [&keep_alive](const Dictionary& event) { handleStreamEvent(keep_alive, event); });
    events.installTerminationHandler(sigterm_handler);
    announceLaunch(events);
    logTrace("%s Spacekeep, open for business!", "main");
  }
  events.park();
}

void setTimebaseConversion(const std::optional<rt::Timebase>& timebase) {
  if (!timebase) {
    logProblem("%s Failed to get timebase info\n", "main");
    return;
  }
  const double ns_per_tick =
      static_cast<double>(timebase->numerator) / static_cast<double>(timebase->denominator);
  gTimebaseConversion = ns_per_tick;
  logTrace("%s timebaseInfo:  %u / %u, gTimebaseConversion: %f", "main", timebase->numerator,
           timebase->denominator, ns_per_tick);
}

// The schedule and its criteria come with the launch configuration: nothing is set on the activity.
void handleDailyActivity(Platform& platform, KeepAlive& keep_alive, const Activity& activity) {
  const KeepAliveTransaction working(keep_alive);
  if (activity.state() != ActivityState::kRun) return;
  runSynchronously(platform.global, [&platform] { performPeriodics(platform); });
}

void handleStreamEvent(KeepAlive& keep_alive, const Dictionary& event) {
  const KeepAliveTransaction working(keep_alive);
  Spacekeep::sharedSpacekeep()->handleVFSStreamEvent(event);
}

// Purges in flight are not waited for and nothing is saved. Exit handlers are left out as well: a
// signal handler may not run them.
void sigterm_handler(int) { std::_Exit(0); }

}  // namespace spacekeep
