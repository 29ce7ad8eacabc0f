// Thread safety: may be called from any thread.
//
// Reads the rule files of the vendor and of the administrator.
#pragma once

#include <string>
#include <vector>

#include "support/access/rule_file.h"

namespace spacekeep::access {

inline constexpr const char* kVendorRuleDirectory = "/usr/lib/spacekeep/entitlements.d";
inline constexpr const char* kAdministratorRuleDirectory = "/etc/spacekeep/entitlements.d";

/// Most files read from one directory, and the size of the largest, in bytes.
inline constexpr std::size_t kMaxRuleFiles = 256;
inline constexpr std::size_t kMaxRuleFileBytes = 64 * 1024;

/// The rules of every "*.plist" file, in the order of the file names. A file of the administrator
/// replaces the vendor's of the same name, also when it is broken: what somebody meant to take away
/// must not come back by a typing error. Broken files, and files or directories that anybody but
/// root or this process's own user could have written, are left out; each is logged with its
/// reason.
[[nodiscard]] std::vector<Rule> loadRules(const std::string& vendor_directory,
                                          const std::string& administrator_directory,
                                          const NameLookup& lookup);

/// By the system's databases (getpwnam_r(3), getgrnam_r(3)).
[[nodiscard]] NameLookup systemNameLookup();

}  // namespace spacekeep::access
