#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <ctime>

#include "support/runtime/runtime.h"
#include "support/runtime/threads/real_clock.h"
#include "support/runtime/threads/time_scale.h"

namespace spacekeep::rt {
namespace {

constexpr std::uint64_t kNsPerSecond = 1'000'000'000;

std::uint64_t readNs(clockid_t clock) {
  timespec now{};
  if (clock_gettime(clock, &now) != 0) return 0;
  return static_cast<std::uint64_t>(now.tv_sec) * kNsPerSecond +
         static_cast<std::uint64_t>(now.tv_nsec);
}

// The scaled clock shows scaled_origin + (real - real_origin) * scale.
std::atomic<std::uint32_t> scale_now{1};
std::atomic<std::uint64_t> real_origin{0};
std::atomic<std::uint64_t> scaled_origin{0};

std::uint64_t scaled(std::uint64_t real_ns) {
  const std::uint32_t scale = scale_now.load(std::memory_order_relaxed);
  if (scale == 1 && scaled_origin.load(std::memory_order_relaxed) == 0) return real_ns;
  return scaled_origin + (real_ns - real_origin) * scale;
}

std::uint64_t realOfScaled(std::uint64_t scaled_ns) {
  const std::uint32_t scale = scale_now.load(std::memory_order_relaxed);
  if (scale == 1 && scaled_origin.load(std::memory_order_relaxed) == 0) return scaled_ns;
  if (scaled_ns <= scaled_origin) return real_origin;
  // Rounded up: whoever waits until a deadline must find it passed.
  return real_origin + (scaled_ns - scaled_origin + scale - 1) / scale;
}

}  // namespace

void setTimeScaleForTests(std::uint32_t scale) {
  const std::uint64_t real_ns = readNs(CLOCK_MONOTONIC);
  scaled_origin = scaled(real_ns);
  real_origin = real_ns;
  scale_now = scale == 0 ? 1 : scale;
}

std::uint32_t timeScaleForTests() { return scale_now; }

timespec realInstantOf(std::uint64_t deadline_ticks) {
  const std::uint64_t real_ns = realOfScaled(deadline_ticks);
  timespec instant{};
  instant.tv_sec = static_cast<time_t>(real_ns / kNsPerSecond);
  instant.tv_nsec = static_cast<long>(real_ns % kNsPerSecond);
  return instant;
}

std::optional<Timebase> timebase() {
  timespec resolution{};
  if (clock_getres(CLOCK_MONOTONIC, &resolution) != 0) return std::nullopt;
  return Timebase{1, 1};  // The counter is read in nanoseconds.
}

std::uint64_t ticks() { return scaled(readNs(CLOCK_MONOTONIC)); }

std::uint64_t deadlineAfterNs(std::uint64_t duration_ns) {
  const std::uint64_t now = ticks();
  return duration_ns >= kNever - now ? kNever : now + duration_ns;
}

std::int64_t wallClockNs() {
  const std::uint64_t real_ns = readNs(CLOCK_MONOTONIC);
  const auto gained_ns = static_cast<std::int64_t>(scaled(real_ns) - real_ns);
  return static_cast<std::int64_t>(readNs(CLOCK_REALTIME)) + gained_ns;
}

void sleepNs(std::uint64_t duration_ns) {
  const std::uint64_t deadline = deadlineAfterNs(duration_ns);
  if (deadline == kNever) {
    for (;;) pause();
  }
  const timespec until = realInstantOf(deadline);
  while (clock_nanosleep(CLOCK_MONOTONIC, TIMER_ABSTIME, &until, nullptr) == EINTR) {
  }
}

}  // namespace spacekeep::rt
