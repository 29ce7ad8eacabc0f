#include <spacekeep/service.h>

#include <algorithm>

#include "support/queues/concurrent_queue.h"
#include "support/runtime/locks.h"
#include "support/runtime/runtime.h"

namespace spacekeep::sdk {

struct Cancellation::State {
  rt::Mutex mutex;
  // Protected by mutex.
  rt::CondVar changed;
  bool cancelled = false;
};

Cancellation::Cancellation() : state_(std::make_shared<State>()) {}

bool Cancellation::cancelled() const {
  const std::scoped_lock lock(state_->mutex);
  return state_->cancelled;
}

bool Cancellation::waitFor(std::chrono::milliseconds duration) const {
  constexpr std::int64_t kNsPerMs = 1'000'000;
  const std::int64_t longest_ms = INT64_MAX / kNsPerMs;
  const auto wait_ms = std::clamp<std::int64_t>(duration.count(), 0, longest_ms);
  const std::uint64_t deadline =
      rt::deadlineAfterNs(static_cast<std::uint64_t>(wait_ms * kNsPerMs));
  const BlockingRegion region;
  const std::scoped_lock lock(state_->mutex);
  while (!state_->cancelled) {
    if (!state_->changed.waitUntil(state_->mutex, deadline)) break;
  }
  return state_->cancelled;
}

void Cancellation::cancel() const {
  const std::scoped_lock lock(state_->mutex);
  state_->cancelled = true;
  state_->changed.notifyAll();
}

}  // namespace spacekeep::sdk
