// Thread safety: confined to the thread that made it.
//
// A thread with a duty of its own, lent to the global queue for as long as nothing makes it wait.
// Passing a short request on to a worker and its answer back costs two wake-ups, which is most of
// what such a request costs; a thread that is awake anyway serves it for nothing. Whatever the thread
// submits to the queue while it is lent, it runs itself, in order. As soon as it is about to wait, it
// gives its duty to somebody else and passes on what it has not begun, and so never holds up either.
#pragma once

#include <deque>
#include <functional>

#include "support/queues/concurrent_queue.h"

namespace spacekeep {

class BorrowedThread {
 public:
  /// `give_up_duty` runs on this thread, at most once, before it waits for the first time.
  BorrowedThread(ConcurrentQueue& queue, std::function<void()> give_up_duty);
  ~BorrowedThread();
  BorrowedThread(const BorrowedThread&) = delete;
  BorrowedThread& operator=(const BorrowedThread&) = delete;

  /// Runs `task` and everything that it submits in turn. Answers whether the thread still has its
  /// duty.
  bool run(Task task);

  /// The borrowed thread that calls this, null when it is none.
  [[nodiscard]] static BorrowedThread* current();

  /// Takes a task that this thread submits to `queue`; leaves it alone and answers false when it is
  /// another queue or the duty has been given up.
  bool take(const ConcurrentQueue& queue, Task& task);
  /// The thread is about to wait.
  void aboutToWait();

 private:
  ConcurrentQueue& queue_;
  std::function<void()> give_up_duty_;  // empty once it has run
  std::deque<Task> tasks_;
};

}  // namespace spacekeep
