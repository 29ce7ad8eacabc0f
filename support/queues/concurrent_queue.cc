#include "support/queues/concurrent_queue.h"

#include <algorithm>
#include <system_error>
#include <utility>

#include "support/queues/borrowed_thread.h"
#include "support/queues/run_task.h"

namespace spacekeep {
namespace {

template <typename Options>
Options withAtLeastOneWorker(Options options) {
  options.parallelism = std::max<std::size_t>(options.parallelism, 1);
  return options;
}

}  // namespace

/// Takes a worker off the books when its thread ends, in whichever way.
class ConcurrentQueue::Membership {
 public:
  explicit Membership(ConcurrentQueue& queue) : queue_(queue) {}
  ~Membership() {
    if (has_left_) return;
    const Lock lock(queue_.mutex_);
    leave();
  }
  Membership(const Membership&) = delete;
  Membership& operator=(const Membership&) = delete;

  /// With the queue's lock held.
  void leave() {
    has_left_ = true;
    --queue_.threads_;
    if (is_idle) queue_.oneLessIdle();
    // Notified under the lock: the destructor that waits for this frees the queue right after.
    queue_.worker_ended_.notifyAll();
  }

  bool is_idle = true;

 private:
  ConcurrentQueue& queue_;
  bool has_left_ = false;
};

ConcurrentQueue::ConcurrentQueue(Options options)
    : options_(withAtLeastOneWorker(std::move(options))) {}

ConcurrentQueue::~ConcurrentQueue() {
  const BlockingRegion region;  // The owner may itself run on a worker of another queue.
  Lock lock(mutex_);
  stopping_ = true;
  work_available_.notifyAll();
  while (threads_ > 0) worker_ended_.wait(mutex_);
}

void ConcurrentQueue::async(Task task) {
  if (BorrowedThread* self = BorrowedThread::current();
      self != nullptr && self->take(*this, task)) {
    return;
  }
  Lock lock(mutex_);
  pending_.push_back(std::move(task));
  if (!mayTakeTask() || idle_ == 0) {
    provideWorker();
    return;
  }
  // Without the lock, which the worker would wait for as soon as it woke up.
  lock.unlock();
  work_available_.notifyOne();
}

ConcurrentQueue::Counts ConcurrentQueue::counts() const {
  const Lock lock(mutex_);
  return {.threads = threads_,
          .blocked = blocked_,
          .pending = pending_.size(),
          .peak_threads = peak_threads_};
}

bool ConcurrentQueue::mayTakeTask() const {
  const std::size_t running = threads_ - idle_ - blocked_;
  return !pending_.empty() && running < options_.parallelism;
}

/// Keeps the promise on which everything here rests: whenever a task may be taken, some idle worker
/// is on its way to look. Called wherever mayTakeTask() can become true; the worker that takes a
/// task passes the call on for the next one.
void ConcurrentQueue::provideWorker() {
  if (!mayTakeTask()) return;
  if (idle_ > 0) {
    work_available_.notifyOne();
  } else {
    startWorker();
  }
}

void ConcurrentQueue::startWorker() {
  ++threads_;
  ++idle_;
  try {
    rt::Thread thread(options_.name, [this] {
      Worker self{this};
      work(self);
    });
    thread.detach();
  } catch (const std::system_error& error) {
    --threads_;
    oneLessIdle();
    // With other workers alive the task is only late; alone it would never run.
    if (threads_ == 0) rt::panic((options_.name + " has no worker: " + error.what()).c_str());
    return;
  }
  peak_threads_ = std::max(peak_threads_, threads_);
}

void ConcurrentQueue::work(Worker& self) {
  Membership membership(*this);
  rt::threadSlot(rt::ThreadSlot::kPoolWorker) = &self;
  Lock lock(mutex_);
  Task task;
  while (takeTask(lock, task)) {
    membership.is_idle = false;
    oneLessIdle();
    provideWorker();
    lock.unlock();
    runTask(options_.name, task);
    task = nullptr;  // What it captured goes before the worker counts as idle.
    lock.lock();
    ++idle_;
    membership.is_idle = true;
    provideWorker();
  }
  const auto give_back = mayGiveBack() ? options_.on_less_to_do : nullptr;
  // Before the lock is given back: a task that comes now must not count on this worker.
  membership.leave();
  lock.unlock();
  if (give_back != nullptr) give_back();
}

bool ConcurrentQueue::mayGiveBack() {
  if (options_.on_less_to_do == nullptr || stopping_ || rt::ticks() < may_give_back_) return false;
  may_give_back_ = rt::deadlineAfterNs(options_.idle_worker_ns);
  return true;
}

/// Waits for a task; false when the worker should end instead.
bool ConcurrentQueue::takeTask(Lock& lock, Task& task) {
  const std::uint64_t deadline = rt::deadlineAfterNs(options_.idle_worker_ns);
  bool in_time = true;
  while (!mayTakeTask()) {
    if (!in_time || (stopping_ && pending_.empty()) || isSurplus()) return false;
    in_time = work_available_.waitUntil(*lock.mutex(), deadline);
  }
  task = std::move(pending_.front());
  pending_.pop_front();
  return true;
}

void ConcurrentQueue::oneLessIdle() {
  --idle_;
  least_idle_ = std::min(least_idle_, idle_);
}

/// Asked by a worker that has nothing to do. Without this the most workers that were ever needed at
/// once would stay for good, since the one that has waited longest gets the next task.
bool ConcurrentQueue::isSurplus() {
  if (rt::ticks() >= window_ends_) {
    surplus_ = std::exchange(least_idle_, idle_);
    window_ends_ = rt::deadlineAfterNs(options_.idle_worker_ns);
  }
  if (surplus_ == 0) return false;
  --surplus_;
  return true;
}

void ConcurrentQueue::workerBlocks() {
  const Lock lock(mutex_);
  ++blocked_;
  provideWorker();
}

void ConcurrentQueue::workerUnblocks() {
  const Lock lock(mutex_);
  --blocked_;
}

BlockingRegion::BlockingRegion()
    : worker_(static_cast<ConcurrentQueue::Worker*>(rt::threadSlot(rt::ThreadSlot::kPoolWorker))) {
  if (worker_ != nullptr && worker_->open_regions++ == 0) worker_->queue->workerBlocks();
  if (BorrowedThread* self = BorrowedThread::current(); self != nullptr) self->aboutToWait();
}

BlockingRegion::~BlockingRegion() {
  if (worker_ != nullptr && --worker_->open_regions == 0) worker_->queue->workerUnblocks();
}

}  // namespace spacekeep
