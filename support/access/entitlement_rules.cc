#include "support/access/entitlement_rules.h"

#include <algorithm>

namespace spacekeep::access {
namespace {

bool holdsText(const std::vector<std::string>& alternatives,
               const std::optional<std::string>& fact) {
  return fact && std::ranges::find(alternatives, *fact) != alternatives.end();
}

bool names(const std::vector<std::string>& entitlements, std::string_view entitlement) {
  return std::ranges::find(entitlements, entitlement) != entitlements.end();
}

bool hasCondition(const Rule& rule) {
  return rule.users || rule.groups || rule.units || rule.labels;
}

}  // namespace

bool matches(const Rule& rule, const PeerIdentity& identity) {
  if (!hasCondition(rule)) return rule.matches_anybody;
  if (rule.users && std::ranges::find(*rule.users, identity.uid()) == rule.users->end()) {
    return false;
  }
  const auto is_member = [&identity](std::uint32_t group) { return identity.isMemberOf(group); };
  if (rule.groups && std::ranges::none_of(*rule.groups, is_member)) return false;
  if (rule.units && !holdsText(*rule.units, identity.unit())) return false;
  return !rule.labels || holdsText(*rule.labels, identity.label());
}

Verdict judge(std::span<const Rule> rules, const PeerIdentity& identity,
              std::string_view entitlement) {
  Verdict verdict;
  for (const Rule& rule : rules) {
    const bool denies = names(rule.denies, entitlement);
    const bool grants = verdict.decision == Decision::kSilent && names(rule.grants, entitlement);
    if ((!denies && !grants) || !matches(rule, identity)) continue;
    if (denies) return {Decision::kDenied, rule.name};
    verdict = {Decision::kGranted, rule.name};
  }
  return verdict;
}

}  // namespace spacekeep::access
