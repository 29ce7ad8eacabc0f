#include <fmt/core.h>

#include <algorithm>
#include <array>
#include <map>
#include <string_view>

#include "ctl/doctor/groups.h"
#include "ctl/text_layout.h"
#include "operations/info_keys.h"

namespace spacekeep::ctl::doctor {
namespace {

constexpr const char* kRestart = "then have it read: systemctl restart spacekeepd";
constexpr std::string_view kOwnPrefix = "SPACEKEEP_";
constexpr std::array kKnownKeys = {keys::kServiceId, keys::kServiceRoles, keys::kDoNotQuery,
                                   keys::kNotifications};

std::string mend(const char* what) { return fmt::format("{}, {}", what, kRestart); }

void checkTrust(const Place& place, const std::string& path, Group& group) {
  const auto status = statusOf(path);
  const auto reason = status ? distrust(place, *status) : std::nullopt;
  if (!reason) return;
  group.problem("descriptor-trust",
                fmt::format("{} {}: somebody else could declare services there, or take an ID away "
                            "from its service",
                            harmless(path), *reason),
                fmt::format("chown root {0} && chmod go-w {0}", harmless(path)));
}

void checkRole(const DeclaredService& service, const Value& role, Group& group) {
  const std::string* name = role.string();
  if (name != nullptr && (*name == keys::kRolePurge || *name == keys::kRolePeriodic)) return;
  group.advice("descriptor-role",
               fmt::format("{} names a role in SPACEKEEP_SERVICES that nobody knows{}",
                           harmless(service.path),
                           name == nullptr ? "" : fmt::format(" (\"{}\")", harmless(*name))),
               mend("the roles are PURGE and PERIODIC: correct it"));
}

void checkRoles(const DeclaredService& service, Group& group) {
  const Value* roles = service.descriptor.find(keys::kServiceRoles);
  if (roles == nullptr) return;
  if (roles->array() == nullptr) {
    group.problem("descriptor-roles",
                  fmt::format("SPACEKEEP_SERVICES in {} is no array, so {} takes part in nothing",
                              harmless(service.path), harmless(service.id)),
                  mend("make it an array of strings"));
    return;
  }
  for (const Value& role : *roles->array()) checkRole(service, role, group);
  if (service.purges || service.periodic) return;
  group.advice("descriptor-roles",
               fmt::format("{} gives {} no role, so it takes part in nothing",
                           harmless(service.path), harmless(service.id)),
               mend("name PURGE or PERIODIC in SPACEKEEP_SERVICES"));
}

void checkQuery(const DeclaredService& service, Group& group) {
  const Value* value = service.descriptor.find(keys::kDoNotQuery);
  if (value == nullptr || value->truth()) return;
  group.advice(
      "descriptor-query",
      fmt::format("SPACEKEEP_DO_NOT_QUERY in {} is not true and keeps {} out of queries all "
                  "the same: that it stands there is what counts",
                  harmless(service.path), harmless(service.id)),
      mend("take the key out"));
}

void checkNotifications(const DeclaredService& service, Group& group) {
  const Value* names = service.descriptor.find(keys::kNotifications);
  if (names == nullptr || names->array() != nullptr) return;
  group.advice("descriptor-notifications",
               fmt::format("SPACEKEEP_NOTIFICATIONS in {} is no array, so {} hears of nothing",
                           harmless(service.path), harmless(service.id)),
               mend("make it an array of strings"));
}

void checkKeys(const DeclaredService& service, Group& group) {
  for (const auto& [key, value] : service.descriptor) {
    const bool known = std::ranges::find(kKnownKeys, std::string_view(key)) != kKnownKeys.end();
    if (known || !key.starts_with(kOwnPrefix)) continue;
    group.advice("descriptor-key",
                 fmt::format("{} holds the key {}, which nobody reads", harmless(service.path),
                             harmless(key)),
                 mend("perhaps it is misspelt: correct it or take it out"));
  }
}

void checkId(const DeclaredService& service, Group& group) {
  if (!socketOf("", service.id).empty()) return;
  group.problem("descriptor-id",
                fmt::format("the ID \"{}\" in {} is no safe file name, so the service cannot be "
                            "reached",
                            harmless(service.id), harmless(service.path)),
                mend("use 1 to 64 of A-Z a-z 0-9 . _ -, not beginning with a dot"));
}

void checkDuplicates(const Declarations& declarations, Group& group) {
  std::map<std::string, std::string> paths;  // ID, the last path
  for (const auto& service : declarations.services) {
    const auto [earlier, first] = paths.try_emplace(service.id, service.path);
    if (first) continue;
    group.problem(
        "descriptor-twice",
        fmt::format("{} is declared by {} and by {}; only the one read last counts",
                    harmless(service.id), harmless(earlier->second), harmless(service.path)),
        mend("remove one of the two"));
    earlier->second = service.path;
  }
}

void tellUnused(const UnusedDescriptor& unused, Group& group) {
  const std::string path = harmless(unused.path);
  if (unused.forbidden) {
    return group.unseen("descriptor", fmt::format("{} cannot be read by this user", path));
  }
  group.problem("descriptor-unused",
                fmt::format("{} declares no service: {}", path, harmless(unused.reason)),
                mend("mend or remove it"));
}

}  // namespace

Group descriptorsGroup(const Place& place, const Declarations& declarations) {
  Group group{.name = "descriptors"};
  for (const auto& directory : descriptorDirectories(place.root)) {
    checkTrust(place, directory, group);
  }
  for (const auto& directory : declarations.unseen_directories) {
    group.unseen("descriptor", fmt::format("{} cannot be listed by this user", directory));
  }
  for (const auto& unused : declarations.unused) tellUnused(unused, group);
  checkDuplicates(declarations, group);
  for (const auto& service : declarations.services) {
    checkTrust(place, service.path, group);
    checkId(service, group);
    checkRoles(service, group);
    checkQuery(service, group);
    checkNotifications(service, group);
    checkKeys(service, group);
  }
  if (group.isFine()) {
    group.ok("descriptors",
             declarations.services.empty()
                 ? "no service is declared; services may check in by themselves"
                 : fmt::format("{} declared, all well formed",
                               declarations.services.size() == 1
                                   ? "one service is"
                                   : fmt::format("{} services are", declarations.services.size())));
  }
  return group;
}

}  // namespace spacekeep::ctl::doctor
