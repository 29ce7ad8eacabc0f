// Thread safety: may be called from any thread.
//
// Reads the rule files of the vendor and of the administrator.
#pragma once

#include <sys/types.h>

#include <string>
#include <vector>

#include "support/access/rule_file.h"

namespace spacekeep::access {

inline constexpr const char* kVendorRuleDirectory = "/usr/lib/spacekeep/entitlements.d";
inline constexpr const char* kAdministratorRuleDirectory = "/etc/spacekeep/entitlements.d";

/// Most files read from one directory, and the size of the largest, in bytes.
inline constexpr std::size_t kMaxRuleFiles = 256;
inline constexpr std::size_t kMaxRuleFileBytes = 64 * 1024;

/// Something to know about a rule file or its directory.
struct RuleFileFinding {
  enum class Kind {
    kDirectoryNotUsed,  ///< it is there, and no rule of any directory holds
    kGrantsNothing,     ///< the file is left out
    kRemark,            ///< odd, but used
    kReplaces,          ///< the file takes the place of another, which `text` names
  };
  Kind kind = Kind::kRemark;
  std::string path;  ///< of the file or directory
  std::string text;  ///< what there is to say, in words for a person
};

struct ReadRules {
  std::vector<Rule> rules;  ///< in the order of the file names
  std::vector<RuleFileFinding> findings;
};

/// The rules of every "*.plist" file. A file of the administrator replaces the vendor's of the same
/// name, also when it is broken: what somebody meant to take away must not come back by a typing
/// error. Broken files, and files that anybody but root or `own_user` could have written, are left
/// out. A directory that cannot be read, or that others could have written, may have denied
/// anything to anybody: then there are no rules at all. A missing directory is an empty one.
[[nodiscard]] ReadRules readRules(const std::string& vendor_directory,
                                  const std::string& administrator_directory,
                                  const NameLookup& lookup, uid_t own_user);

/// readRules() for this process's own user, with what is wrong in the log.
[[nodiscard]] std::vector<Rule> loadRules(const std::string& vendor_directory,
                                          const std::string& administrator_directory,
                                          const NameLookup& lookup);

/// By the system's databases (getpwnam_r(3), getgrnam_r(3)).
[[nodiscard]] NameLookup systemNameLookup();

}  // namespace spacekeep::access
