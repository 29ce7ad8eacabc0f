// Thread safety: post(), isCurrent() and runAndWait() may be called from any thread; what is marked
// "IPC thread" only from tasks and handlers that run on that thread.
//
// The one thread on which every sd_bus object of the process lives (sd-bus is not thread-safe). It
// never blocks and never runs a handler of the program: it moves messages, decodes and encodes.
// Without traffic it sleeps without any timer.
#pragma once

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <memory>
#include <utility>
#include <vector>

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
    const int wake_fd_;
    rt::Mutex mutex_;
    // Protected by mutex_.
    std::vector<Task> posted_;
    bool wake_pending_ = false;
    bool stopped_ = false;
  };

  /// Starts the thread. Panics when the kernel refuses an epoll or event descriptor, since a
  /// process without its IPC can do nothing.
  IpcLoop();
  /// Runs the tasks posted so far, then ends the thread. Servers must have gone before; a connection
  /// that is still held never answers or fails again. The global queue of the connections must be
  /// there longer. Never call it on the IPC thread.
  ~IpcLoop();
  IpcLoop(const IpcLoop&) = delete;
  IpcLoop& operator=(const IpcLoop&) = delete;

  /// Runs `task` on the IPC thread, in the order of posting. Tasks must be short. The queue has no
  /// limit of its own: whoever posts is limited (unanswered calls per connection, pending calls).
  void post(Task task) { inbox_->post(std::move(task)); }
  [[nodiscard]] const std::shared_ptr<Inbox>& inbox() const { return inbox_; }
  /// As post, and returns once it has run. On the IPC thread it runs at once.
  void runAndWait(const Task& task);
  [[nodiscard]] bool isCurrent() const;

  /// IPC thread.
  [[nodiscard]] sd_event* event() const { return event_; }

  /// How often the thread has woken up, for tests of idleness.
  [[nodiscard]] std::uint64_t wakeups() const { return wakeups_.load(std::memory_order_relaxed); }

 private:
  static int onWake(sd_event_source* source, int fd, std::uint32_t events, void* self);
  void run();
  void runPosted();

  sd_event* event_ = nullptr;
  int wake_fd_ = -1;
  std::shared_ptr<Inbox> inbox_;
  bool stopping_ = false;  // IPC thread

  std::atomic<std::uint64_t> wakeups_{0};
  rt::Thread thread_;
};

}  // namespace spacekeep::ipc
