#include "support/ipc/lanes.h"

#include <mutex>
#include <utility>

namespace spacekeep::ipc {

void Lanes::run(std::string_view name, std::size_t width, Task task) {
  Lane* lane = nullptr;
  {
    const std::scoped_lock lock(mutex_);
    lane = &lanes_.try_emplace(std::string(name)).first->second;
    if (lane->running >= width) {
      lane->waiting.push_back(std::move(task));
      return;
    }
    ++lane->running;
  }
  start(*lane, std::move(task));
}

std::size_t Lanes::waiting(std::string_view name) const {
  const std::scoped_lock lock(mutex_);
  const auto lane = lanes_.find(name);
  return lane == lanes_.end() ? 0 : lane->second.waiting.size();
}

void Lanes::start(Lane& lane, Task task) {
  global_.async([self = shared_from_this(), &lane, task = std::move(task)]() mutable {
    task();
    task = nullptr;
    self->ended(lane);
  });
}

/// The place is handed to the next one as a new task, so that a long lane does not keep a worker of
/// the global queue from everything else.
void Lanes::ended(Lane& lane) {
  Task next;
  {
    const std::scoped_lock lock(mutex_);
    if (lane.waiting.empty()) {
      --lane.running;
      return;
    }
    next = std::move(lane.waiting.front());
    lane.waiting.pop_front();
  }
  start(lane, std::move(next));
}

}  // namespace spacekeep::ipc
