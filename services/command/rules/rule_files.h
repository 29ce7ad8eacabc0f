// Thread safety: pure functions over the file system.
//
// Finds and reads rule files: single ones, and directories of them of which a later one replaces
// single keys of the file of the same name in an earlier one. So an administrator's file of three
// lines switches a shipped rule on or off.
#pragma once

#include <string>
#include <variant>
#include <vector>

#include "services/command/base/user_folders.h"
#include "services/command/rules/rule.h"

namespace spacekeep::command {

inline constexpr std::size_t kMaxRules = 128;

struct RulesWanted {
  std::vector<std::string> files;
  std::vector<std::string> folders;  // later ones replace keys; one that is missing is empty
  std::vector<std::string> only;     // names of rules in the folders; none: all
};

/// All rules, those of the folders first and in the order of their names; also those that are
/// switched off. The first bad file is told instead: half of the rules would be a surprise.
[[nodiscard]] std::variant<std::vector<Rule>, cachedir::RuleError> readRules(
    const RulesWanted& wanted, const UserFolders* folders);

}  // namespace spacekeep::command
