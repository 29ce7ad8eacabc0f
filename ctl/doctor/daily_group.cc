#include <fmt/core.h>
#include <unistd.h>

#include <cerrno>
#include <cstdint>
#include <optional>
#include <variant>

#include "ctl/doctor/groups.h"
#include "ctl/text_layout.h"
#include "daemon/names.h"
#include "support/events/linux/event_files.h"
#include "support/events/linux/linux_activity_host.h"

namespace spacekeep::ctl::doctor {
namespace {

constexpr std::uint64_t kNsPerSecond = 1'000'000'000;
constexpr std::uint64_t kSlackSeconds = 3'600;

constexpr const char* kRestart = "systemctl restart spacekeepd";

std::optional<DailySchedule> checkLaunchFile(const Place& place, Group& group) {
  const auto path = findLaunchFile({place.paths.administrator_directory + "/launch.d",
                                    place.paths.vendor_directory + "/launch.d"},
                                   kDailyActivity);
  if (!path) {
    group.problem("launch-file-missing",
                  fmt::format("there is no launch file {}.plist, so the daily pass never runs",
                              kDailyActivity),
                  fmt::format("the shipped one belongs into {}/launch.d; then {}",
                              place.paths.vendor_directory, kRestart));
    return std::nullopt;
  }
  if (::access(path->c_str(), R_OK) != 0 && errno == EACCES) {
    group.unseen("launch-file", fmt::format("{} cannot be read by this user", *path));
    return std::nullopt;
  }
  const auto schedule = readSchedule(*path);
  if (const auto* found = std::get_if<DailySchedule>(&schedule)) return *found;
  group.problem("launch-file",
                fmt::format("{} is not used, so the daily pass never runs: {}", *path,
                            harmless(std::get<LaunchFileError>(schedule).reason)),
                fmt::format("mend it, then {}", kRestart));
  return std::nullopt;
}

std::uint64_t longestSeconds(const DailySchedule& schedule) {
  return schedule.interval_seconds + schedule.random_delay_seconds +
         (schedule.wants_mains_power ? schedule.mains_power_wait_seconds : 0) + kSlackSeconds;
}

std::string intervalText(const DailySchedule& schedule) {
  return printAge(static_cast<double>(schedule.interval_seconds));
}

void checkRun(const DailySchedule& schedule, const RunRecord& record, const Contact& contact,
              Group& group) {
  const std::uint64_t seconds = elapsedSince(record, readSystemClocks()) / kNsPerSecond;
  const std::string age = printAge(static_cast<double>(seconds));
  if (seconds <= longestSeconds(schedule)) {
    group.ok("daily", fmt::format("the last daily pass was due {} ago; it comes every {}", age,
                                  intervalText(schedule)));
  } else if (contact.outcome == Contact::Outcome::kNone) {
    group.advice("daily-overdue",
                 fmt::format("the daily pass has not run for {}, since the daemon does not", age),
                 "it is made up for once the daemon runs");
  } else {
    group.problem("daily-overdue",
                  fmt::format("the daily pass has not run for {}, though it comes every {}", age,
                              intervalText(schedule)),
                  "a wait for mains power, or a wrong clock: date; journalctl -u spacekeepd");
  }
}

}  // namespace

Group dailyGroup(const Place& place, const Contact& contact) {
  Group group{.name = "daily pass"};
  const auto schedule = checkLaunchFile(place, group);
  if (!schedule) return group;
  const std::string path = place.paths.state_directory + "/" + kDailyActivity + ".run";
  if (!statusOf(path) && errno == EACCES) {
    group.unseen("daily",
                 fmt::format("when it was stands in {}, which this user cannot read", path));
    return group;
  }
  if (!statusOf(path)) {
    group.advice("daily-never", fmt::format("the daily pass has never run: there is no {}", path),
                 "the first one comes within minutes of the daemon's first start");
    return group;
  }
  if (const auto record = loadRunRecord(path)) {
    checkRun(*schedule, *record, contact, group);
  } else {
    group.advice("daily-record", fmt::format("{} does not tell when the daily pass was", path),
                 "the daemon counts it as missed, makes up for it and writes the file anew");
  }
  return group;
}

}  // namespace spacekeep::ctl::doctor
