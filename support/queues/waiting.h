// Thread safety: every member may be called from any thread.
//
// Counting semaphores and task groups, the two things that code of the daemon waits on. Whoever has
// returned from a wait may destroy the object, also while the one that woke it is still returning.
#pragma once

#include <cstdint>
#include <functional>
#include <memory>

#include "support/queues/concurrent_queue.h"
#include "support/runtime/runtime.h"

namespace spacekeep {

enum class WaitResult { kSignalled, kTimedOut };

class CountingSemaphore {
 public:
  explicit CountingSemaphore(std::uint64_t count) : count_(count) {}

  void signal();
  /// Waits without any time limit.
  void wait();
  /// A signal that is already there wins over a deadline that has already passed.
  [[nodiscard]] WaitResult waitForNs(std::uint64_t duration_ns);

 private:
  [[nodiscard]] WaitResult waitUntil(std::uint64_t deadline_ticks);
  [[nodiscard]] bool takeOne();

  rt::Mutex mutex_;
  // Protected by mutex_.
  rt::CondVar signalled_;
  std::uint64_t count_;
};

/// Counts tasks that have not ended. One group may be waited on by many threads.
class TaskGroup {
 public:
  void enter();
  void leave();
  /// enter(), run on `queue`, leave(). The group must live until the task has ended; what the task
  /// captured is gone by then and cannot keep it.
  void async(ConcurrentQueue& queue, Task task);
  void wait();
  [[nodiscard]] WaitResult waitForNs(std::uint64_t duration_ns);

 private:
  [[nodiscard]] WaitResult waitUntil(std::uint64_t deadline_ticks);
  [[nodiscard]] bool isEmpty();

  rt::Mutex mutex_;
  // Protected by mutex_.
  rt::CondVar empty_;
  std::uint64_t entered_ = 0;
};

/// The same for whoever may stop waiting before the task has ended: the group lives as long as its
/// tasks.
void asyncInGroup(const std::shared_ptr<TaskGroup>& group, ConcurrentQueue& queue, Task task);

}  // namespace spacekeep
