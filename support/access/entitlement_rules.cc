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

/// What is left open counts as if it fitted, where anything would.
template <class Alternatives>
bool holds(const std::optional<Alternatives>& alternatives, bool left_open, bool fits) {
  return !alternatives || fits || (left_open && !alternatives->empty());
}

/// What does not decide here: facts that the kernel did not tell, names that nobody could look up.
struct LeftOpen {
  UnclearFacts facts;
  bool users = false;
  bool groups = false;
};

bool matches(const Rule& rule, const PeerIdentity& identity, const LeftOpen& left_open) {
  if (!hasCondition(rule)) return rule.matches_anybody;
  const auto is_peer = [&identity](std::uint32_t user) { return identity.uid() == user; };
  const auto is_member = [&identity](std::uint32_t group) { return identity.isMemberOf(group); };
  const bool fits_user =
      left_open.users || (rule.users && std::ranges::any_of(*rule.users, is_peer));
  const bool fits_group =
      left_open.groups || (rule.groups && std::ranges::any_of(*rule.groups, is_member));
  return holds(rule.users, false, fits_user) &&
         holds(rule.groups, left_open.facts.groups, fits_group) &&
         holds(rule.units, left_open.facts.unit,
               rule.units && holdsText(*rule.units, identity.unit())) &&
         holds(rule.labels, left_open.facts.label,
               rule.labels && holdsText(*rule.labels, identity.label()));
}

}  // namespace

bool matches(const Rule& rule, const PeerIdentity& identity) {
  return matches(rule, identity, LeftOpen{});
}

bool mayMatch(const Rule& rule, const PeerIdentity& identity) {
  return matches(rule, identity,
                 {.facts = identity.unclear(),
                  .users = rule.users_left_open,
                  .groups = rule.groups_left_open});
}

Verdict judge(std::span<const Rule> rules, const PeerIdentity& identity,
              std::string_view entitlement) {
  Verdict verdict;
  for (const Rule& rule : rules) {
    const bool denies = names(rule.denies, entitlement);
    const bool grants = verdict.decision == Decision::kSilent && names(rule.grants, entitlement);
    if (denies && mayMatch(rule, identity)) {
      return {Decision::kDenied, rule.name, !matches(rule, identity)};
    }
    if (!grants || !matches(rule, identity)) continue;
    verdict = {Decision::kGranted, rule.name, false};
  }
  return verdict;
}

}  // namespace spacekeep::access
