#include <spacekeep/service.h>

#include <atomic>
#include <cstdio>

#include "services/cachedir/program/cache_service.h"
#include "services/cachedir/program/modes.h"
#include "services/cachedir/program/stop_signals.h"

namespace spacekeep::cachedir {
namespace {

using sdk::HostState;
using sdk::HostStatus;
using sdk::ServiceHost;

void printStatus(const HostStatus& status) {
  std::fprintf(stderr, "spacekeep-cachedir: %s%s%s\n", sdk::textOf(status.state),
               status.text.empty() ? "" : ": ", status.text.c_str());
}

sdk::Result<ServiceHost> checkIn(const std::shared_ptr<CacheCleaner>& cleaner,
                                 const Options& options) {
  const Rules& rules = cleaner->rules();
  sdk::CheckInOptions how;
  how.handlers = sdk::Handlers::kSideBySide;  // an estimate need not wait for a purge
  how.on_status = printStatus;
  how.socket_path = options.socket_path;
  how.does_purge = rules.purges;
  how.does_periodic = rules.periodic;
  how.notifications = rules.notifications;
  return ServiceHost::checkIn(rules.service_id, std::make_shared<CacheService>(cleaner), how);
}

sdk::Result<ServiceHost> serveSocket(const std::shared_ptr<CacheCleaner>& cleaner,
                                     const Options& options) {
  sdk::SocketOptions how;
  how.handlers = sdk::Handlers::kSideBySide;
  how.on_status = printStatus;
  if (options.stop_when_idle_seconds) {
    how.stop_when_idle = std::chrono::seconds(*options.stop_when_idle_seconds);
  }
  return ServiceHost::serveSocket(std::make_shared<CacheService>(cleaner), how);
}

}  // namespace

ExitCode serve(const std::shared_ptr<CacheCleaner>& cleaner, const Options& options) {
  const bool by_check_in = options.mode == Mode::kCheckIn;
  auto host = by_check_in ? checkIn(cleaner, options) : serveSocket(cleaner, options);
  if (!host) {
    std::fprintf(stderr, "spacekeep-cachedir: %s%s\n", host.error().text.c_str(),
                 by_check_in ? "" : " (or serve with --check-in)");
    return ExitCode::kCannotServe;
  }
  std::atomic<bool> told_to_stop{false};
  {
    const StopSignals signals([&host, &told_to_stop] {
      told_to_stop = true;
      host->stop();
    });
    host->waitUntilStopped();
  }
  const bool idle_end = !by_check_in && options.stop_when_idle_seconds.has_value();
  return told_to_stop || idle_end ? ExitCode::kDone : ExitCode::kCannotServe;
}

}  // namespace spacekeep::cachedir
