// Thread safety: every function may be called from any thread.
//
// The system that the doctor looks at: this one, or one whose root is a directory here.
#pragma once

#include <sys/stat.h>
#include <sys/types.h>

#include <optional>
#include <string>

#include "support/linux/linux_paths.h"

namespace spacekeep::ctl::doctor {

struct Place {
  std::string root;  ///< without a slash at its end; empty: this system
  LinuxPaths paths;  ///< below the root
  std::string socket;
  /// Who, besides root, may own what the daemon relies on: the user that the daemon runs as. In
  /// another root, whoever looks at it.
  uid_t own_user = 0;

  [[nodiscard]] bool isThisSystem() const { return root.empty(); }
  [[nodiscard]] bool isTrusted(uid_t owner) const { return owner == 0 || owner == own_user; }
};

/// `socket` is the daemon's socket where it is not the usual one, else empty.
[[nodiscard]] Place placeAt(std::string root, const std::string& socket);

/// "root", "anna", or "user 1234" when it has no name.
[[nodiscard]] std::string userText(uid_t user);
/// "0644".
[[nodiscard]] std::string modeText(mode_t mode);

/// None when there is nothing, or it cannot be looked at; errno tells which.
[[nodiscard]] std::optional<struct stat> statusOf(const std::string& path);

/// Why somebody else could change what stands there; none when nobody could.
[[nodiscard]] std::optional<std::string> distrust(const Place& place, const struct stat& status);

}  // namespace spacekeep::ctl::doctor
