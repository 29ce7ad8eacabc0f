#include "sim/world/delay_line.h"
#include "support/runtime/locks.h"

namespace spacekeep::sim {

DelayLine::DelayLine(ConcurrentQueue& global) : global_(global) {}

DelayLine::~DelayLine() { stop(); }

void DelayLine::after(std::uint64_t delay_ns, Task task) {
  const std::scoped_lock lock(mutex_);
  if (stopped_) return;
  waiting_.emplace(std::pair{rt::deadlineAfterNs(delay_ns), next_order_++}, std::move(task));
  if (thread_started_) {
    changed_.notifyAll();
    return;
  }
  thread_started_ = true;
  thread_ = rt::Thread("delay-line", [this] { run(); });
}

void DelayLine::stop() {
  std::map<std::pair<std::uint64_t, std::uint64_t>, Task> dropped;
  rt::Thread thread;
  {
    const std::scoped_lock lock(mutex_);
    stopped_ = true;
    dropped.swap(waiting_);
    thread = std::move(thread_);
    changed_.notifyAll();
  }
  if (thread.joinable()) thread.join();
}

void DelayLine::run() {
  std::unique_lock lock(mutex_);
  while (!stopped_) {
    if (waiting_.empty()) {
      changed_.wait(mutex_);
      continue;
    }
    const std::uint64_t deadline = waiting_.begin()->first.first;
    if (rt::ticks() < deadline) {
      (void)changed_.waitUntil(mutex_, deadline);
      continue;
    }
    Task task = std::move(waiting_.begin()->second);
    waiting_.erase(waiting_.begin());
    lock.unlock();
    global_.async(std::move(task));
    lock.lock();
  }
}

}  // namespace spacekeep::sim
