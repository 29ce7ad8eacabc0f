#include "support/linux/linux_platform.h"

#include <utility>

#include "support/access/linux/load_rules.h"
#include "support/history/linux/sqlite_history.h"
#include "support/ipc/linux/bus_listener.h"
#include "support/ipc/linux/sockets.h"
#include "support/linux/process_limits.h"
#include "support/linux/token.h"
#include "support/logging/log.h"
#include "support/preferences/linux/sqlite_suite.h"

namespace spacekeep {
namespace {

/// Everybody may connect as far as the file system goes: who gets in is for the entitlements to
/// say.
constexpr mode_t kSocketMode = 0666;

/// Where programs find it that look on the system bus.
constexpr const char* kBusName = "com.quorvel.Spacekeep";

/// Stands in where there is no socket: the daemon goes on with what needs no clients.
class DeafListener final : public ipc::Listener {
 public:
  void setRequiredEntitlement(std::string) override {}
  void resume() override {}
};

std::vector<access::Rule> loadAllRules(const LinuxPaths& paths) {
  return access::loadRules(paths.vendor_directory + "/entitlements.d",
                           paths.administrator_directory + "/entitlements.d",
                           access::systemNameLookup());
}

OpenMetricsStatistics::Schedule scheduleOn(std::shared_ptr<EventLoop> loop) {
  return [loop = std::move(loop)](std::uint64_t delay_ns, std::function<void()> task) {
    loop->postAfter(delay_ns, std::move(task));
  };
}

/// How soon it is looked whether there is room for the reserve again, while it is given away.
constexpr std::uint64_t kReserveRetryNs = 300'000'000'000;

void takeReserveWhenThereIsRoom(const std::shared_ptr<EventLoop>& loop,
                                const std::shared_ptr<ReserveFile>& reserve) {
  // The loop drops what is delayed when it stops, so it may be held by its own callback.
  loop->postAfter(kReserveRetryNs, [loop, reserve] {
    if (!reserve->take()) takeReserveWhenThereIsRoom(loop, reserve);
  });
}

LinuxEventSources::Options eventOptions(const LinuxPaths& paths) {
  return {.launch_directories = {paths.administrator_directory + "/launch.d",
                                 paths.vendor_directory + "/launch.d"},
          .state_directory = paths.state_directory,
          .power_supply_directory = paths.power_supply_directory,
          .mount_table_path = paths.mount_table,
          .system_bus_socket = paths.system_bus_socket};
}

}  // namespace

LinuxPlatform::LinuxPlatform(const ipc::InterfaceDescription& service_interface, LinuxPaths paths)
    : paths_(std::move(paths)),
      global_({.on_less_to_do = &giveBackFreeMemory}),
      loop_(std::make_shared<EventLoop>()),
      reserve_(std::make_shared<ReserveFile>(paths_.state_directory + "/reserve")),
      volumes_(paths_.mount_table),
      access_(loadAllRules(paths_)),
      statistics_(paths_.metrics_file, scheduleOn(loop_)),
      connector_(ipc_loop_, global_, paths_.services_directory),
      services_(global_, connector_, service_interface),
      events_(loop_, global_, volumes_, eventOptions(paths_)),
      platform_(makePlatform()) {}

Platform LinuxPlatform::makePlatform() {
  return {.global = global_,
          .volumes = volumes_,
          .access = access_,
          .statistics = statistics_,
          .files = files_,
          .connector = connector_,
          .services = services_,
          .openPreferencesSuite = [this](const std::string& name) { return openSuite(name); },
          .makeListener =
              [this](ipc::ServedInterface interface) { return makeListener(std::move(interface)); },
          .after =
              [this](std::uint64_t delay_ns, Task task) {
                loop_->postAfter(delay_ns, [this, task = std::move(task)]() mutable {
                  global_.async(std::move(task));
                });
              },
          .createSpacekeepToken = [] { return Value(randomToken()); },
          .openHistory = [this]() -> std::unique_ptr<HistoryStore> {
            return SqliteHistory::open(paths_.state_directory);
          }};
}

std::unique_ptr<PreferencesSuite> LinuxPlatform::openSuite(const std::string& name) {
  SqliteSuiteOptions options;
  options.make_room = [loop = loop_, reserve = reserve_] {
    if (!reserve->giveBack()) return false;
    takeReserveWhenThereIsRoom(loop, reserve);
    return true;
  };
  auto suite = SqliteSuite::open(paths_.state_directory, name, std::move(options));
  // Opening makes the directory. Without the room for a reserve now it is tried again later.
  if (!reserve_->take()) takeReserveWhenThereIsRoom(loop_, reserve_);
  return suite;
}

std::unique_ptr<ipc::Listener> LinuxPlatform::makeListener(ipc::ServedInterface interface) {
  ipc::SharedDescriptor listening = ipc::listeningSocketFromServiceManager();
  std::string why;
  if (listening == nullptr) listening = ipc::bindListeningSocket(paths_.socket, kSocketMode, why);
  if (listening == nullptr) {
    logProblem("%s cannot listen on %s, clients cannot connect: %s", "makeListener", paths_.socket,
               why);
    return std::make_unique<DeafListener>();
  }
  ipc::ServerOptions options;
  options.bus = {.socket = paths_.system_bus_socket, .name = kBusName};
  return std::make_unique<ipc::BusListener>(ipc_loop_, global_, access_, std::move(listening),
                                            std::move(interface), std::move(options));
}

void LinuxPlatform::watchQueues(std::vector<std::shared_ptr<SerialQueue>> queues) {
  events_.setWatchdogProbe([probe = std::make_shared<QueueProbe>(std::move(queues))](
                               std::uint64_t wait_ns) { return probe->answersWithin(wait_ns); });
}

}  // namespace spacekeep
