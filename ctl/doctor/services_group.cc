#include <fmt/core.h>

#include <cerrno>
#include <set>
#include <vector>

#include "ctl/doctor/asked_services.h"
#include "ctl/doctor/groups.h"
#include "ctl/doctor/listening_sockets.h"
#include "ctl/text_layout.h"

namespace spacekeep::ctl::doctor {
namespace {

std::string startIt(const std::string& id) {
  constexpr std::string_view kShipped = "com.quorvel.spacekeep.";
  if (!id.starts_with(kShipped)) return "start what listens there, or remove its descriptor";
  return fmt::format("systemctl enable --now spacekeep-service@{}.socket",
                     harmless(id.substr(kShipped.size())));
}

void checkDirectory(const Place& place, Group& group) {
  const std::string& directory = place.paths.services_directory;
  const auto status = statusOf(directory);
  if (!status && errno == ENOENT) {
    group.problem("services-directory",
                  fmt::format("{} is missing, so no declared service can be reached", directory),
                  "systemd-tmpfiles --create, or mkdir as root");
    return;
  }
  const auto reason = status ? distrust(place, *status) : std::nullopt;
  if (!reason) return;
  group.problem("services-directory",
                fmt::format("{} {}, so the daemon connects to nothing in it", directory, *reason),
                fmt::format("chown root {0} && chmod go-w {0}", directory));
}

/// By the mode alone; root may always.
bool daemonMayConnect(const Place& place, const struct stat& status) {
  if (place.own_user == 0 || (status.st_mode & S_IWOTH) != 0) return true;
  return status.st_uid == place.own_user ? (status.st_mode & S_IWUSR) != 0
                                         : (status.st_mode & S_IWGRP) != 0;
}

/// True when somebody listens there, as far as can be seen.
bool checkSocket(const Place& place, const DeclaredService& service,
                 const ListeningSockets& listening, Group& group) {
  const std::string socket = socketOf(place.paths.services_directory, service.id);
  const std::string id = harmless(service.id);
  const auto status = statusOf(socket);
  if (!status && errno == EACCES) {
    group.unseen("service-socket", fmt::format("{} cannot be looked at by this user", socket));
    return false;
  }
  if (!status) {
    group.problem("service-socket-missing",
                  fmt::format("{} is declared in {}, but its socket {} is missing", id,
                              harmless(service.path), socket),
                  startIt(service.id));
    return false;
  }
  if (!S_ISSOCK(status->st_mode)) {
    group.problem("service-socket-kind", fmt::format("{} is not a socket", socket),
                  fmt::format("remove it; {}", startIt(service.id)));
    return false;
  }
  if (!daemonMayConnect(place, *status)) {
    group.problem("service-socket-rights",
                  fmt::format("the daemon ({}) may not connect to {}, which belongs to {} and has "
                              "mode {}",
                              userText(place.own_user), socket, userText(status->st_uid),
                              modeText(status->st_mode)),
                  fmt::format("chown {} {}", userText(place.own_user), socket));
    return false;
  }
  if (listening.known() && !listening.hasServiceSocket(socket)) {
    group.problem("service-socket-stale",
                  fmt::format("nobody listens at {}: the service {} has ended and left it behind",
                              socket, id),
                  startIt(service.id));
    return false;
  }
  return true;
}

void tellSilent(const std::set<std::string>& silent, const AskedServices& asked, Group& group) {
  for (const auto& id : silent) {
    group.problem("service-silent",
                  fmt::format("{} has not told the daemon how much it could free on {}",
                              harmless(id), harmless(asked.volume)),
                  "see what it does: journalctl, or run it through spacekeepctl check-service");
  }
}

void checkAnswers(const std::set<std::string>& expected, const Contact& contact, const Place& place,
                  Group& group) {
  if (!contact.answers()) {
    return group.unseen("service-answers",
                        "whether services answer can only be told when the daemon does");
  }
  const AskedServices asked = askServices(contact.common, place.paths.mount_table, expected);
  if (asked.problem) return group.problem("query", *asked.problem, "journalctl -u spacekeepd");
  if (asked.refused) {
    return group.unseen("service-answers",
                        "whether services answer is told to those who hold "
                        "ITEMIZED_PURGEABLE_ENTITLEMENT, as root does");
  }
  std::set<std::string> silent = expected;
  for (const auto& id : asked.answered) silent.erase(id);
  tellSilent(silent, asked, group);
  if (asked.answered.empty()) return group.ok("service-answers", "no service has answered");
  std::string ids;
  for (const auto& id : asked.answered) ids += (ids.empty() ? "" : ", ") + harmless(id);
  group.ok("service-answers", fmt::format("these answer: {}", ids));
}

}  // namespace

Group servicesGroup(const Place& place, const Declarations& declarations, const Contact& contact) {
  Group group{.name = "services"};
  const auto services = servicesById(declarations);
  if (!services.empty()) checkDirectory(place, group);
  const ListeningSockets listening;
  std::set<std::string> expected;
  for (const auto& [id, service] : services) {
    if (socketOf("", id).empty()) continue;  // told with the descriptor
    const bool reachable = checkSocket(place, service, listening, group);
    if (reachable && service.isQueried()) expected.insert(id);
  }
  checkAnswers(expected, contact, place, group);
  return group;
}

}  // namespace spacekeep::ctl::doctor
