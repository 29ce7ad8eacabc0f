#include "support/ipc/linux/user_turns.h"

#include <utility>

namespace spacekeep::ipc {

// A connection that closes leaves its calls here, so the limit of calls per connection bounds
// nothing for a user who comes and goes.
std::string UserTurns::refusal(uid_t uid, std::size_t bytes) const {
  const auto found = users_.find(uid);
  if (found == users_.end()) return "";
  const User& user = found->second;
  if (user.waiting.size() < limits_.waiting_calls &&
      user.waiting_bytes + bytes <= limits_.waiting_bytes) {
    return "";
  }
  return std::to_string(user.waiting.size()) + " calls of this user with " +
         std::to_string(user.waiting_bytes) + " bytes wait for their turn; wait for answers";
}

void UserTurns::add(uid_t uid, Call call) {
  User& user = users_[uid];
  user.waiting_bytes += call.bytes;
  user.waiting.push_back(std::move(call));
  startNext(uid);
}

void UserTurns::end(uid_t uid) {
  const auto found = users_.find(uid);
  if (found == users_.end()) return;
  found->second.turn_is_taken = false;
  startNext(uid);
}

std::size_t UserTurns::waiting(uid_t uid) const {
  const auto found = users_.find(uid);
  return found == users_.end() ? 0 : found->second.waiting.size();
}

void UserTurns::clear() {
  // A call that goes may end another one's turn while it does.
  const auto gone = std::exchange(users_, {});
}

void UserTurns::startNext(uid_t uid) {
  User& user = users_[uid];
  while (!user.turn_is_taken && !user.waiting.empty()) {
    const Call next = std::move(user.waiting.front());
    user.waiting.pop_front();
    user.waiting_bytes -= next.bytes;
    user.turn_is_taken = next.needs_turn;
    next.start();
  }
  if (!user.turn_is_taken) users_.erase(uid);
}

}  // namespace spacekeep::ipc
