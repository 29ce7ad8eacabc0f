// Thread safety: pure functions over /proc and files; a HeldLocks and a ConditionWatch belong to one thread.
//
// Whether a cache's owner is at work on it.
#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include "services/cachedir/engine/unique_fd.h"
#include "services/command/rules/rule.h"

namespace spacekeep::command {

/// In words what holds ("firefox is running"), or of what nobody can tell whether it does; empty when
/// nothing does.
[[nodiscard]] std::string whyNotNow(const std::vector<Condition>& conditions,
                                    const std::string& proc = "/proc");

/// Asks again while a request goes on, because the owner may begin his work at any time. Asking
/// costs a look at every process, so it is done about once a second, and where it takes long less
/// often, down to once in ten.
class ConditionWatch {
 public:
  static constexpr std::uint64_t kEveryNs = 1'000'000'000;

  /// As of a moment ago none of them held. `conditions` must outlive this.
  explicit ConditionWatch(const std::vector<Condition>& conditions,
                          std::uint64_t every_ns = kEveryNs);

  /// Whether one holds, or has held once when this was asked.
  [[nodiscard]] bool holds();
  /// In words which one; empty as long as none has been seen to hold.
  [[nodiscard]] const std::string& why() const { return why_; }

 private:
  const std::vector<Condition>& conditions_;
  const std::uint64_t every_ns_;
  std::uint64_t pause_ns_;
  std::uint64_t asked_ticks_;
  std::string why_;
};

/// Whether somebody holds a lock of any kind on `path`, without touching the file. Also when nobody
/// can tell.
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
