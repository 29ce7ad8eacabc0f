// Thread safety: pure functions over /proc and files; a HeldLocks belongs to one thread.
//
// Whether a cache's owner is at work on it.
#pragma once

#include <string>
#include <vector>

#include "services/cachedir/engine/unique_fd.h"
#include "services/command/rules/rule.h"

namespace spacekeep::command {

/// In words what holds ("firefox is running"), empty when nothing does.
[[nodiscard]] std::string whyNotNow(const std::vector<Condition>& conditions,
                                    const std::string& proc = "/proc");

/// Whether somebody holds a lock of any kind on `path`, without touching the file.
[[nodiscard]] bool isLocked(const std::string& path, const std::string& proc = "/proc");

/// The owner's own locks, held until this is destroyed. A lock file that is not there is held by
/// nobody and is not made.
class HeldLocks {
 public:
  /// What could not be locked, in words; empty when all are held.
  [[nodiscard]] std::string take(const std::vector<OwnersLock>& locks);

 private:
  std::vector<cachedir::UniqueFd> held_;
};

/// The same question without taking anything.
[[nodiscard]] std::string whoHolds(const std::vector<OwnersLock>& locks);

}  // namespace spacekeep::command
