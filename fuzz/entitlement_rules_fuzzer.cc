// Who may do what: rule files of the vendor and of the administrator with any content, from the
// directory to the verdict. The verdict is worked out a second time, in the plainest way there is.
#include <sys/stat.h>

#include <algorithm>
#include <array>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <set>
#include <string>
#include <string_view>
#include <vector>

#include "client/entitlements.h"
#include "fuzz/helpers/fuzzed_files.h"
#include "fuzz/helpers/piece_reader.h"
#include "fuzz/helpers/promises.h"
#include "support/access/entitlement_access.h"
#include "support/access/linux/load_rules.h"

namespace spacekeep::access {
namespace {

using fuzz::require;

const std::vector<std::string> kWords{"MATCH_USER",
                                      "MATCH_GROUP",
                                      "MATCH_UNIT",
                                      "MATCH_LABEL",
                                      "MATCH_ANYBODY",
                                      "GRANT",
                                      "DENY",
                                      "CLIENT_ENTITLEMENT",
                                      "PURGE_ENTITLEMENT",
                                      "SERVICE_ENTITLEMENT",
                                      "root",
                                      "cache.service",
                                      "label"};
const std::array<std::string, 4> kNames{"10-a.plist", "20-b.plist", "notes.txt", ".hidden.plist"};

struct Directories {
  fuzz::FuzzedDirectory vendor;
  fuzz::FuzzedDirectory administrator;

  static Directories& instance() {
    static Directories directories;
    return directories;
  }
};

std::optional<std::uint32_t> numberOf(const std::string& name) {
  if (name == "root") return 0;
  return std::nullopt;
}

PeerFacts factsOf(int who) {
  switch (who) {
    case 0:
      return {};
    case 1:
      return {.uid = 1000, .gid = 4, .groups = {5, 0}, .label = "label"};
    case 2:
      return {.uid = 2, .gid = 2, .label = std::nullopt, .unit = "cache.service"};
    default:
      return {.uid = UINT32_MAX, .gid = UINT32_MAX, .label = "", .unit = ""};
  }
}

template <class Alternatives, class Holds>
bool conditionHolds(const std::optional<Alternatives>& alternatives, Holds holds) {
  if (!alternatives) return true;
  for (const auto& alternative : *alternatives) {
    if (holds(alternative)) return true;
  }
  return false;
}

bool isAbout(const Rule& rule, const PeerIdentity& peer) {
  const bool unconditional = !rule.users && !rule.groups && !rule.units && !rule.labels;
  if (unconditional) return rule.matches_anybody;
  return conditionHolds(rule.users, [&](std::uint32_t uid) { return uid == peer.uid(); }) &&
         conditionHolds(rule.groups, [&](std::uint32_t gid) { return peer.isMemberOf(gid); }) &&
         conditionHolds(rule.units, [&](const std::string& unit) { return unit == peer.unit(); }) &&
         conditionHolds(rule.labels,
                        [&](const std::string& label) { return label == peer.label(); });
}

bool says(const std::vector<std::string>& list, std::string_view entitlement) {
  return std::find(list.begin(), list.end(), entitlement) != list.end();
}

bool plainVerdict(const std::vector<Rule>& rules, const PeerIdentity& peer,
                  std::string_view entitlement) {
  bool granted = false;
  for (const Rule& rule : rules) {
    if (!isAbout(rule, peer)) continue;
    if (says(rule.denies, entitlement)) return false;
    granted = granted || says(rule.grants, entitlement);
  }
  return granted;
}

void requireRulesInOrder(const std::vector<Rule>& rules) {
  for (std::size_t i = 0; i < rules.size(); ++i) {
    const Rule& rule = rules[i];
    require(rule.name == kNames[0] || rule.name == kNames[1], "only rule files are read");
    require(i == 0 || rules[i - 1].name < rule.name, "there is one rule per name, in their order");
    const bool conditions = rule.users || rule.groups || rule.units || rule.labels;
    require(!(rule.matches_anybody && conditions), "anybody goes with no other match");
    require(rule.grants.size() <= kMaxRuleEntries && rule.denies.size() <= kMaxRuleEntries,
            "the entries are bounded");
  }
}

void requirePlainVerdicts(const std::vector<Rule>& rules) {
  using namespace entitlements;
  EntitlementAccess access(rules, 8);
  for (int who = 0; who < 4; ++who) {
    const PeerIdentity peer(factsOf(who));
    for (const std::string_view entitlement : {kClient, kPurge, kService, kPurgeable}) {
      const bool granted = plainVerdict(rules, peer, entitlement);
      const Verdict verdict = judge(rules, peer, entitlement);
      require(verdict.granted() == granted, "a denial wins, silence denies");
      require(verdict.rule.empty() == (verdict.decision == Decision::kSilent),
              "who decided is named");
      require(access.isEntitled(peer, entitlement) == granted, "a verdict is kept to");
      require(access.isEntitled(peer, entitlement) == granted, "a verdict is remembered");
    }
    require(access.remembered() <= 8, "what is remembered is bounded");
  }
}

void examine(fuzz::PieceReader input) {
  Directories& directories = Directories::instance();
  for (int files = 0; files < 8 && !input.usedUp(); ++files) {
    const std::uint8_t place = input.byte();
    auto& directory = place % 2 == 0 ? directories.vendor : directories.administrator;
    directory.write(kNames.at(place / 2 % kNames.size()), fuzz::fileContent(input, kWords));
  }
  const std::vector<Rule> rules =
      loadRules(directories.vendor.path(), directories.administrator.path(),
                NameLookup{.user = numberOf, .group = numberOf});
  directories.vendor.clear();
  directories.administrator.clear();
  requireRulesInOrder(rules);
  requirePlainVerdicts(rules);
}

}  // namespace
}  // namespace spacekeep::access

extern "C" int LLVMFuzzerInitialize(int*, char***) {
  spacekeep::fuzz::checkLogLines();
  ::umask(022);  // rule files that others could write are not looked at
  return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  const std::string input = spacekeep::fuzz::textOfInput(data, size);
  spacekeep::access::examine(spacekeep::fuzz::PieceReader(input));
  return 0;
}
