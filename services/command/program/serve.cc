#include <fmt/core.h>
#include <grp.h>
#include <pwd.h>
#include <spacekeep/service.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <cstdio>
#include <optional>
#include <set>

#include "services/cachedir/program/stop_signals.h"
#include "services/command/program/modes.h"
#include "services/command/program/set_service.h"

namespace spacekeep::command {
namespace {

using sdk::HostState;
using sdk::HostStatus;
using sdk::ServiceHost;

constexpr const char* kServicesGroup = "spacekeep-services";
constexpr const char* kIdOfSeveral = "com.quorvel.spacekeep.caches";

constexpr std::size_t kEntryBytes = 64 * 1024;

std::optional<gid_t> numberOfGroup(const char* name) {
  std::vector<char> room(kEntryBytes);
  group entry{};
  group* found = nullptr;
  if (::getgrnam_r(name, &entry, room.data(), room.size(), &found) != 0 || found == nullptr) {
    return std::nullopt;
  }
  return entry.gr_gid;
}

std::optional<uid_t> numberOfUser(const std::string& name) {
  std::vector<char> room(kEntryBytes);
  passwd entry{};
  passwd* found = nullptr;
  if (::getpwnam_r(name.c_str(), &entry, room.data(), room.size(), &found) != 0 ||
      found == nullptr) {
    return std::nullopt;
  }
  return entry.pw_uid;
}

/// What the daemon sees of this process: the groups that it was started with, not those that the
/// user has been given since.
bool isInServicesGroup() {
  const std::optional<gid_t> wanted = numberOfGroup(kServicesGroup);
  if (!wanted) return false;
  std::vector<gid_t> groups(static_cast<std::size_t>(std::max(0, ::getgroups(0, nullptr))));
  const int count = ::getgroups(static_cast<int>(groups.size()), groups.data());
  groups.resize(static_cast<std::size_t>(std::max(0, count)));
  return ::getegid() == *wanted || std::ranges::count(groups, *wanted) > 0;
}

std::string adviceFor(const HostStatus& status) {
  if (status.state != HostState::kWaiting || ::geteuid() == 0 || isInServicesGroup()) return "";
  return fmt::format(
      " (a user's service needs the group {0}, which this process is not in. An administrator "
      "gives it by: adduser USER {0}; then log in anew)",
      kServicesGroup);
}

/// fmt::print(stderr, ...) throws where nobody reads any more; a service goes on.
void complain(const std::string& text) {
  std::fprintf(stderr, "spacekeep-command: %s\n", text.c_str());
}

void printStatus(const HostStatus& status) {
  complain(fmt::format("{}{}{}{}", sdk::textOf(status.state), status.text.empty() ? "" : ": ",
                       status.text, adviceFor(status)));
}

struct Presence {
  std::string id;
  bool purges = false;
  bool periodic = false;
  std::set<std::string> notifications;
};

Presence presenceOf(const std::vector<Rule>& rules, const UserFolders* folders,
                    const Options& options) {
  Presence presence;
  std::size_t enabled = 0;
  for (const Rule& rule : rules) {
    if (!rule.enabled) continue;
    presence.id = ++enabled == 1 ? rule.service_id : kIdOfSeveral;
    presence.purges = presence.purges || rule.purges;
    presence.periodic = presence.periodic || rule.periodic;
    presence.notifications.insert(rule.notifications.begin(), rule.notifications.end());
  }
  if (enabled == 0) presence.id = kIdOfSeveral;
  if (!options.id.empty()) presence.id = options.id;
  // Two users' services of one kind are two services.
  if (folders != nullptr) presence.id += "." + std::to_string(folders->uid);
  return presence;
}

sdk::Result<ServiceHost> checkIn(const Presence& presence, std::shared_ptr<CacheSet> set,
                                 const Options& options) {
  sdk::CheckInOptions how;
  how.handlers = sdk::Handlers::kSideBySide;  // an estimate need not wait for a purge
  how.on_status = printStatus;
  how.socket_path = options.socket_path;
  how.does_purge = presence.purges;
  how.does_periodic = presence.periodic;
  how.notifications.assign(presence.notifications.begin(), presence.notifications.end());
  return ServiceHost::checkIn(presence.id, std::make_shared<SetService>(std::move(set)), how);
}

sdk::Result<ServiceHost> serveSocket(std::shared_ptr<CacheSet> set, const Options& options) {
  sdk::SocketOptions how;
  how.handlers = sdk::Handlers::kSideBySide;
  how.on_status = printStatus;
  if (!options.allowed_user.empty()) {
    how.allowed_uid = numberOfUser(options.allowed_user);
    if (!how.allowed_uid) {
      return sdk::Error{sdk::ErrorKind::kInvalidArgument,
                        "--allow-user " + options.allowed_user + ": there is no such user"};
    }
  }
  if (options.stop_when_idle_seconds) {
    how.stop_when_idle = std::chrono::seconds(*options.stop_when_idle_seconds);
  }
  return ServiceHost::serveSocket(std::make_shared<SetService>(std::move(set)), how);
}

}  // namespace

ExitCode serve(std::vector<Rule> rules, const UserFolders* folders, const Options& options) {
  const Presence presence = presenceOf(rules, folders, options);
  const bool by_check_in = options.mode == Mode::kCheckIn;
  auto set = std::make_shared<CacheSet>(std::move(rules), folders);
  auto host = by_check_in ? checkIn(presence, std::move(set), options)
                          : serveSocket(std::move(set), options);
  if (!host) {
    complain(host.error().text + (by_check_in ? "" : " (or serve with --check-in)"));
    return ExitCode::kCannotServe;
  }
  std::atomic<bool> told_to_stop{false};
  {
    const cachedir::StopSignals signals([&host, &told_to_stop] {
      told_to_stop = true;
      host->stop();
    });
    host->waitUntilStopped();
  }
  const bool idle_end = !by_check_in && options.stop_when_idle_seconds.has_value();
  return told_to_stop || idle_end ? ExitCode::kDone : ExitCode::kCannotServe;
}

}  // namespace spacekeep::command
