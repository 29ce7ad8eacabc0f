#include "support/access/entitlement_rules.h"

#include <gtest/gtest.h>

namespace spacekeep::access {
namespace {

PeerIdentity peer() {
  return PeerIdentity({.uid = 1000,
                       .gid = 100,
                       .groups = {200, 300},
                       .label = "cache_t",
                       .pid = 7,
                       .pidfd = nullptr,
                       .unit = std::nullopt});
}

Rule grantTo(std::vector<std::uint32_t> users) {
  Rule rule;
  rule.name = "grant";
  rule.users = std::move(users);
  rule.grants = {"PURGE_ENTITLEMENT"};
  return rule;
}

TEST(EntitlementRules, SilenceDenies) {
  const Verdict verdict = judge({}, peer(), "PURGE_ENTITLEMENT");
  EXPECT_FALSE(verdict.granted());
  EXPECT_EQ(verdict.decision, Decision::kSilent);
  EXPECT_EQ(verdict.rule, "");
}

TEST(EntitlementRules, AGrantOfAnotherEntitlementIsSilence) {
  const std::vector<Rule> rules{grantTo({1000})};
  EXPECT_EQ(judge(rules, peer(), "SERVICE_ENTITLEMENT").decision, Decision::kSilent);
}

TEST(EntitlementRules, AMatchingGrantIsNamed) {
  const std::vector<Rule> rules{grantTo({1, 1000})};
  const Verdict verdict = judge(rules, peer(), "PURGE_ENTITLEMENT");
  EXPECT_TRUE(verdict.granted());
  EXPECT_EQ(verdict.rule, "grant");
}

TEST(EntitlementRules, ADenialWinsInEitherOrder) {
  Rule denial;
  denial.name = "deny";
  denial.groups = {300};
  denial.denies = {"PURGE_ENTITLEMENT"};
  const std::vector<Rule> before{denial, grantTo({1000})};
  const std::vector<Rule> after{grantTo({1000}), denial};
  for (const auto& rules : {before, after}) {
    const Verdict verdict = judge(rules, peer(), "PURGE_ENTITLEMENT");
    EXPECT_EQ(verdict.decision, Decision::kDenied);
    EXPECT_EQ(verdict.rule, "deny");
  }
}

TEST(EntitlementRules, ADenialOfSomebodyElseChangesNothing) {
  Rule denial;
  denial.users = {1001};
  denial.denies = {"PURGE_ENTITLEMENT"};
  const std::vector<Rule> rules{denial, grantTo({1000})};
  EXPECT_TRUE(judge(rules, peer(), "PURGE_ENTITLEMENT").granted());
}

TEST(EntitlementRules, ARuleThatGrantsAndDeniesTheSameDenies) {
  Rule rule = grantTo({1000});
  rule.denies = rule.grants;
  const std::vector<Rule> rules{rule};
  EXPECT_FALSE(judge(rules, peer(), "PURGE_ENTITLEMENT").granted());
}

struct MatchCase {
  const char* what;
  Rule rule;
  bool expected;
};

Rule ruleOf(std::optional<std::vector<std::uint32_t>> users,
            std::optional<std::vector<std::uint32_t>> groups,
            std::optional<std::vector<std::string>> units,
            std::optional<std::vector<std::string>> labels) {
  Rule rule;
  rule.users = std::move(users);
  rule.groups = std::move(groups);
  rule.units = std::move(units);
  rule.labels = std::move(labels);
  return rule;
}

TEST(EntitlementRules, WhomARuleMatches) {
  using Ids = std::vector<std::uint32_t>;
  using Texts = std::vector<std::string>;
  const auto none = std::nullopt;
  const std::vector<MatchCase> cases = {
      {"no condition matches nobody", Rule{}, false},
      {"the user", ruleOf(Ids{1000}, none, none, none), true},
      {"another user", ruleOf(Ids{0}, none, none, none), false},
      {"the primary group", ruleOf(none, Ids{100}, none, none), true},
      {"a supplementary group", ruleOf(none, Ids{1, 300}, none, none), true},
      {"a group of others", ruleOf(none, Ids{1000}, none, none), false},
      {"the label", ruleOf(none, none, none, Texts{"cache_t"}), true},
      {"another label", ruleOf(none, none, none, Texts{"cache"}), false},
      {"a unit of a peer without one", ruleOf(none, none, Texts{"cache.service"}, none), false},
      {"all conditions hold", ruleOf(Ids{1000}, Ids{200}, none, Texts{"cache_t"}), true},
      {"one of several fails", ruleOf(Ids{1000}, Ids{1}, none, Texts{"cache_t"}), false},
      {"no alternatives", ruleOf(Ids{}, none, none, none), false},
  };
  for (const MatchCase& each : cases) {
    EXPECT_EQ(matches(each.rule, peer()), each.expected) << each.what;
  }
}

TEST(EntitlementRules, AnybodyMatchesOnlyWithoutOtherConditions) {
  Rule rule;
  rule.matches_anybody = true;
  EXPECT_TRUE(matches(rule, peer()));
  rule.users = {1};
  EXPECT_FALSE(matches(rule, peer()));
}

PeerIdentity peerOfWhomOnlyTheUserIsClear() {
  return PeerIdentity(
      {.uid = 1000, .gid = kNoGroup, .unclear = {.groups = true, .label = true, .unit = true}});
}

Rule denialBy(void (*condition)(Rule&)) {
  Rule denial;
  denial.name = "deny";
  condition(denial);
  denial.denies = {"PURGE_ENTITLEMENT"};
  return denial;
}

TEST(EntitlementRules, WhatIsUnclearIsDeniedByARuleThatMayFit) {
  for (const auto condition : {+[](Rule& rule) { rule.groups = {300}; },
                               +[](Rule& rule) { rule.units = {"cache.service"}; },
                               +[](Rule& rule) { rule.labels = {"cache_t"}; }}) {
    const std::vector<Rule> rules{grantTo({1000}), denialBy(condition)};
    const Verdict verdict = judge(rules, peerOfWhomOnlyTheUserIsClear(), "PURGE_ENTITLEMENT");
    EXPECT_EQ(verdict.decision, Decision::kDenied);
    EXPECT_TRUE(verdict.open);
  }
}

TEST(EntitlementRules, ADenialByWhatIsClearIsNotOpen) {
  const std::vector<Rule> rules{denialBy([](Rule& rule) { rule.users = {1000}; })};
  const Verdict verdict = judge(rules, peerOfWhomOnlyTheUserIsClear(), "PURGE_ENTITLEMENT");
  EXPECT_EQ(verdict.decision, Decision::kDenied);
  EXPECT_FALSE(verdict.open);
}

TEST(EntitlementRules, WhatIsUnclearIsNotDeniedByARuleForAnotherUser) {
  const std::vector<Rule> rules{grantTo({1000}), denialBy([](Rule& rule) {
                                  rule.users = {1001};
                                  rule.units = {"cache.service"};
                                })};
  EXPECT_TRUE(judge(rules, peerOfWhomOnlyTheUserIsClear(), "PURGE_ENTITLEMENT").granted());
}

TEST(EntitlementRules, WhatIsUnclearGrantsNothing) {
  for (const auto condition : {+[](Rule& rule) { rule.groups = {300}; },
                               +[](Rule& rule) { rule.units = {"cache.service"}; },
                               +[](Rule& rule) { rule.labels = {"cache_t"}; }}) {
    Rule grant = grantTo({1000});
    condition(grant);
    EXPECT_EQ(judge(std::vector<Rule>{grant}, peerOfWhomOnlyTheUserIsClear(), "PURGE_ENTITLEMENT")
                  .decision,
              Decision::kSilent);
  }
}

TEST(EntitlementRules, AConditionWithoutAlternativesFitsNotEvenWhatIsUnclear) {
  const std::vector<Rule> rules{
      grantTo({1000}), denialBy([](Rule& rule) { rule.units = std::vector<std::string>{}; })};
  EXPECT_TRUE(judge(rules, peerOfWhomOnlyTheUserIsClear(), "PURGE_ENTITLEMENT").granted());
}

TEST(PeerIdentity, WithoutAPrimaryGroupItSaysSo) {
  EXPECT_EQ(peerOfWhomOnlyTheUserIsClear().describe(), "uid 1000 gid unknown pid 0");
}

TEST(PeerIdentity, AUnitWithoutAPidfdIsDropped) {
  const PeerIdentity identity({.uid = 1,
                               .gid = 1,
                               .groups = {},
                               .label = {},
                               .pid = 5,
                               .pidfd = nullptr,
                               .unit = "a.service"});
  EXPECT_EQ(identity.unit(), std::nullopt);
  EXPECT_EQ(identity.describe(), "uid 1 gid 1 pid 5");
}

TEST(PeerIdentity, EveryIdentityHasItsOwnSerial) { EXPECT_NE(peer().serial(), peer().serial()); }

}  // namespace
}  // namespace spacekeep::access
