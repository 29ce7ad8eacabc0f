#include <fmt/core.h>
#include <sys/statvfs.h>
#include <unistd.h>

#include <cerrno>
#include <cstdint>
#include <string>

#include "ctl/doctor/groups.h"
#include "ctl/size_text.h"
#include "ctl/text_layout.h"
#include "daemon/names.h"
#include "support/files/linux/linux_directory_reader.h"
#include "support/linux/reserve_file.h"

namespace spacekeep::ctl::doctor {
namespace {

constexpr const char* kRestart = "systemctl restart spacekeepd";

/// False when there is no state to look at.
bool checkDirectory(const Place& place, const Contact& contact, Group& group) {
  const std::string& directory = place.paths.state_directory;
  const auto status = statusOf(directory);
  if (!status && errno != ENOENT) {
    group.unseen("state", fmt::format("{} cannot be looked at by this user", directory));
    return false;
  }
  if (!status && contact.outcome != Contact::Outcome::kNone) {
    group.problem("state-missing",
                  fmt::format("{} is missing: the daemon keeps no settings and forgets when the "
                              "daily pass was",
                              directory),
                  kRestart);
    return false;
  }
  if (!status) {
    group.advice("state-missing", fmt::format("{} is missing", directory),
                 "the daemon makes it when it starts for the first time");
    return false;
  }
  if (!S_ISDIR(status->st_mode)) {
    group.problem("state-kind", fmt::format("{} is no directory", directory),
                  fmt::format("move it away, then {}", kRestart));
    return false;
  }
  if (!place.isTrusted(status->st_uid)) {
    group.problem("state-owner",
                  fmt::format("{} belongs to {}, so the daemon ({}) may not be able to write there",
                              directory, userText(status->st_uid), userText(place.own_user)),
                  fmt::format("chown -R {} {}", userText(place.own_user), directory));
  }
  if ((status->st_mode & (S_IRWXG | S_IRWXO)) != 0) {
    group.advice("state-mode",
                 fmt::format("{} has mode {}: others than the daemon can look into it", directory,
                             modeText(status->st_mode)),
                 fmt::format("chmod 0700 {}", directory));
  }
  return true;
}

void checkRoom(const Place& place, Group& group) {
  const std::string& directory = place.paths.state_directory;
  struct statvfs space = {};
  if (statvfs(directory.c_str(), &space) != 0) return;
  const std::uint64_t free_bytes = std::uint64_t{space.f_bavail} * space.f_frsize;
  const bool no_inodes = space.f_files > 0 && space.f_favail == 0;
  if (free_bytes < ReserveFile::kBytes || no_inodes) {
    group.problem("state-room",
                  fmt::format("{} has {}{} left: settings may not be storable", directory,
                              printSize(free_bytes), no_inodes ? " and no inode" : ""),
                  "free something there: spacekeepctl explain tells who could");
    return;
  }
  const auto reserve = statusOf(directory + "/reserve");
  if (reserve || free_bytes < ReserveFile::kBytes * ReserveFile::kRoomFactor) return;
  group.advice("state-reserve",
               fmt::format("the reserve {}/reserve is missing: the daemon has given it back in "
                           "need, or never ran here",
                           directory),
               "it takes it again within five minutes of having room; if not: journalctl -u "
               "spacekeepd");
}

void checkSetAside(const Place& place, Group& group) {
  const std::string& directory = place.paths.state_directory;
  const std::string prefix = std::string(kSuiteName) + ".corrupt-";
  for (const auto& entry : LinuxDirectoryReader().entriesBelow(directory)) {
    if (!entry.starts_with(prefix) || entry.ends_with("-journal")) continue;
    group.advice("state-damaged",
                 fmt::format("the settings were damaged once, and set aside as {}/{}", directory,
                             harmless(entry)),
                 "look for what is lost, set it again, and remove that file");
  }
}

}  // namespace

Group stateGroup(const Place& place, const Contact& contact) {
  Group group{.name = "state"};
  if (!checkDirectory(place, contact, group)) return group;
  const std::string& directory = place.paths.state_directory;
  if (::access(directory.c_str(), R_OK | X_OK) != 0) {
    group.unseen("state", fmt::format("{} cannot be listed by this user", directory));
    return group;
  }
  checkRoom(place, group);
  checkSetAside(place, group);
  if (group.isFine()) group.ok("state", fmt::format("{} is as it should be", directory));
  return group;
}

}  // namespace spacekeep::ctl::doctor
