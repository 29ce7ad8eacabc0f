#include "support/events/queue_probe.h"

#include <mutex>
#include <utility>

namespace spacekeep {

QueueProbe::QueueProbe(std::vector<std::shared_ptr<SerialQueue>> queues)
    : queues_(std::move(queues)), state_(std::make_shared<State>()) {
  state_->asked.resize(queues_.size(), false);
}

bool QueueProbe::answersWithin(std::uint64_t wait_ns) {
  const std::uint64_t deadline = rt::deadlineAfterNs(wait_ns);
  askAll();
  const std::scoped_lock lock(state_->mutex);
  while (state_->open > 0) {
    if (rt::ticks() >= deadline) return false;
    state_->answered.waitUntil(state_->mutex, deadline);
  }
  return true;
}

void QueueProbe::askAll() {
  for (std::size_t i = 0; i < queues_.size(); ++i) {
    {
      const std::scoped_lock lock(state_->mutex);
      if (state_->asked[i]) continue;
      state_->asked[i] = true;
      ++state_->open;
    }
    queues_[i]->async([state = state_, i] {
      const std::scoped_lock lock(state->mutex);
      state->asked[i] = false;
      --state->open;
      state->answered.notifyAll();
    });
  }
}

}  // namespace spacekeep
