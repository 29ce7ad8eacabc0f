// Thread safety: post() and stop() may be called from any thread, everything else only on the
// loop's own thread, or once it was stopped.
//
// One thread that waits for descriptors and timers (epoll(7), timerfd_create(2)) and sleeps without
// a wake-up while nothing happens.
#pragma once

#include <cstdint>
#include <deque>
#include <functional>
#include <map>
#include <memory>

#include "support/runtime/runtime.h"

namespace spacekeep {

class EventLoop {
 public:
  using Callback = std::function<void()>;

  EventLoop();
  ~EventLoop();
  EventLoop(const EventLoop&) = delete;
  EventLoop& operator=(const EventLoop&) = delete;

  /// Ends the thread; callbacks that have not started are dropped. What lives on the loop's thread
  /// may be destroyed from any thread after that.
  void stop();

  /// Runs `callback` on the loop's thread.
  void post(Callback callback);

  /// Runs `callback` on the loop's thread, `delay_ns` from now at the earliest (suspend does not
  /// count).
  void postAfter(std::uint64_t delay_ns, Callback callback);

  /// Calls `ready` each time that one of `epoll_events` comes up on `fd`. The descriptor stays the
  /// caller's and must be unwatched before it is closed. Answers false when it cannot be watched.
  bool watch(int fd, std::uint32_t epoll_events, Callback ready);
  void unwatch(int fd);

 private:
  void run();
  bool runPosted();
  /// Runs what is due, and answers for how many milliseconds the loop may sleep, -1 for good.
  int runDelayed();

  const int epoll_;
  const int wake_;  // eventfd(2)
  rt::Mutex mutex_;
  // Protected by mutex_.
  std::deque<Callback> posted_;
  bool stopping_ = false;
  // Confined to the loop's thread.
  std::map<int, Callback> watched_;
  std::multimap<std::uint64_t, Callback> delayed_;  // by the deadline in ticks

  rt::Thread thread_;  // last: it uses all of the above
};

/// A timer on CLOCK_BOOTTIME: time that the machine was suspended counts. Lives on the loop's
/// thread.
class BootTimer {
 public:
  BootTimer(EventLoop& loop, EventLoop::Callback fired);
  ~BootTimer();
  BootTimer(const BootTimer&) = delete;
  BootTimer& operator=(const BootTimer&) = delete;

  /// Fires once, at once when the time has passed. Replaces an earlier time.
  void setFor(std::uint64_t boot_ns);
  void cancel();

 private:
  EventLoop& loop_;
  const int fd_;
};

/// Tells when somebody sets the wall clock (timerfd_create(2), TFD_TIMER_CANCEL_ON_SET); the end of
/// a suspend may count as that. Lives on the loop's thread.
class WallClockWatch {
 public:
  WallClockWatch(EventLoop& loop, EventLoop::Callback set);
  ~WallClockWatch();
  WallClockWatch(const WallClockWatch&) = delete;
  WallClockWatch& operator=(const WallClockWatch&) = delete;

 private:
  EventLoop& loop_;
  const int fd_;
};

/// Nanoseconds since the machine started, suspend included (CLOCK_BOOTTIME).
[[nodiscard]] std::uint64_t bootClockNs();

}  // namespace spacekeep
