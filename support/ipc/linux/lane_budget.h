// Thread safety: every member may be called from any thread.
//
// What the calls of one user that wait in lanes or are served there, and those that bring a
// descriptor, may hold until they are answered. They outlive the connection over which they came, so
// the limit of calls per connection bounds nothing for a user who comes and goes.
#pragma once

#include <sys/types.h>

#include <cstddef>
#include <map>
#include <memory>
#include <string>

#include "support/ipc/linux/user_turns.h"
#include "support/runtime/runtime.h"

namespace spacekeep::ipc {

class LaneBudget : public std::enable_shared_from_this<LaneBudget> {
 public:
  explicit LaneBudget(UserTurnLimits limits) : limits_(limits) {}

  /// The room that a call of `bytes` takes up until the last copy of the answer is gone. Null when
  /// the user has none left, with the reason in `why`.
  [[nodiscard]] std::shared_ptr<void> take(uid_t uid, std::size_t bytes, std::string& why);

 private:
  struct Held {
    std::size_t calls = 0;
    std::size_t bytes = 0;
  };
  void giveBack(uid_t uid, std::size_t bytes);

  const UserTurnLimits limits_;
  rt::Mutex mutex_;
  std::map<uid_t, Held> held_;  // protected by mutex_; those with a call
};

}  // namespace spacekeep::ipc
