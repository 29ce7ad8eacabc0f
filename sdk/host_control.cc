#include "sdk/host_control.h"

#include <utility>

#include "support/queues/concurrent_queue.h"
#include "support/runtime/locks.h"

namespace spacekeep::sdk {

HostControl::HostControl(std::function<void(const HostStatus&)> on_status)
    : on_status_(std::move(on_status)) {}

void HostControl::stop() {
  change([this] { stopping_ = true; });
}

bool HostControl::stopping() const {
  const std::scoped_lock lock(mutex_);
  return stopping_;
}

void HostControl::change(const std::function<void()>& change) {
  const std::scoped_lock lock(mutex_);
  change();
  changed_.notifyAll();
}

void HostControl::look(const std::function<void()>& look) const {
  const std::scoped_lock lock(mutex_);
  look();
}

bool HostControl::waitUntil(std::uint64_t deadline_ticks, const std::function<bool()>& condition,
                            bool until_stop) {
  const std::scoped_lock lock(mutex_);
  while (!condition()) {
    if (until_stop && stopping_) return false;
    if (!changed_.waitUntil(mutex_, deadline_ticks)) return condition();
  }
  return true;
}

void HostControl::report(HostState state, std::string text) {
  const HostStatus now{state, std::move(text)};
  {
    const std::scoped_lock lock(mutex_);
    status_ = now;
  }
  if (on_status_) on_status_(now);
}

HostStatus HostControl::status() const {
  const std::scoped_lock lock(mutex_);
  return status_;
}

void HostControl::markEnded() {
  change([this] { ended_ = true; });
}

void HostControl::waitUntilEnded() {
  const BlockingRegion region;
  waitUntil(
      rt::kNever, [this] { return ended_; }, false);
}

}  // namespace spacekeep::sdk
