#include "support/ipc/linux/lane_budget.h"

#include <mutex>

namespace spacekeep::ipc {

std::shared_ptr<void> LaneBudget::take(uid_t uid, std::size_t bytes, std::string& why) {
  {
    const std::scoped_lock lock(mutex_);
    const auto found = held_.find(uid);
    const Held held = found == held_.end() ? Held{} : found->second;
    if (held.calls >= limits_.waiting_calls || held.bytes + bytes > limits_.waiting_bytes) {
      why = std::to_string(held.calls) + " calls of this user with " + std::to_string(held.bytes) +
            " bytes wait or are served; wait for answers";
      return nullptr;
    }
    held_[uid] = {held.calls + 1, held.bytes + bytes};
  }
  return {this, [self = shared_from_this(), uid, bytes](void*) { self->giveBack(uid, bytes); }};
}

void LaneBudget::giveBack(uid_t uid, std::size_t bytes) {
  const std::scoped_lock lock(mutex_);
  const auto found = held_.find(uid);
  found->second.bytes -= bytes;
  if (--found->second.calls == 0) held_.erase(found);
}

}  // namespace spacekeep::ipc
