#include "support/events/keep_alive_count.h"

#include <mutex>
#include <utility>

namespace spacekeep {

KeepAliveCount::KeepAliveCount(Changed changed) : changed_(std::move(changed)) {}

void KeepAliveCount::begin() {
  const std::scoped_lock lock(mutex_);
  if (++open_ == 1) changed_(true);
}

void KeepAliveCount::end() {
  const std::scoped_lock lock(mutex_);
  if (open_ == 0) rt::panic("a keep-alive transaction ended that had not begun");
  if (--open_ == 0) changed_(false);
}

std::size_t KeepAliveCount::open() const {
  const std::scoped_lock lock(mutex_);
  return open_;
}

}  // namespace spacekeep
