#include "support/queues/borrowed_thread.h"

#include <utility>

#include "support/queues/run_task.h"

namespace spacekeep {

BorrowedThread::BorrowedThread(ConcurrentQueue& queue, std::function<void()> give_up_duty)
    : queue_(queue), give_up_duty_(std::move(give_up_duty)) {
  rt::threadSlot(rt::ThreadSlot::kBorrowedThread) = this;
}

BorrowedThread::~BorrowedThread() { rt::threadSlot(rt::ThreadSlot::kBorrowedThread) = nullptr; }

bool BorrowedThread::run(Task task) {
  tasks_.push_back(std::move(task));
  while (!tasks_.empty()) {
    Task next = std::move(tasks_.front());
    tasks_.pop_front();
    runTask("borrowed", next);
  }
  return give_up_duty_ != nullptr;
}

BorrowedThread* BorrowedThread::current() {
  return static_cast<BorrowedThread*>(rt::threadSlot(rt::ThreadSlot::kBorrowedThread));
}

bool BorrowedThread::take(const ConcurrentQueue& queue, Task& task) {
  if (&queue != &queue_ || give_up_duty_ == nullptr) return false;
  tasks_.push_back(std::move(task));
  return true;
}

void BorrowedThread::aboutToWait() {
  if (give_up_duty_ == nullptr) return;
  // Emptied first: what is passed on below must not come back here.
  const auto give_up_duty = std::exchange(give_up_duty_, nullptr);
  give_up_duty();
  for (Task& task : std::exchange(tasks_, {})) queue_.async(std::move(task));
}

}  // namespace spacekeep
