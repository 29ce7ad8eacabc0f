// Thread safety: every member may be called from any thread; setWatchdogProbe before park().
//
// The outside events on Linux, all from one event loop thread.
#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "support/events/daily_activity.h"
#include "support/events/events.h"
#include "support/events/linux/event_loop.h"
#include "support/events/linux/linux_keep_alive.h"
#include "support/events/low_space_stream.h"
#include "support/queues/concurrent_queue.h"
#include "support/runtime/runtime.h"
#include "support/volumes/space_source.h"

namespace spacekeep {

/// The one stream there is: low space on local volumes.
inline constexpr const char* kVolumeEventStream = "com.quorvel.dispatch.vfs";
/// Posted once the daemon is open for business; tells the service manager so.
inline constexpr const char* kLaunchedNotification = "com.quorvel.spacekeep.launched";

class LinuxEventSources final : public EventSources {
 public:
  struct Options {
    std::vector<std::string> launch_directories;  ///< of "<activity>.plist", the first one wins
    std::string state_directory;  ///< of "<activity>.run", the memory of its last run
    std::string power_supply_directory = "/sys/class/power_supply";
    std::string mount_table_path = "/proc/self/mountinfo";
    std::string system_bus_socket = "/run/dbus/system_bus_socket";
  };
  /// Whether the daemon still works, found out within `wait_ns`.
  using WatchdogProbe = std::function<bool(std::uint64_t wait_ns)>;

  /// `global` and `space` must outlive it. It stops the loop when it ends.
  LinuxEventSources(std::shared_ptr<EventLoop> loop, ConcurrentQueue& global, SpaceSource& space,
                    Options options);
  ~LinuxEventSources() override;

  void registerActivity(const std::string& name, ActivityHandler handler) override;
  void setStreamHandler(const std::string& stream, ConcurrentQueue& queue,
                        StreamHandler handler) override;
  void installTerminationHandler(void (*handler)(int)) override;
  [[nodiscard]] int postNotification(const std::string& name) override;
  /// Where the service manager wants signs of life (WATCHDOG_USEC, sd_watchdog_enabled(3)), park()
  /// asks the probe three times per watchdog period and passes on only a good answer. Without a
  /// probe every answer is good.
  void park() override;

  void setWatchdogProbe(WatchdogProbe probe) { probe_ = std::move(probe); }
  [[nodiscard]] KeepAlive& keepAlive() { return keep_alive_; }

 private:
  void watchMountTable();
  void lookAtVolumesNow();

  ConcurrentQueue& global_;
  SpaceSource& space_;
  const Options options_;
  const std::shared_ptr<EventLoop> loop_;
  LinuxKeepAlive keep_alive_;
  const int mount_table_;  // open for its change signal, -1 when that failed
  WatchdogProbe probe_;
  rt::Mutex mutex_;
  // Protected by mutex_.
  std::vector<std::shared_ptr<DailyActivity>> activities_;
  std::vector<std::unique_ptr<LowSpaceStream>> streams_;
};

}  // namespace spacekeep
