#include "support/ipc/linux/ipc_loop.h"

#include <sys/eventfd.h>
#include <systemd/sd-event.h>
#include <unistd.h>

#include <algorithm>
#include <iterator>
#include <mutex>
#include <utility>

#include "support/queues/borrowed_thread.h"
#include "support/queues/waiting.h"

namespace spacekeep::ipc {

namespace {

/// The loop whose duty this thread has.
thread_local const IpcLoop* current_loop = nullptr;

constexpr std::size_t kTasksPerTurn = 8;  // then the sockets are looked at

}  // namespace

IpcLoop::IpcLoop() {
  wake_fd_ = ::eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK);
  silent_ = makeSocketPair();
  if (wake_fd_ < 0 || silent_.first == nullptr || sd_event_new(&event_) < 0)
    rt::panic("IPC: no descriptor for the event loop");
  if (sd_event_add_io(event_, nullptr, wake_fd_, EPOLLIN, &IpcLoop::onWake, this) < 0) {
    rt::panic("IPC: the event loop takes no wake-up source");
  }
  inbox_ = std::make_shared<Inbox>(wake_fd_);
  startThread();
}

IpcLoop::~IpcLoop() {
  post([this] { stopping_ = true; });
  {
    const BlockingRegion waiting;
    const std::scoped_lock lock(threads_mutex_);
    while (threads_ > 0) thread_ended_.wait(threads_mutex_);
  }
  sd_event_unref(event_);
  ::close(wake_fd_);
}

void IpcLoop::startThread() {
  {
    const std::scoped_lock lock(threads_mutex_);
    ++threads_;
  }
  rt::Thread("ipc", [this] {
    run();
    const std::scoped_lock lock(threads_mutex_);
    --threads_;
    // Notified under the lock: the destructor that waits for this goes on right after.
    thread_ended_.notifyAll();
  }).detach();
}

bool IpcLoop::Inbox::post(Task task) {
  if (postFromDuty(task)) return true;
  const std::scoped_lock lock(mutex_);
  if (stopped_) return false;
  posted_.push_back(std::move(task));
  if (std::exchange(wake_pending_, true)) return true;
  // A counter of 1 fits always, so the write cannot fail. It happens under the lock, since the
  // descriptor is closed once stopped_ is set.
  const std::uint64_t one = 1;
  [[maybe_unused]] const ssize_t written = ::write(wake_fd_, &one, sizeof one);
  return true;
}

bool IpcLoop::Inbox::postFromDuty(Task& task) {
  if (current_loop == nullptr || current_loop->inbox_.get() != this) return false;
  from_duty_.push_back(std::move(task));
  return true;
}

void IpcLoop::runAndWait(const Task& task) {
  if (isCurrent()) {
    task();
    return;
  }
  CountingSemaphore done(0);
  post([&task, &done] {
    task();
    done.signal();
  });
  done.wait();
}

bool IpcLoop::isCurrent() const { return current_loop == this; }

int IpcLoop::onWake(sd_event_source*, int fd, std::uint32_t, void* self) {
  std::uint64_t count = 0;
  [[maybe_unused]] const ssize_t read = ::read(fd, &count, sizeof count);
  static_cast<IpcLoop*>(self)->takePosted();
  return 0;
}

void IpcLoop::takePosted() {
  std::vector<Task> tasks;
  {
    const std::scoped_lock lock(inbox_->mutex_);
    tasks.swap(inbox_->posted_);
    inbox_->wake_pending_ = false;
  }
  std::move(tasks.begin(), tasks.end(), std::back_inserter(to_run_));
}

/// A few at a time: a purge posts a call for each of hundreds of services at once, and whoever has a
/// small call is not to wait until all of them are written.
void IpcLoop::runPosted() {
  for (std::size_t left = std::min(to_run_.size(), kTasksPerTurn); left > 0; --left) {
    // What a task holds is let go before the next one runs.
    const Task task = std::move(to_run_.front());
    to_run_.pop_front();
    task();
  }
}

void IpcLoop::runOwn() {
  while (!inbox_->from_duty_.empty()) {
    for (Task& task : std::exchange(inbox_->from_duty_, {})) {
      task();
      task = nullptr;
    }
  }
}

void IpcLoop::serveSoon(ConcurrentQueue* lent_to, Task task) {
  to_serve_.push_back({lent_to, std::move(task)});
}

bool IpcLoop::serve() {
  // Only what is there now: the answers go out before more is served.
  for (std::size_t left = to_serve_.size(); left > 0; --left) {
    ToServe next = std::move(to_serve_.front());
    to_serve_.pop_front();
    if (next.lent_to == nullptr) {
      next.task();
      continue;
    }
    BorrowedThread self(*next.lent_to, [this] { giveUpDuty(); });
    if (!self.run(std::move(next.task))) return false;
  }
  return true;
}

void IpcLoop::giveUpDuty() {
  current_loop = nullptr;
  startThread();
}

bool IpcLoop::mayStop() {
  if (!stopping_ || !to_run_.empty()) return false;
  const std::scoped_lock lock(inbox_->mutex_);
  inbox_->stopped_ = inbox_->posted_.empty();
  return inbox_->stopped_;
}

void IpcLoop::run() {
  current_loop = this;
  while (true) {
    if (!serve()) return;
    runOwn();
    runPosted();
    if (mayStop()) break;
    const bool idle = to_serve_.empty() && inbox_->from_duty_.empty() && to_run_.empty();
    if (sd_event_run(event_, idle ? UINT64_MAX : 0) < 0) rt::panic("IPC: the event loop failed");
    wakeups_.fetch_add(1, std::memory_order_relaxed);
  }
  current_loop = nullptr;
}

}  // namespace spacekeep::ipc
