// Thread safety: confined to the IPC thread.
//
// Calls that were read off the bus and have to wait.
#pragma once

#include <sys/types.h>
#include <systemd/sd-bus.h>

#include <cstddef>
#include <deque>
#include <map>
#include <utility>

#include "support/ipc/linux/owned_message.h"

namespace spacekeep::ipc {

/// The bytes that the calls of each user may take up together.
class HeldBudget {
 public:
  explicit HeldBudget(std::size_t bytes_per_user) : bytes_per_user_(bytes_per_user) {}

  [[nodiscard]] bool take(uid_t uid, std::size_t bytes) {
    std::size_t& used = used_[uid];
    const bool fits = bytes <= bytes_per_user_ - used;
    if (fits) used += bytes;
    if (used == 0) used_.erase(uid);
    return fits;
  }
  void giveBack(uid_t uid, std::size_t bytes) {
    const auto found = used_.find(uid);
    if (found == used_.end()) return;
    found->second -= bytes;
    if (found->second == 0) used_.erase(found);
  }

 private:
  const std::size_t bytes_per_user_;
  std::map<uid_t, std::size_t> used_;  // no zeros
};

/// In the order in which they came.
class HeldCalls {
 public:
  struct Call {
    OwnedMessage message;
    std::size_t bytes = 0;
  };

  [[nodiscard]] bool empty() const { return calls_.empty(); }
  [[nodiscard]] std::size_t size() const { return calls_.size(); }
  [[nodiscard]] std::size_t bytes() const { return bytes_; }
  void add(sd_bus_message* message, std::size_t bytes) {
    calls_.push_back({OwnedMessage(sd_bus_message_ref(message)), bytes});
    bytes_ += bytes;
  }
  [[nodiscard]] Call takeFirst() {
    Call first = std::move(calls_.front());
    calls_.pop_front();
    bytes_ -= first.bytes;
    return first;
  }

 private:
  std::deque<Call> calls_;
  std::size_t bytes_ = 0;
};

}  // namespace spacekeep::ipc
