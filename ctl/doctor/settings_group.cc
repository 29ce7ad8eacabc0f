#include <fmt/core.h>
#include <unistd.h>

#include <cerrno>
#include <variant>

#include "ctl/doctor/groups.h"
#include "ctl/text_layout.h"
#include "support/logging/linux/log_level.h"
#include "support/volumes/low_space_settings.h"

namespace spacekeep::ctl::doctor {
namespace {

constexpr std::int32_t kSilentBelow = kLogProblem;
constexpr const char* kRestart = "systemctl restart spacekeepd";

bool isForbidden(const std::string& path) {
  return ::access(path.c_str(), R_OK) != 0 && errno == EACCES;
}

void checkLevel(std::int32_t level, const std::string& path, Group& group) {
  if (level < kSilentBelow) {
    group.advice("log-silent",
                 fmt::format("LogLevel {} in {}: not even problems are logged", level, path),
                 fmt::format("set it to {}, then {}", kDefaultLogLevel, kRestart));
  } else if (level >= kLogTrace) {
    group.advice("log-tracing",
                 fmt::format("LogLevel {} in {}: every step is logged, which is much", level, path),
                 fmt::format("set it to {} when it is not needed any more, then {}",
                             kDefaultLogLevel, kRestart));
  } else {
    group.ok("log", fmt::format("the log level is {}: problems are logged", level));
  }
}

void checkLog(const Place& place, Group& group) {
  const std::string& path = place.paths.log_level_file;
  if (isForbidden(path)) {
    return group.unseen("log", fmt::format("{} cannot be read by this user", path));
  }
  const auto level = readLogLevel(path);
  if (const auto* problem = std::get_if<LogLevelProblem>(&level)) {
    group.problem("log-file",
                  fmt::format("{} is not used, so the log level is {}: {}", path, kDefaultLogLevel,
                              harmless(problem->reason)),
                  fmt::format("mend or remove it, then {}", kRestart));
    return;
  }
  checkLevel(std::get<std::int32_t>(level), path, group);
}

void checkThresholds(const Contact& contact, Group& group) {
  (void)lowSpaceSettingsFrom(contact.state, [&group](const std::string& problem) {
    group.advice("low-space-setting", harmless(problem),
                 "its default holds: spacekeepctl state list shows it, state set changes it");
  });
}

}  // namespace

Group settingsGroup(const Place& place, const Contact& contact) {
  Group group{.name = "settings"};
  checkLog(place, group);
  if (contact.answers()) checkThresholds(contact, group);
  return group;
}

}  // namespace spacekeep::ctl::doctor
