#include "support/events/linux/event_loop.h"

#include <sys/epoll.h>
#include <sys/eventfd.h>
#include <sys/timerfd.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <ctime>
#include <limits>
#include <mutex>
#include <utility>

namespace spacekeep {
namespace {

constexpr std::uint64_t kNsPerSecond = 1'000'000'000;

int openedOrPanic(int fd) {
  if (fd < 0) rt::panic("no descriptors left for the event loop");
  return fd;
}

/// Never fires, but is cancelled when the clock is set.
void armForClockChange(int fd) {
  itimerspec far_away{};
  far_away.it_value.tv_sec = std::numeric_limits<time_t>::max();
  ::timerfd_settime(fd, TFD_TIMER_ABSTIME | TFD_TIMER_CANCEL_ON_SET, &far_away, nullptr);
}

}  // namespace

EventLoop::EventLoop()
    : epoll_(openedOrPanic(::epoll_create1(EPOLL_CLOEXEC))),
      wake_(openedOrPanic(::eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK))) {
  epoll_event interest{.events = EPOLLIN, .data = {.fd = wake_}};
  if (::epoll_ctl(epoll_, EPOLL_CTL_ADD, wake_, &interest) < 0) rt::panic("event loop: epoll_ctl");
  thread_ = rt::Thread("events", [this] { run(); });
}

EventLoop::~EventLoop() {
  stop();
  ::close(wake_);
  ::close(epoll_);
}

void EventLoop::stop() {
  std::deque<Callback> dropped;  // destroyed without the lock: what they hold may post
  {
    const std::scoped_lock lock(mutex_);
    stopping_ = true;
    dropped.swap(posted_);
  }
  ::eventfd_write(wake_, 1);
  if (thread_.joinable()) thread_.join();
  delayed_.clear();
}

void EventLoop::post(Callback callback) {
  {
    const std::scoped_lock lock(mutex_);
    if (stopping_) return;
    posted_.push_back(std::move(callback));
  }
  ::eventfd_write(wake_, 1);
}

bool EventLoop::watch(int fd, std::uint32_t epoll_events, Callback ready) {
  epoll_event interest{.events = epoll_events, .data = {.fd = fd}};
  if (::epoll_ctl(epoll_, EPOLL_CTL_ADD, fd, &interest) < 0) return false;
  watched_.insert_or_assign(fd, std::move(ready));
  return true;
}

void EventLoop::unwatch(int fd) {
  ::epoll_ctl(epoll_, EPOLL_CTL_DEL, fd, nullptr);
  watched_.erase(fd);
}

void EventLoop::run() {
  std::array<epoll_event, 16> events{};
  while (runPosted()) {
    const int count =
        ::epoll_wait(epoll_, events.data(), static_cast<int>(events.size()), runDelayed());
    for (int i = 0; i < count; ++i) {
      const int fd = events.at(static_cast<std::size_t>(i)).data.fd;
      if (fd == wake_) {
        eventfd_t ignored = 0;
        ::eventfd_read(wake_, &ignored);
        continue;
      }
      // Unwatched meanwhile by the callback of an earlier event.
      const auto watched = watched_.find(fd);
      if (watched == watched_.end()) continue;
      const Callback ready = watched->second;  // it may unwatch itself
      ready();
    }
  }
}

bool EventLoop::runPosted() {
  for (;;) {
    Callback callback;
    {
      const std::scoped_lock lock(mutex_);
      if (stopping_) return false;
      if (posted_.empty()) return true;
      callback = std::move(posted_.front());
      posted_.pop_front();
    }
    callback();
  }
}

void EventLoop::postAfter(std::uint64_t delay_ns, Callback callback) {
  const std::uint64_t deadline = rt::deadlineAfterNs(delay_ns);
  post([this, deadline, later = std::move(callback)] { delayed_.emplace(deadline, later); });
}

int EventLoop::runDelayed() {
  while (!delayed_.empty() && delayed_.begin()->first <= rt::ticks()) {
    const Callback due = std::move(delayed_.extract(delayed_.begin()).mapped());
    due();
  }
  if (delayed_.empty()) return -1;
  // CLOCK_MONOTONIC ticks in nanoseconds on Linux; rounded up, so that it is due on waking up.
  constexpr std::uint64_t kNsPerMs = 1'000'000;
  constexpr std::uint64_t kLongestSleepMs = 3'600'000;
  const std::uint64_t now = rt::ticks();
  const std::uint64_t next = delayed_.begin()->first;
  const std::uint64_t left_ns = next > now ? next - now : 0;
  return static_cast<int>(std::min(left_ns / kNsPerMs + 1, kLongestSleepMs));
}

BootTimer::BootTimer(EventLoop& loop, EventLoop::Callback fired)
    : loop_(loop),
      fd_(openedOrPanic(::timerfd_create(CLOCK_BOOTTIME, TFD_CLOEXEC | TFD_NONBLOCK))) {
  loop_.watch(fd_, EPOLLIN, [fd = fd_, fired = std::move(fired)] {
    std::uint64_t expirations = 0;
    // Set anew or cancelled since it fired: then there is nothing to read.
    if (::read(fd, &expirations, sizeof(expirations)) != sizeof(expirations)) return;
    fired();
  });
}

BootTimer::~BootTimer() {
  loop_.unwatch(fd_);
  ::close(fd_);
}

void BootTimer::setFor(std::uint64_t boot_ns) {
  const std::uint64_t at = std::max<std::uint64_t>(boot_ns, 1);  // 0 would cancel it
  itimerspec when{};
  when.it_value.tv_sec = static_cast<time_t>(at / kNsPerSecond);
  when.it_value.tv_nsec = static_cast<long>(at % kNsPerSecond);
  ::timerfd_settime(fd_, TFD_TIMER_ABSTIME, &when, nullptr);
}

void BootTimer::cancel() {
  const itimerspec never{};
  ::timerfd_settime(fd_, TFD_TIMER_ABSTIME, &never, nullptr);
}

WallClockWatch::WallClockWatch(EventLoop& loop, EventLoop::Callback set)
    : loop_(loop),
      fd_(openedOrPanic(::timerfd_create(CLOCK_REALTIME, TFD_CLOEXEC | TFD_NONBLOCK))) {
  armForClockChange(fd_);
  loop_.watch(fd_, EPOLLIN, [fd = fd_, set = std::move(set)] {
    std::uint64_t expirations = 0;
    const bool was_set = ::read(fd, &expirations, sizeof(expirations)) < 0 && errno == ECANCELED;
    armForClockChange(fd);
    if (was_set) set();
  });
}

WallClockWatch::~WallClockWatch() {
  loop_.unwatch(fd_);
  ::close(fd_);
}

std::uint64_t bootClockNs() {
  timespec now{};
  // The seam's counter stands still during suspend, this one must not.
  const int result = ::clock_gettime(CLOCK_BOOTTIME, &now);  // tidy-allow: see above
  if (result < 0) rt::panic("no boot clock");
  return static_cast<std::uint64_t>(now.tv_sec) * kNsPerSecond +
         static_cast<std::uint64_t>(now.tv_nsec);
}

}  // namespace spacekeep
