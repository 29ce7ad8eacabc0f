#include "ctl/doctor/place.h"

#include <fmt/core.h>
#include <pwd.h>
#include <unistd.h>

#include <utility>
#include <vector>

#include "support/access/linux/load_rules.h"

namespace spacekeep::ctl::doctor {
namespace {

/// As which the unit runs the daemon.
constexpr const char* kDaemonUser = "_spacekeep";

LinuxPaths pathsBelow(const std::string& root) {
  LinuxPaths paths;
  for (std::string* path :
       {&paths.socket, &paths.services_directory, &paths.metrics_file, &paths.state_directory,
        &paths.vendor_directory, &paths.administrator_directory, &paths.log_level_file,
        &paths.mount_table, &paths.power_supply_directory, &paths.system_bus_socket}) {
    *path = root + *path;
  }
  return paths;
}

}  // namespace

Place placeAt(std::string root, const std::string& socket) {
  while (!root.empty() && root.back() == '/') root.pop_back();
  Place place{.root = root, .paths = pathsBelow(root), .socket = socket};
  if (place.socket.empty()) place.socket = place.paths.socket;
  place.own_user = place.isThisSystem()
                       ? access::systemNameLookup().user(kDaemonUser).number.value_or(0)
                       : geteuid();
  return place;
}

std::string userText(uid_t user) {
  passwd entry = {};
  passwd* found = nullptr;
  std::vector<char> buffer(16'384);
  if (getpwuid_r(user, &entry, buffer.data(), buffer.size(), &found) == 0 && found != nullptr) {
    return found->pw_name;
  }
  return fmt::format("user {}", user);
}

std::string modeText(mode_t mode) { return fmt::format("{:04o}", mode & 07777); }

std::optional<struct stat> statusOf(const std::string& path) {
  struct stat status {};
  if (stat(path.c_str(), &status) != 0) return std::nullopt;
  return status;
}

std::optional<std::string> distrust(const Place& place, const struct stat& status) {
  if (!place.isTrusted(status.st_uid)) {
    return fmt::format("belongs to {}", userText(status.st_uid));
  }
  if ((status.st_mode & (S_IWGRP | S_IWOTH)) != 0) {
    return fmt::format("can be written by others than {} (mode {})", userText(status.st_uid),
                       modeText(status.st_mode));
  }
  return std::nullopt;
}

}  // namespace spacekeep::ctl::doctor
