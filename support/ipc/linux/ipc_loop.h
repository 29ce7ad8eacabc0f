// Thread safety: post(), isCurrent() and runAndWait() may be called from any thread; what is marked
// "IPC thread" only from tasks and handlers that run on that thread.
//
// The IPC thread: a duty that one thread has at a time, under which every sd_bus object of the
// process lives (sd-bus is not thread-safe). It moves messages, decodes and encodes, and never
// waits. Short requests it serves itself, between two looks at the sockets; should one of them have
// to wait after all, the thread gives its duty to a fresh one first. Without traffic it sleeps
// without any timer.
#pragma once

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <deque>
#include <functional>
#include <memory>
#include <utility>
#include <vector>

#include "support/ipc/linux/sockets.h"
#include "support/queues/concurrent_queue.h"
#include "support/runtime/runtime.h"

struct sd_event;
struct sd_event_source;

namespace spacekeep::ipc {

class IpcLoop {
 public:
  using Task = std::function<void()>;

  /// Where tasks wait. Outlives the loop as long as somebody refers to it, and then takes nothing
  /// any more: for objects that may be let go of later than the loop.
  class Inbox {
   public:
    explicit Inbox(int wake_fd) : wake_fd_(wake_fd) {}
    /// False, and `task` is destroyed, when the loop is gone.
    bool post(Task task);

   private:
    friend class IpcLoop;
    bool postFromDuty(Task& task);

    const int wake_fd_;
    std::vector<Task> from_duty_;  // IPC thread: posted by itself, so nobody needs to be woken
    rt::Mutex mutex_;
    // Protected by mutex_.
    std::vector<Task> posted_;
    bool wake_pending_ = false;
    bool stopped_ = false;
  };

  /// Starts the thread. Panics when the kernel refuses an epoll or event descriptor, since a
  /// process without its IPC can do nothing.
  IpcLoop();
  /// Runs the tasks posted so far, then ends the thread. Servers must have gone before; a
  /// connection that is still held never answers or fails again. The global queue of the
  /// connections must be there longer. Never call it on the IPC thread.
  ~IpcLoop();
  IpcLoop(const IpcLoop&) = delete;
  IpcLoop& operator=(const IpcLoop&) = delete;

  /// Runs `task` on the IPC thread; what one thread posts runs in its order. Tasks must be short.
  /// The queue has no limit of its own: whoever posts is limited (unanswered calls per connection,
  /// pending calls).
  void post(Task task) { inbox_->post(std::move(task)); }
  [[nodiscard]] const std::shared_ptr<Inbox>& inbox() const { return inbox_; }
  /// As post, and returns once it has run. On the IPC thread it runs at once.
  void runAndWait(const Task& task);
  [[nodiscard]] bool isCurrent() const;

  /// IPC thread. Runs `task` on this thread once the messages at hand have been read, in the order
  /// of these calls. With a `lent_to`, the thread also runs what the task submits to that queue,
  /// for as long as none of it has to wait; without one the task itself must not wait.
  void serveSoon(ConcurrentQueue* lent_to, Task task);

  /// IPC thread.
  [[nodiscard]] sd_event* event() const { return event_; }

  /// IPC thread. A connected socket from which nothing ever comes.
  [[nodiscard]] int silentSocket() const { return silent_.first->fd(); }

  /// How often the thread has woken up, for tests of idleness.
  [[nodiscard]] std::uint64_t wakeups() const { return wakeups_.load(std::memory_order_relaxed); }

 private:
  static int onWake(sd_event_source* source, int fd, std::uint32_t events, void* self);
  struct ToServe {
    ConcurrentQueue* lent_to;
    Task task;
  };

  void startThread();
  void run();
  bool mayStop();
  void takePosted();
  void runPosted();
  void runOwn();
  /// Answers whether this thread still has the duty.
  bool serve();
  void giveUpDuty();

  sd_event* event_ = nullptr;
  int wake_fd_ = -1;
  SocketPair silent_;
  std::shared_ptr<Inbox> inbox_;
  // IPC thread.
  bool stopping_ = false;
  std::deque<ToServe> to_serve_;
  std::deque<Task> to_run_;  // posted by other threads

  std::atomic<std::uint64_t> wakeups_{0};
  rt::Mutex threads_mutex_;
  // Protected by threads_mutex_.
  rt::CondVar thread_ended_;
  std::size_t threads_ = 0;  // the one with the duty, and those that gave it up and have not ended
};

}  // namespace spacekeep::ipc
