// Thread safety: confined to the IPC thread.
//
// Lets the calls that need a turn through one at a time for each user: the next one starts when the
// one before is answered. Work that goes through one serial queue of the daemon is then shared
// between users, however many calls one of them has waiting on however many connections.
#pragma once

#include <sys/types.h>

#include <cstddef>
#include <deque>
#include <functional>
#include <map>
#include <string>

namespace spacekeep::ipc {

struct UserTurnLimits {
  std::size_t waiting_calls = 4096;              ///< per user
  std::size_t waiting_bytes = 16 * 1024 * 1024;  ///< per user, as they came over the wire
};

class UserTurns {
 public:
  struct Call {
    bool needs_turn = false;  ///< end() must follow; without it, only the order is kept
    std::size_t bytes = 0;
    std::function<void()> start;
  };

  explicit UserTurns(UserTurnLimits limits) : limits_(limits) {}

  /// Why no further call of this size may wait, empty when it may.
  [[nodiscard]] std::string refusal(uid_t uid, std::size_t bytes) const;
  /// Starts it now, or after the earlier calls of this user.
  void add(uid_t uid, Call call);
  /// The call that has the turn is answered, or will never be.
  void end(uid_t uid);
  [[nodiscard]] std::size_t waiting(uid_t uid) const;
  /// Forgets the calls that wait. They may hold what holds this object.
  void clear();

 private:
  struct User {
    bool turn_is_taken = false;
    std::size_t waiting_bytes = 0;
    std::deque<Call> waiting;
  };
  void startNext(uid_t uid);

  const UserTurnLimits limits_;
  std::map<uid_t, User> users_;  // those with a call that waits or has the turn
};

}  // namespace spacekeep::ipc
