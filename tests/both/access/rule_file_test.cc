#include "support/access/rule_file.h"

#include <gtest/gtest.h>

namespace spacekeep::access {
namespace {

NameLookup lookup() {
  return {.user = [](const std::string& name) -> std::optional<std::uint32_t> {
            if (name == "ada") return 1815;
            return std::nullopt;
          },
          .group = [](const std::string& name) -> NameAnswer {
            if (name == "spacekeep") return std::optional<std::uint32_t>(400);
            NameAnswer none(std::nullopt);
            if (name == "far-away") none.failure = "no answer";
            return none;
          }};
}

std::variant<ParsedRule, RuleError> parse(const Value& document) {
  return ruleFromDocument("test.plist", document, lookup());
}

ParsedRule parsed(const Value& document) {
  auto result = parse(document);
  if (const auto* error = std::get_if<RuleError>(&result)) {
    ADD_FAILURE() << error->reason;
    return {};
  }
  return std::get<ParsedRule>(result);
}

std::string reason(const Value& document) {
  const auto result = parse(document);
  const auto* error = std::get_if<RuleError>(&result);
  return error == nullptr ? "(accepted)" : error->reason;
}

TEST(RuleFile, EveryKeyIsRead) {
  const ParsedRule result = parsed(Dictionary{
      {"MATCH_USER", Array{"ada", 7}},
      {"MATCH_GROUP", "spacekeep"},
      {"MATCH_UNIT", Array{"a.service", "b.service"}},
      {"MATCH_LABEL", "cache_t"},
      {"GRANT", Array{"CLIENT_ENTITLEMENT"}},
      {"DENY", Array{"PURGE_ENTITLEMENT"}},
  });
  EXPECT_EQ(result.rule.name, "test.plist");
  EXPECT_EQ(result.rule.users, (std::vector<std::uint32_t>{1815, 7}));
  EXPECT_EQ(result.rule.groups, (std::vector<std::uint32_t>{400}));
  EXPECT_EQ(result.rule.units, (std::vector<std::string>{"a.service", "b.service"}));
  EXPECT_EQ(result.rule.labels, (std::vector<std::string>{"cache_t"}));
  EXPECT_EQ(result.rule.grants, (std::vector<std::string>{"CLIENT_ENTITLEMENT"}));
  EXPECT_EQ(result.rule.denies, (std::vector<std::string>{"PURGE_ENTITLEMENT"}));
  EXPECT_TRUE(result.remarks.empty());
}

TEST(RuleFile, AnUnknownNameMatchesNobodyAndIsRemarked) {
  const ParsedRule result =
      parsed(Dictionary{{"MATCH_USER", "nobody-here"}, {"GRANT", Array{"CLIENT_ENTITLEMENT"}}});
  ASSERT_TRUE(result.rule.users.has_value());
  EXPECT_TRUE(result.rule.users->empty());
  ASSERT_EQ(result.remarks.size(), 1U);
  EXPECT_EQ(result.remarks[0],
            "MATCH_USER names nobody-here, which does not exist here and matches nobody");
  EXPECT_FALSE(matches(result.rule, PeerIdentity({.uid = 0})));
}

TEST(RuleFile, ANameThatCouldNotBeLookedUpMayBeAnybodysWhereTheRuleDenies) {
  const ParsedRule result = parsed(Dictionary{{"MATCH_GROUP", Array{"far-away", "spacekeep"}},
                                              {"MATCH_USER", 7},
                                              {"DENY", Array{"CLIENT_ENTITLEMENT"}}});
  EXPECT_EQ(result.remarks,
            std::vector<std::string>{"MATCH_GROUP names far-away, which could not be looked up (no "
                                     "answer): what the rule denies, it may deny to anybody"});
  const PeerIdentity stranger({.uid = 7, .gid = 1});
  EXPECT_FALSE(matches(result.rule, stranger));
  EXPECT_TRUE(mayMatch(result.rule, stranger));
  EXPECT_FALSE(mayMatch(result.rule, PeerIdentity({.uid = 8, .gid = 1}))) << "MATCH_USER says no";
  const PeerIdentity member({.uid = 7, .gid = 400});
  EXPECT_TRUE(matches(result.rule, member));
}

TEST(RuleFile, ATextOfDigitsIsANameAndNotANumber) {
  const ParsedRule result = parsed(Dictionary{{"MATCH_USER", "7"}});
  EXPECT_TRUE(result.rule.users->empty());
  EXPECT_EQ(result.remarks.size(), 1U);
}

TEST(RuleFile, AnUnknownEntitlementIsRemarkedAndTheRestHolds) {
  const ParsedRule result = parsed(
      Dictionary{{"MATCH_USER", 1}, {"GRANT", Array{"CLIENT_ENTITLEMENT", "CLIENT_ENTITELMENT"}}});
  ASSERT_EQ(result.remarks.size(), 1U);
  EXPECT_EQ(result.remarks[0],
            "GRANT names CLIENT_ENTITELMENT, which is no entitlement of this system");
  EXPECT_EQ(result.rule.grants.front(), "CLIENT_ENTITLEMENT");
}

TEST(RuleFile, AnybodyMustBeSaid) {
  EXPECT_TRUE(parsed(Dictionary{{"MATCH_ANYBODY", true}}).rule.matches_anybody);
  EXPECT_FALSE(parsed(Dictionary{{"MATCH_ANYBODY", false}}).rule.matches_anybody);
  EXPECT_FALSE(matches(parsed(Dictionary{}).rule, PeerIdentity({.uid = 0})));
}

TEST(RuleFile, WhatIsBrokenAndWhy) {
  const std::string ids = "MATCH_USER must be a name, a number, or an array of these";
  EXPECT_EQ(reason("text"), "the document is no dictionary");
  EXPECT_EQ(reason(Dictionary{{"MATCH_USERS", "ada"}}), "unknown key MATCH_USERS");
  EXPECT_EQ(reason(Dictionary{{"match_user", "ada"}}), "unknown key match_user");
  EXPECT_EQ(reason(Dictionary{{"MATCH_USER", true}}), ids);
  EXPECT_EQ(reason(Dictionary{{"MATCH_USER", -1}}), ids);
  EXPECT_EQ(reason(Dictionary{{"MATCH_USER", 4294967295LL}}), ids);
  EXPECT_EQ(reason(Dictionary{{"MATCH_USER", 4294967296LL}}), ids);
  EXPECT_EQ(reason(Dictionary{{"MATCH_USER", 1.5}}), ids);
  EXPECT_EQ(reason(Dictionary{{"MATCH_USER", Array{Value(Array{})}}}), ids);
  EXPECT_EQ(reason(Dictionary{{"MATCH_UNIT", 5}}),
            "MATCH_UNIT must be a text or an array of texts");
  EXPECT_EQ(reason(Dictionary{{"MATCH_LABEL", ""}}),
            "MATCH_LABEL must be a text or an array of texts");
  EXPECT_EQ(reason(Dictionary{{"GRANT", "CLIENT_ENTITLEMENT"}}), "GRANT must be an array of texts");
  EXPECT_EQ(reason(Dictionary{{"DENY", Array{1}}}), "DENY must be a text or an array of texts");
  EXPECT_EQ(reason(Dictionary{{"MATCH_ANYBODY", 1}}), "MATCH_ANYBODY must be a boolean");
  EXPECT_EQ(reason(Dictionary{{"MATCH_ANYBODY", true}, {"MATCH_USER", 0}}),
            "MATCH_ANYBODY does not go with other match keys");
}

TEST(RuleFile, TheNumberOfEntriesIsBounded) {
  const Array most(kMaxRuleEntries, Value(1));
  const Array too_many(kMaxRuleEntries + 1, Value(1));
  EXPECT_EQ(parsed(Dictionary{{"MATCH_USER", most}}).rule.users->size(), kMaxRuleEntries);
  EXPECT_EQ(reason(Dictionary{{"MATCH_USER", too_many}}),
            "MATCH_USER must be shorter: too many entries");
  const Array texts(kMaxRuleEntries + 1, Value("a.service"));
  EXPECT_EQ(reason(Dictionary{{"MATCH_UNIT", texts}}),
            "MATCH_UNIT must be shorter: too many entries");
}

}  // namespace
}  // namespace spacekeep::access
