#include "support/access/rule_file.h"

#include <algorithm>
#include <string_view>
#include <utility>

#include "support/access/entitlements.h"

namespace spacekeep::access {
namespace {

using Lookup = std::function<NameAnswer(const std::string&)>;
using Problem = std::optional<RuleError>;

RuleError wrongKind(std::string_view key, std::string_view wanted) {
  return {std::string(key) + " must be " + std::string(wanted)};
}

/// One value stands for an array of one.
std::vector<Value> alternativesOf(const Value& value) {
  if (const Array* array = value.array()) return *array;
  return {value};
}

Problem readTexts(std::string_view key, const Value& value, std::vector<std::string>& texts) {
  for (const Value& entry : alternativesOf(value)) {
    const std::string* text = entry.string();
    if (text == nullptr || text->empty()) return wrongKind(key, "a text or an array of texts");
    texts.push_back(*text);
  }
  if (texts.size() > kMaxRuleEntries) return wrongKind(key, "shorter: too many entries");
  return std::nullopt;
}

/// 2^32 - 1 is what the kernel calls "no such user", so no rule may speak of it.
std::optional<std::uint32_t> plainId(const Value& entry) {
  const auto number = entry.asSigned();
  if (!entry.isNumber() || !number || *number < 0 || *number >= std::int64_t{UINT32_MAX}) {
    return std::nullopt;
  }
  if (entry != Value(*number)) return std::nullopt;  // a fraction
  return static_cast<std::uint32_t>(*number);
}

/// The number of a user or group, none when nobody is called so.
std::optional<std::uint32_t> lookUp(std::string_view key, const std::string& name,
                                    const Lookup& lookup, bool& left_open,
                                    std::vector<std::string>& remarks) {
  const NameAnswer answer = lookup(name);
  left_open = left_open || !answer.failure.empty();
  if (!answer.failure.empty()) {
    remarks.push_back(std::string(key) + " names " + name + ", which could not be looked up (" +
                      answer.failure + "): what the rule denies, it may deny to anybody");
  } else if (!answer.number) {
    remarks.push_back(std::string(key) + " names " + name +
                      ", which does not exist here and matches nobody");
  }
  return answer.number;
}

Problem readIds(std::string_view key, const Value& value, const Lookup& lookup, bool& left_open,
                std::vector<std::uint32_t>& ids, std::vector<std::string>& remarks) {
  const std::vector<Value> entries = alternativesOf(value);
  if (entries.size() > kMaxRuleEntries) return wrongKind(key, "shorter: too many entries");
  for (const Value& entry : entries) {
    const std::string* name = entry.string();
    const auto id =
        name != nullptr ? lookUp(key, *name, lookup, left_open, remarks) : plainId(entry);
    if (id) {
      ids.push_back(*id);
    } else if (name == nullptr) {
      return wrongKind(key, "a name, a number, or an array of these");
    }
  }
  return std::nullopt;
}

Problem readEntitlements(std::string_view key, const Value& value,
                         std::vector<std::string>& entitlements,
                         std::vector<std::string>& remarks) {
  if (value.array() == nullptr) return wrongKind(key, "an array of texts");
  if (Problem problem = readTexts(key, value, entitlements)) return problem;
  for (const std::string& entitlement : entitlements) {
    if (std::ranges::find(kAllEntitlements, entitlement) == kAllEntitlements.end()) {
      remarks.push_back(std::string(key) + " names " + entitlement +
                        ", which is no entitlement of this system");
    }
  }
  return std::nullopt;
}

Problem readKey(const std::string& key, const Value& value, const NameLookup& lookup,
                ParsedRule& parsed) {
  Rule& rule = parsed.rule;
  if (key == "MATCH_USER") {
    return readIds(key, value, lookup.user, rule.users_left_open, rule.users.emplace(),
                   parsed.remarks);
  }
  if (key == "MATCH_GROUP") {
    return readIds(key, value, lookup.group, rule.groups_left_open, rule.groups.emplace(),
                   parsed.remarks);
  }
  if (key == "MATCH_UNIT") return readTexts(key, value, rule.units.emplace());
  if (key == "MATCH_LABEL") return readTexts(key, value, rule.labels.emplace());
  if (key == "GRANT") return readEntitlements(key, value, rule.grants, parsed.remarks);
  if (key == "DENY") return readEntitlements(key, value, rule.denies, parsed.remarks);
  if (key == "MATCH_ANYBODY") {
    if (value.boolean() == nullptr) return wrongKind(key, "a boolean");
    rule.matches_anybody = *value.boolean();
    return std::nullopt;
  }
  return RuleError{"unknown key " + key};
}

}  // namespace

std::variant<ParsedRule, RuleError> ruleFromDocument(const std::string& name, const Value& document,
                                                     const NameLookup& lookup) {
  const Dictionary* dictionary = document.dictionary();
  if (dictionary == nullptr) return RuleError{"the document is no dictionary"};
  ParsedRule parsed;
  parsed.rule.name = name;
  for (const Dictionary::Entry& entry : *dictionary) {
    if (Problem problem = readKey(entry.key, entry.value, lookup, parsed)) return *problem;
  }
  const Rule& rule = parsed.rule;
  if (rule.matches_anybody && (rule.users || rule.groups || rule.units || rule.labels)) {
    return RuleError{"MATCH_ANYBODY does not go with other match keys"};
  }
  return parsed;
}

}  // namespace spacekeep::access
