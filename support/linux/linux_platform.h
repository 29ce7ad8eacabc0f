// Thread safety: constructed and destroyed on the main thread; what it hands out states its own.
//
// The production platform: everything the daemon stands on, made from the Linux implementations.
#pragma once

#include <memory>
#include <string>
#include <vector>

#include "support/access/entitlement_access.h"
#include "support/events/linux/event_loop.h"
#include "support/events/linux/linux_event_sources.h"
#include "support/events/queue_probe.h"
#include "support/files/linux/linux_directory_reader.h"
#include "support/ipc/linux/connector.h"
#include "support/ipc/linux/ipc_loop.h"
#include "support/linux/linux_paths.h"
#include "support/linux/reserve_file.h"
#include "support/platform.h"
#include "support/queues/concurrent_queue.h"
#include "support/queues/serial_queue.h"
#include "support/services/call_service.h"
#include "support/statistics/linux/openmetrics_statistics.h"
#include "support/volumes/linux/linux_volumes.h"

namespace spacekeep {

class LinuxPlatform {
 public:
  /// Starts the threads for IPC and events; nothing is served and no event comes before somebody
  /// asks for it.
  LinuxPlatform(const ipc::InterfaceDescription& service_interface, LinuxPaths paths = {});
  LinuxPlatform(const LinuxPlatform&) = delete;
  LinuxPlatform& operator=(const LinuxPlatform&) = delete;

  /// Good as long as this object.
  [[nodiscard]] Platform& platform() { return platform_; }
  [[nodiscard]] LinuxEventSources& events() { return events_; }
  [[nodiscard]] KeepAlive& keepAlive() { return events_.keepAlive(); }

  /// The watchdog is kept quiet only while these answer (QueueProbe says which belong here). Before
  /// events().park().
  void watchQueues(std::vector<std::shared_ptr<SerialQueue>> queues);

 private:
  [[nodiscard]] Platform makePlatform();
  [[nodiscard]] std::unique_ptr<PreferencesSuite> openSuite(const std::string& name);
  [[nodiscard]] std::unique_ptr<ipc::Listener> makeListener(ipc::ServedInterface interface);

  const LinuxPaths paths_;
  ConcurrentQueue global_;
  const std::shared_ptr<EventLoop> loop_;
  const std::shared_ptr<ReserveFile> reserve_;
  ipc::IpcLoop ipc_loop_;
  LinuxVolumes volumes_;
  access::EntitlementAccess access_;
  OpenMetricsStatistics statistics_;
  LinuxDirectoryReader files_;
  ipc::LinuxConnector connector_;
  ServiceCaller services_;
  LinuxEventSources events_;
  Platform platform_;
};

}  // namespace spacekeep
