#include <fmt/core.h>
#include <unistd.h>

#include <cerrno>
#include <string>
#include <system_error>
#include <utility>

#include "ctl/daemon_link.h"
#include "ctl/doctor/groups.h"
#include "support/files/linux/atomic_file.h"
#include "support/ipc/linux/sockets.h"

namespace spacekeep::ctl::doctor {
namespace {

constexpr std::chrono::milliseconds kPatience{3'000};
constexpr mode_t kEverybody = 0666;

constexpr const char* kStart =
    "start it: systemctl enable --now spacekeepd.socket, or where there is no service manager: "
    "spacekeepd";
constexpr const char* kRestart =
    "start it anew: systemctl restart spacekeepd.socket spacekeepd.service";
constexpr const char* kSocketUnit =
    "the unit spacekeepd.socket makes it as it should be: systemctl restart spacekeepd.socket";

std::string words(int error_number) { return std::generic_category().message(error_number); }

void checkDirectory(const Place& place, Group& group) {
  const std::string directory = directoryOf(place.socket);
  const auto status = statusOf(directory);
  const auto reason = status ? distrust(place, *status) : std::nullopt;
  if (!reason) return;
  group.problem(
      "socket-directory",
      fmt::format("{} {}: somebody else could take the daemon's place there", directory, *reason),
      fmt::format("chown root {0} && chmod go-w {0}", directory));
}

/// False when nobody can be met there.
bool checkSocketFile(const Place& place, Group& group) {
  const auto status = statusOf(place.socket);
  if (!status && errno == EACCES) {
    group.unseen("socket", fmt::format("{}: {}", place.socket, words(EACCES)));
    return false;
  }
  if (!status) {
    group.problem("socket-missing",
                  fmt::format("{} is missing, so nobody can reach the daemon", place.socket),
                  kStart);
    return false;
  }
  if (!S_ISSOCK(status->st_mode)) {
    group.problem("socket-kind", fmt::format("{} is not a socket", place.socket),
                  fmt::format("remove it, then {}", kRestart));
    return false;
  }
  if (!place.isTrusted(status->st_uid)) {
    group.problem("socket-owner",
                  fmt::format("{} belongs to {}, who may stand in for the daemon", place.socket,
                              userText(status->st_uid)),
                  fmt::format("find out who listens there, then {}", kRestart));
  }
  if ((status->st_mode & kEverybody) != kEverybody) {
    group.advice("socket-mode",
                 fmt::format("{} has mode {}, not 0666: users without that right cannot connect, "
                             "whatever the rules grant",
                             place.socket, modeText(status->st_mode)),
                 kSocketUnit);
  }
  return true;
}

/// The file may be there without anybody behind it.
bool checkListener(const Place& place, Group& group) {
  std::string why;
  if (ipc::connectSocket(place.socket, why) != nullptr) return true;
  switch (errno) {
    case ECONNREFUSED:
      group.problem("socket-stale",
                    fmt::format("nobody listens at {}: the daemon has ended and left it behind",
                                place.socket),
                    kRestart);
      break;
    case EAGAIN:
      group.problem("socket-full",
                    fmt::format("{} takes no more connections: the daemon is flooded, or hangs",
                                place.socket),
                    "see who connects: ss -xp; and what it does: journalctl -u spacekeepd");
      break;
    case EACCES:
      group.advice(
          "socket-refuses-user",
          fmt::format("this user ({}) may not connect to {}", userText(geteuid()), place.socket),
          kSocketUnit);
      break;
    default:
      group.problem("socket-fails", why, kRestart);
  }
  return false;
}

void talk(const Place& place, Group& group, Contact& contact) {
  auto state = wholeState(contact.common, kPatience);
  if (state) {
    contact.outcome = Contact::Outcome::kAnswers;
    contact.state = std::move(*state);
    group.ok("answers", fmt::format("the daemon answers at {}", place.socket));
    return;
  }
  switch (state.error().kind) {
    case sdk::ErrorKind::kNotAllowed:
      contact.outcome = Contact::Outcome::kRefused;
      group.ok("refuses", fmt::format("the daemon is there and turns this user ({}) away; see "
                                      "\"rights\"",
                                      userText(geteuid())));
      break;
    case sdk::ErrorKind::kTimedOut:
      contact.outcome = Contact::Outcome::kSilent;
      group.problem("silent",
                    fmt::format("the daemon at {} takes connections and has not answered for 3 s",
                                place.socket),
                    "a service that never answers holds it up, or its disk does: journalctl -u "
                    "spacekeepd; its watchdog starts it anew within a minute or two");
      break;
    case sdk::ErrorKind::kUnreachable:
    case sdk::ErrorKind::kDisconnected:
    case sdk::ErrorKind::kNotSupported:
    case sdk::ErrorKind::kInvalidArgument:
    case sdk::ErrorKind::kFailed:
      contact.outcome = Contact::Outcome::kSilent;
      group.problem("fails", state.error().text, "journalctl -u spacekeepd tells more");
  }
}

}  // namespace

Group daemonGroup(const Place& place, Contact& contact) {
  Group group{.name = "daemon"};
  contact.common.socket_path = place.socket;
  checkDirectory(place, group);
  if (checkSocketFile(place, group) && checkListener(place, group)) talk(place, group, contact);
  return group;
}

}  // namespace spacekeep::ctl::doctor
