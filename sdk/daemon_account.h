// Thread safety: may be called from any thread.
//
// The account under which the installed daemon runs. Services let it call them.
#pragma once

#include <sys/types.h>

#include <optional>
#include <string>

namespace spacekeep::sdk {

/// As packaging makes it. Only root can make an account, so the name alone can be trusted.
inline constexpr const char* kDaemonAccount = "_spacekeep";

/// The number of an account (getpwnam_r(3)); none when there is no such account.
[[nodiscard]] std::optional<uid_t> accountNumber(const std::string& name);

}  // namespace spacekeep::sdk
