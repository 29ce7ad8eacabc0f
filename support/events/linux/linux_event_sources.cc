#include "support/events/linux/linux_event_sources.h"

#include <fcntl.h>
#include <sys/epoll.h>
#include <systemd/sd-daemon.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <cstring>
#include <mutex>
#include <utility>

#include "support/events/linux/event_files.h"
#include "support/events/linux/linux_activity_host.h"
#include "support/events/linux/system_bus.h"
#include "support/logging/log.h"
#include "support/queues/waiting.h"

namespace spacekeep {
namespace {

[[noreturn]] void waitForGood() {
  for (;;) ::pause();
}

[[noreturn]] void keepWatchdogQuiet(std::uint64_t period_usec,
                                    const LinuxEventSources::WatchdogProbe& probe) {
  const std::uint64_t tick_ns = period_usec * 1000 / 3;
  for (bool was_good = true;;) {
    const std::uint64_t asked_at = bootClockNs();
    const bool good = !probe || probe(tick_ns);
    if (good) {
      sd_notify(0, "WATCHDOG=1");
    } else if (was_good) {
      logProblem("%s the daemon's queues do not answer, the watchdog will end it", "park");
    }
    was_good = good;
    const std::uint64_t used_ns = bootClockNs() - asked_at;
    if (used_ns < tick_ns) rt::sleepNs(tick_ns - used_ns);
  }
}

}  // namespace

LinuxEventSources::LinuxEventSources(std::shared_ptr<EventLoop> loop, ConcurrentQueue& global,
                                     SpaceSource& space, Options options)
    : global_(global),
      space_(space),
      options_(std::move(options)),
      loop_(std::move(loop)),
      keep_alive_(loop_, global,
                  [socket = options_.system_bus_socket] {
                    return inhibitSleep(socket, "Freeing storage space");
                  }),
      mount_table_(::open(options_.mount_table_path.c_str(), O_RDONLY | O_CLOEXEC)) {
  // Before any stream looks. What changed before the watch is told once, to epoll_ctl(), and not by
  // epoll_wait(), so a mount between a first look and a later watch would go unnoticed.
  CountingSemaphore watched(0);
  loop_->post([this, &watched] {
    watchMountTable();
    watched.signal();
  });
  watched.wait();
  space_.setThresholdsChangedHandler([this] { lookAtVolumesNow(); });
}

LinuxEventSources::~LinuxEventSources() {
  space_.setThresholdsChangedHandler({});
  loop_->stop();
  streams_.clear();
  activities_.clear();
  if (mount_table_ >= 0) ::close(mount_table_);
}

void LinuxEventSources::registerActivity(const std::string& name, ActivityHandler handler) {
  const auto schedule = loadSchedule(options_.launch_directories, name);
  if (!schedule) return;
  auto host = std::make_shared<LinuxActivityHost>(
      loop_,
      LinuxActivityHost::Options{.record_path = options_.state_directory + "/" + name + ".run",
                                 .power_supply_directory = options_.power_supply_directory});
  const std::scoped_lock lock(mutex_);
  activities_.push_back(
      std::make_shared<DailyActivity>(std::move(host), global_, std::move(handler),
                                      DailyActivity::Options{.name = name, .schedule = *schedule}));
  activities_.back()->start();
}

void LinuxEventSources::setStreamHandler(const std::string& stream, ConcurrentQueue& queue,
                                         StreamHandler handler) {
  if (stream != kVolumeEventStream) {
    logProblem("%s there is no event stream %s", "setStreamHandler", stream);
    return;
  }
  const std::scoped_lock lock(mutex_);
  streams_.push_back(std::make_unique<LowSpaceStream>(space_, queue, std::move(handler)));
}

void LinuxEventSources::installTerminationHandler(void (*handler)(int)) {
  struct sigaction action {};
  action.sa_handler = handler;
  action.sa_flags = SA_RESTART;
  ::sigemptyset(&action.sa_mask);
  if (::sigaction(SIGTERM, &action, nullptr) < 0) {
    logProblem("%s cannot handle SIGTERM: %s", "installTerminationHandler", std::strerror(errno));
  }
}

int LinuxEventSources::postNotification(const std::string& name) {
  // The signal is for whoever listens, nobody need, and the bus may be slow: not awaited.
  global_.async([socket = options_.system_bus_socket, name] {
    const int error = emitSystemSignal(socket, name);
    if (error == ENOENT) {
      logTrace("%s no system bus to send %s on", "postNotification", name);
    } else if (error != 0) {
      logProblem("%s no signal %s on the system bus: %s", "postNotification", name,
                 std::strerror(error));
    }
  });
  if (name != kLaunchedNotification) return 0;
  const int told = sd_notify(0, "READY=1");
  return told < 0 ? -told : 0;
}

void LinuxEventSources::park() {
  std::uint64_t period_usec = 0;
  if (sd_watchdog_enabled(0, &period_usec) > 0) keepWatchdogQuiet(period_usec, probe_);
  waitForGood();
}

void LinuxEventSources::watchMountTable() {
  const bool watched = mount_table_ >= 0 && loop_->watch(mount_table_, EPOLLPRI | EPOLLET,
                                                         [this] { lookAtVolumesNow(); });
  if (!watched) {
    logProblem("%s cannot watch %s, new mounts are noticed at the next look", "watchMountTable",
               options_.mount_table_path);
  }
}

void LinuxEventSources::lookAtVolumesNow() {
  const std::scoped_lock lock(mutex_);
  for (const auto& stream : streams_) stream->lookNow();
}

}  // namespace spacekeep
