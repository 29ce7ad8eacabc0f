// Thread safety: pure functions.
//
// Turns the content of a rule file into a rule, or into one line that says what is wrong with it.
#pragma once

#include <string>
#include <variant>

#include "services/cachedir/engine/rules.h"
#include "services/command/base/user_folders.h"
#include "services/command/rules/rule.h"

namespace spacekeep::command {

using cachedir::RuleError;

/// `file` names the document in the error text, `name` becomes the rule's name. Paths are filled in
/// from `folders`; null: only absolute ones are good.
[[nodiscard]] std::variant<Rule, RuleError> ruleOf(const Value& document, const std::string& file,
                                                   const std::string& name,
                                                   const UserFolders* folders);

}  // namespace spacekeep::command
