// Thread safety: make and destroy it on one thread, one at a time in a process; everything it hands
// out may be used from any thread.
//
// A whole small world for the daemon to live in. A test sets it up, acts, and looks at it:
//
//   World world;
//   world.volumes().add("/", 1000, 100);
//   auto cache = world.declareService("cache", ownsBytes("/", 500), {{"PURGE", true}});
//   auto daemon = Spacekeep::create(world.platform());
//   auto answer = world.call(world.client("c", {"PURGE_ENTITLEMENT"}), "clientPurge",
//   {...})->wait(); EXPECT_EQ(world.volumes().freeBytes("/"), ...); world.shutDown();  // before
//   the daemon goes
#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <set>
#include <string>
#include <vector>

#include "sim/world/delay_line.h"
#include "sim/world/in_memory_files.h"
#include "sim/world/in_memory_history.h"
#include "sim/world/in_memory_preferences.h"
#include "sim/world/log_capture.h"
#include "sim/world/recording_statistics.h"
#include "sim/world/simulated_connector.h"
#include "sim/world/simulated_events.h"
#include "sim/world/simulated_listener.h"
#include "sim/world/simulated_peer.h"
#include "sim/world/simulated_service.h"
#include "sim/world/simulated_volumes.h"
#include "sim/world/trace.h"
#include "support/platform.h"

namespace spacekeep::sim {

class World {
 public:
  struct Options {
    std::size_t parallelism = 4;  ///< of the global queue
    TraceStart trace{};           ///< where the trace of an earlier world is taken up
    bool keeps_history = false;
  };

  World();
  explicit World(Options options);
  /// Shuts down if that has not been done.
  ~World();
  World(const World&) = delete;
  World& operator=(const World&) = delete;

  /// The daemon's view of this world. The members live as long as the world.
  [[nodiscard]] Platform& platform() { return platform_; }

  [[nodiscard]] ConcurrentQueue& global() { return *global_; }
  [[nodiscard]] Trace& trace() { return trace_; }
  [[nodiscard]] LogHandle& logHandle() { return log_capture_.handle(); }
  [[nodiscard]] SimulatedVolumes& volumes() { return volumes_; }
  [[nodiscard]] SimulatedAccess& access() { return access_; }
  [[nodiscard]] RecordingStatistics& statistics() { return statistics_; }
  [[nodiscard]] InMemoryFiles& files() { return files_; }
  [[nodiscard]] InMemoryDisk& disk() { return disk_; }
  [[nodiscard]] InMemoryHistory& history() { return history_; }
  [[nodiscard]] SimulatedConnector& connector() { return connector_; }
  [[nodiscard]] SimulatedListener& listener() { return listener_; }
  [[nodiscard]] SimulatedEventSources& events() { return events_; }
  [[nodiscard]] CountingKeepAlive& keepAlive() { return keep_alive_; }

  /// A service process that nobody knows of yet.
  std::shared_ptr<SimulatedService> addService(const std::string& id,
                                               ServiceBehaviour behaviour = {});
  /// A service process with a descriptor file that holds `keys` besides its ID. Before the daemon
  /// is made, which reads the files once.
  std::shared_ptr<SimulatedService> declareService(const std::string& id,
                                                   ServiceBehaviour behaviour,
                                                   Dictionary keys = {});
  [[nodiscard]] std::vector<std::shared_ptr<SimulatedService>> services() const;
  /// What the service passes at check-in.
  [[nodiscard]] ipc::SharedDescriptor endpointOf(const std::shared_ptr<SimulatedService>& service);

  /// A client process; it always holds "CLIENT_ENTITLEMENT" in addition.
  [[nodiscard]] std::shared_ptr<SimulatedPeer> client(
      const std::string& name, std::set<std::string, std::less<>> entitlements = {});
  /// Calls the daemon as that peer. See SimulatedListener::call.
  std::shared_ptr<ClientCall> call(const std::shared_ptr<SimulatedPeer>& peer,
                                   std::string_view member, ipc::Arguments arguments);
  /// Checks the service in, as a peer of its own that holds "SERVICE_ENTITLEMENT".
  std::shared_ptr<ClientCall> checkIn(const std::shared_ptr<SimulatedService>& service,
                                      const Dictionary& info);

  /// Runs `task` on the global queue once that much time has passed.
  void after(std::uint64_t delay_ns, Task task);
  /// Polls until `condition` holds, for at most `limit_ns`. Answers whether it holds.
  [[nodiscard]] bool eventually(const std::function<bool()>& condition,
                                std::uint64_t limit_ns = 60'000'000'000);
  /// Virtual nanoseconds since the world began.
  [[nodiscard]] std::uint64_t nowNs() const { return trace_.nowNs(); }

  /// Ends everything that could keep the daemon's queues busy or its objects alive: held pings are
  /// answered, delayed tasks dropped, connections forgotten. Returns when the queues are idle.
  void shutDown();

 private:
  [[nodiscard]] Platform makePlatform(bool keeps_history);
  [[nodiscard]] std::unique_ptr<PreferencesSuite> openSuite(const std::string& name);

  Trace trace_;
  LogCapture log_capture_;
  std::unique_ptr<ConcurrentQueue> global_;
  DelayLine delays_;
  SimulatedVolumes volumes_;
  SimulatedAccess access_;
  RecordingStatistics statistics_;
  InMemoryFiles files_;
  InMemoryDisk disk_;
  InMemoryHistory history_;
  SimulatedConnector connector_;
  SimulatedListener listener_;
  SimulatedEventSources events_;
  CountingKeepAlive keep_alive_;
  ServiceCaller caller_;
  Platform platform_;
  mutable rt::Mutex mutex_;
  // Protected by mutex_.
  std::vector<std::shared_ptr<SimulatedService>> services_;
  bool shut_down_ = false;
  std::uint64_t tokens_ = 0;
};

}  // namespace spacekeep::sim
