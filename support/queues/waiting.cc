#include "support/queues/waiting.h"

#include <mutex>
#include <utility>

namespace spacekeep {
namespace {

using Lock = std::unique_lock<rt::Mutex>;

}  // namespace

void CountingSemaphore::signal() {
  const Lock lock(mutex_);
  ++count_;
  // Under the lock: the waiter may destroy the semaphore as soon as it holds the lock again.
  signalled_.notifyOne();
}

void CountingSemaphore::wait() { static_cast<void>(waitUntil(rt::kNever)); }

WaitResult CountingSemaphore::waitForNs(std::uint64_t duration_ns) {
  return waitUntil(rt::deadlineAfterNs(duration_ns));
}

WaitResult CountingSemaphore::waitUntil(std::uint64_t deadline_ticks) {
  if (takeOne()) return WaitResult::kSignalled;
  const BlockingRegion region;
  const Lock lock(mutex_);
  while (count_ == 0) {
    // A signal that arrived together with the deadline is taken: the count decides.
    if (!signalled_.waitUntil(mutex_, deadline_ticks) && count_ == 0) return WaitResult::kTimedOut;
  }
  --count_;
  return WaitResult::kSignalled;
}

bool CountingSemaphore::takeOne() {
  const Lock lock(mutex_);
  if (count_ == 0) return false;
  --count_;
  return true;
}

void TaskGroup::enter() {
  const Lock lock(mutex_);
  ++entered_;
}

void TaskGroup::leave() {
  const Lock lock(mutex_);
  if (entered_ == 0) rt::panic("TaskGroup::leave without enter");
  // Under the lock, as in signal().
  if (--entered_ == 0) empty_.notifyAll();
}

void TaskGroup::async(ConcurrentQueue& queue, Task task) {
  enter();
  queue.async([this, task = std::move(task)]() mutable {
    task();
    task = nullptr;  // What it captured is gone when the waiter goes on.
    leave();
  });
}

void asyncInGroup(const std::shared_ptr<TaskGroup>& group, ConcurrentQueue& queue, Task task) {
  group->enter();
  queue.async([group, task = std::move(task)]() mutable {
    task();
    task = nullptr;  // As in TaskGroup::async; the group is held until it has been left.
    group->leave();
  });
}

void TaskGroup::wait() { static_cast<void>(waitUntil(rt::kNever)); }

WaitResult TaskGroup::waitForNs(std::uint64_t duration_ns) {
  return waitUntil(rt::deadlineAfterNs(duration_ns));
}

WaitResult TaskGroup::waitUntil(std::uint64_t deadline_ticks) {
  if (isEmpty()) return WaitResult::kSignalled;
  const BlockingRegion region;
  const Lock lock(mutex_);
  while (entered_ > 0) {
    if (!empty_.waitUntil(mutex_, deadline_ticks) && entered_ > 0) return WaitResult::kTimedOut;
  }
  return WaitResult::kSignalled;
}

bool TaskGroup::isEmpty() {
  const Lock lock(mutex_);
  return entered_ == 0;
}

}  // namespace spacekeep
