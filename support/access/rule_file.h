// Thread safety: pure functions, apart from what the given lookups do.
//
// A rule file is a property list holding one dictionary:
//
//   "MATCH_USER"     user names (strings) or numbers, one or an array
//
//   "MATCH_GROUP"    the same for groups, primary or supplementary
//
//   "MATCH_UNIT"     system services ("cache.service"), one or an array
//
//   "MATCH_LABEL"    security labels, one or an array
//
//   "MATCH_ANYBODY"  true: the rule is about every peer; goes with no other match key
//
//   "GRANT"          array of entitlements
//
//   "DENY"           array of entitlements; wins over every grant, of this and of other files
//
// All match keys that are present must hold. A rule with none of them matches nobody. A file with
// any other key, or with a value of another kind, is broken and taken out as a whole: a misspelt
// match key must not widen what the rule matches.
#pragma once

#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <variant>
#include <vector>

#include "support/access/entitlement_rules.h"
#include "support/values/value.h"

namespace spacekeep::access {

struct NameAnswer {
  // NOLINTNEXTLINE(google-explicit-constructor): most lookups know what they find
  NameAnswer(std::optional<std::uint32_t> found) : number(found) {}

  std::optional<std::uint32_t> number;  ///< none when there is no such name
  std::string failure;                  ///< why it is not known whether there is, empty when it is
};

/// How names become numbers.
struct NameLookup {
  std::function<NameAnswer(const std::string&)> user;
  std::function<NameAnswer(const std::string&)> group;
};

struct RuleError {
  std::string reason;  ///< in words for a person
};

struct ParsedRule {
  Rule rule;
  /// What is odd but not broken: names that are unknown (and so match nobody) or could not be looked
  /// up (and so may match anybody, where the rule denies), entitlements that
  /// nothing asks for. In words, to be logged.
  std::vector<std::string> remarks;
};

/// Most entries that any one array of a rule file may have.
inline constexpr std::size_t kMaxRuleEntries = 256;

[[nodiscard]] std::variant<ParsedRule, RuleError> ruleFromDocument(const std::string& name,
                                                                   const Value& document,
                                                                   const NameLookup& lookup);

}  // namespace spacekeep::access
