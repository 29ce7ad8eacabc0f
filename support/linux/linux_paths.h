// Thread safety: a plain value.
//
// Every place in the file system that the daemon uses. The values are the ones of production; tests
// change them.
#pragma once

#include <string>

namespace spacekeep {

struct LinuxPaths {
  std::string socket = "/run/spacekeep/spacekeep.sock";
  std::string services_directory = "/run/spacekeep/services";
  std::string metrics_file = "/run/spacekeep/metrics.prom";
  /// Preferences suites and the run times of activities. Only the daemon writes here.
  std::string state_directory = "/var/lib/spacekeep";
  /// "entitlements.d" and "launch.d" as they were shipped, and as the administrator wants them.
  std::string vendor_directory = "/usr/lib/spacekeep";
  std::string administrator_directory = "/etc/spacekeep";
  std::string log_level_file = "/etc/spacekeep/log.plist";

  std::string mount_table = "/proc/self/mountinfo";
  std::string power_supply_directory = "/sys/class/power_supply";
  std::string system_bus_socket = "/run/dbus/system_bus_socket";
};

}  // namespace spacekeep
