#include "support/events/low_space_stream.h"

#include <algorithm>
#include <mutex>
#include <utility>

namespace spacekeep {
namespace {

std::uint64_t nowNs() {
  const std::uint64_t ticks = rt::ticks();
  const auto base = rt::timebase();
  if (!base || base->denominator == 0) return ticks;
  return ticks / base->denominator * base->numerator +
         ticks % base->denominator * base->numerator / base->denominator;
}

}  // namespace

LowSpaceStream::LowSpaceStream(SpaceSource& source, ConcurrentQueue& queue, Handler handler,
                               WatchLimits limits)
    : source_(source),
      queue_(queue),
      handler_(std::move(handler)),
      limits_(limits),
      watch_(limits),
      thread_("low-space", [this] { run(); }) {}

LowSpaceStream::~LowSpaceStream() {
  {
    const std::scoped_lock lock(mutex_);
    stopping_ = true;
    changed_.notifyAll();
  }
  thread_.join();
  const std::scoped_lock lock(mutex_);
  while (handling_) changed_.wait(mutex_);
}

void LowSpaceStream::lookNow() {
  const std::scoped_lock lock(mutex_);
  look_wanted_ = true;
  changed_.notifyAll();
}

std::uint64_t LowSpaceStream::looks() const {
  const std::scoped_lock lock(mutex_);
  return looks_;
}

void LowSpaceStream::run() {
  for (;;) {
    const std::uint64_t looked_at_ticks = rt::ticks();
    const std::uint64_t pause_ns = lookOnce();
    if (!pauseAfterLook(looked_at_ticks, pause_ns)) return;
  }
}

std::uint64_t LowSpaceStream::lookOnce() {
  bool is_handling = false;
  {
    const std::scoped_lock lock(mutex_);
    is_handling = handling_;
    if (handling_ended_) watch_.handlingEnded(nowNs());
    handling_ended_ = false;
    ++looks_;
  }
  const WatchStep step = watch_.look(source_.sampleLocalVolumes(), nowNs(), is_handling);
  if (step.flags != 0) send(step.flags);
  return step.pause_ns;
}

void LowSpaceStream::send(std::uint64_t flags) {
  {
    const std::scoped_lock lock(mutex_);
    handling_ = true;
  }
  queue_.async([this, flags] {
    handler_(Dictionary{{kEventFlagsKey, flags}});
    const std::scoped_lock lock(mutex_);
    handling_ = false;
    handling_ended_ = true;
    look_wanted_ = true;
    changed_.notifyAll();
  });
}

bool LowSpaceStream::pauseAfterLook(std::uint64_t looked_at_ticks, std::uint64_t pause_ns) {
  const std::uint64_t now = rt::ticks();
  const auto deadline = [&](std::uint64_t ns) {
    const std::uint64_t from_now = rt::deadlineAfterNs(ns);
    return from_now == rt::kNever ? rt::kNever : from_now - (now - looked_at_ticks);
  };
  const std::uint64_t earliest = deadline(std::min(limits_.shortest_pause_ns, pause_ns));
  const std::uint64_t latest = deadline(pause_ns);

  const std::scoped_lock lock(mutex_);
  while (!stopping_) {
    const std::uint64_t until = look_wanted_ ? earliest : latest;
    if (rt::ticks() >= until) {
      look_wanted_ = false;
      return true;
    }
    changed_.waitUntil(mutex_, until);
  }
  return false;
}

}  // namespace spacekeep
