#include <fmt/core.h>
#include <sys/socket.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <filesystem>
#include <memory>
#include <system_error>

#include "ctl/doctor/groups.h"
#include "ctl/text_layout.h"
#include "support/access/entitlements.h"
#include "support/access/linux/capture_peer_identity.h"
#include "support/access/linux/load_rules.h"
#include "support/files/linux/descriptor.h"

namespace spacekeep::ctl::doctor {
namespace {

namespace fs = std::filesystem;

constexpr const char* kMend =
    "mend it, then have the rules read again: systemctl restart spacekeepd";

/// This process as the daemon would see it, found out in the same way.
std::shared_ptr<const access::PeerIdentity> ownIdentity() {
  int ends[2] = {-1, -1};
  if (socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends) != 0) return nullptr;
  const FileDescriptor one(ends[0]);
  const FileDescriptor other(ends[1]);
  return access::capturePeerIdentity(one.get());
}

using Kind = access::RuleFileFinding::Kind;

bool isForbidden(const access::RuleFileFinding& finding) {
  if (finding.kind == Kind::kReplaces) return false;
  const int way = finding.kind == Kind::kDirectoryNotUsed ? R_OK | X_OK : R_OK;
  return ::access(finding.path.c_str(), way) != 0 && errno == EACCES;
}

void tell(const access::RuleFileFinding& finding, Group& group) {
  const std::string path = harmless(finding.path);
  if (isForbidden(finding)) {
    return group.unseen("rules", fmt::format("{} cannot be read by this user", path));
  }
  switch (finding.kind) {
    case Kind::kDirectoryNotUsed:
      return group.problem(
          "rule-directory",
          fmt::format("{} is not used ({}): what it denies is not known, so no rule of any "
                      "directory holds",
                      path, harmless(finding.text)),
          kMend);
    case Kind::kGrantsNothing:
      return group.problem(
          "rule-file", fmt::format("{} grants nothing: {}", path, harmless(finding.text)), kMend);
    case Kind::kRemark:
      return group.advice("rule-remark", fmt::format("{}: {}", path, harmless(finding.text)),
                          kMend);
    case Kind::kReplaces:
      return group.ok("rule-replaced",
                      fmt::format("{} takes the place of {}", path, harmless(finding.text)));
  }
}

bool hasUnusedDirectory(const access::ReadRules& read) {
  return std::ranges::any_of(
      read.findings, [](const auto& finding) { return finding.kind == Kind::kDirectoryNotUsed; });
}

/// The daemon, as another user, may well read what this user may not.
bool isHidden(const access::ReadRules& read) {
  return std::ranges::any_of(read.findings, [](const auto& finding) {
    return finding.kind == Kind::kDirectoryNotUsed && isForbidden(finding);
  });
}

/// Root reads everything; the daemon is somebody else, for whom what is root's has to be open so far.
bool isClosedToTheDaemon(const Place& place, const std::string& path, mode_t way_in) {
  const auto status = statusOf(path);
  const bool is_roots = status && status->st_uid == 0 && status->st_gid == 0;
  return place.own_user != 0 && is_roots && (status->st_mode & way_in) != way_in;
}

/// Of the directory and those above it the outermost that the daemon cannot use; empty when it gets
/// there.
std::string closedOnTheWayTo(const Place& place, const fs::path& directory) {
  fs::path above;
  for (const fs::path& name : directory) {
    above /= name;
    const mode_t way_in = above == directory ? S_IROTH | S_IXOTH : S_IXOTH;
    if (isClosedToTheDaemon(place, above, way_in)) return above;
  }
  return "";
}

std::string modeOf(const std::string& path) {
  const auto status = statusOf(path);
  return status ? modeText(status->st_mode) : "gone by now";
}

bool tellClosedDirectory(const Place& place, const std::string& directory, Group& group) {
  const std::string closed = closedOnTheWayTo(place, directory);
  if (closed.empty()) return false;
  group.problem(
      "rule-directory",
      fmt::format("{} is closed to the daemon ({}): what the rules in {} deny is not known, "
                  "so no rule of any directory holds",
                  harmless(closed), modeOf(closed), harmless(directory)),
      fmt::format("as root: chmod 0755 {}; systemctl restart spacekeepd", harmless(closed)));
  return true;
}

void tellClosedFiles(const Place& place, const std::string& directory, Group& group) {
  std::error_code unreadable;
  for (const auto& entry : fs::directory_iterator(directory, unreadable)) {
    const std::string path = entry.path();
    if (!path.ends_with(".plist") || !isClosedToTheDaemon(place, path, S_IROTH)) continue;
    group.problem(
        "rule-file",
        fmt::format("{} is closed to the daemon ({}) and grants nothing", harmless(path),
                    modeOf(path)),
        fmt::format("as root: chmod 0644 {}; systemctl restart spacekeepd", harmless(path)));
  }
}

bool grantsToSomebody(const std::vector<access::Rule>& rules, std::string_view entitlement) {
  return std::ranges::any_of(rules, [&](const access::Rule& rule) {
    return std::ranges::find(rule.grants, entitlement) != rule.grants.end();
  });
}

/// "CLIENT_ENTITLEMENT (20-spacekeep.plist), ..."
std::string heldBy(const access::PeerIdentity& identity, const std::vector<access::Rule>& rules) {
  std::string text;
  for (const auto entitlement : access::kAllEntitlements) {
    const access::Verdict verdict = judge(rules, identity, entitlement);
    if (!verdict.granted()) continue;
    text += fmt::format("{}{} ({})", text.empty() ? "" : ", ", entitlement, verdict.rule);
  }
  return text;
}

void checkUser(const access::PeerIdentity& identity, const std::vector<access::Rule>& rules,
               Group& group) {
  const std::string user = userText(identity.uid());
  const access::Verdict verdict = judge(rules, identity, access::kClientEntitlement);
  if (verdict.granted()) {
    group.ok("user", fmt::format("this user ({}) holds {}", user, heldBy(identity, rules)));
    return;
  }
  const std::string reason =
      verdict.decision == access::Decision::kDenied
          ? fmt::format("{}{} denies", verdict.rule, verdict.open ? " may be about it and" : "")
          : "no rule grants";
  group.advice("user",
               fmt::format("this user ({}) may not connect to the daemon: {} CLIENT_ENTITLEMENT",
                           user, reason),
               fmt::format("as root: adduser {} spacekeep, then log in anew", user));
}

/// The daemon reads its rules once, when it starts.
void compare(const access::PeerIdentity& identity, const std::vector<access::Rule>& rules,
             const Contact& contact, Group& group) {
  const bool granted = judge(rules, identity, access::kClientEntitlement).granted();
  const bool refused = contact.outcome == Contact::Outcome::kRefused;
  const bool as_the_rules_say = refused ? !granted : !contact.answers() || granted;
  if (as_the_rules_say) return;
  group.advice("rules-not-loaded",
               fmt::format("the daemon {} this user, and the rules say otherwise: they have "
                           "changed since it started, or it cannot read them",
                           refused ? "turns away" : "lets in"),
               "systemctl restart spacekeepd; journalctl -u spacekeepd names rules it cannot use");
}

}  // namespace

Group rightsGroup(const Place& place, const Contact& contact) {
  Group group{.name = "rights"};
  const std::string vendor = place.paths.vendor_directory + "/entitlements.d";
  const std::string administrator = place.paths.administrator_directory + "/entitlements.d";
  for (const auto& directory : {vendor, administrator}) {
    if (tellClosedDirectory(place, directory, group)) return group;
    tellClosedFiles(place, directory, group);
  }
  const auto read =
      access::readRules(vendor, administrator, access::systemNameLookup(), place.own_user);
  for (const auto& finding : read.findings) tell(finding, group);
  if (isHidden(read)) return group;
  if (!grantsToSomebody(read.rules, access::kClientEntitlement)) {
    group.problem(
        "nobody", "no rule grants CLIENT_ENTITLEMENT, so nobody may connect",
        hasUnusedDirectory(read) ? kMend : fmt::format("the shipped rules belong into {}", vendor));
  }
  const auto identity = ownIdentity();
  if (identity == nullptr) return group;
  checkUser(*identity, read.rules, group);
  if (place.isThisSystem()) compare(*identity, read.rules, contact, group);
  return group;
}

}  // namespace spacekeep::ctl::doctor
