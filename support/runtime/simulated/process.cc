// Clocks, random numbers and what else is not about scheduling. Outside of a schedule (static
// initialisation, a test's own main) there is a single thread with a virtual clock of its own.
#include <unistd.h>

#include <array>
#include <cstdlib>
#include <string>

#include "support/runtime/runtime.h"
#include "support/runtime/simulated/scheduler.h"
#include "support/runtime/splitmix.h"

namespace spacekeep::rt {
namespace {

using simulated::Scheduler;
using simulated::WaitKind;

std::uint64_t outside_ticks = 0;

}  // namespace

std::optional<Timebase> timebase() { return Timebase{1, 1}; }

std::uint64_t ticks() {
  const Scheduler* const scheduler = Scheduler::current();
  return scheduler == nullptr ? outside_ticks : scheduler->now();
}

std::uint64_t deadlineAfterNs(std::uint64_t duration_ns) {
  const std::uint64_t now = ticks();
  return duration_ns >= kNever - now ? kNever : now + duration_ns;
}

std::int64_t wallClockNs() {
  const Scheduler* const scheduler = Scheduler::current();
  if (scheduler != nullptr) return scheduler->wallClockNs();
  return ScheduleOptions{}.wall_clock_start_ns + static_cast<std::int64_t>(outside_ticks);
}

void sleepNs(std::uint64_t duration_ns) {
  const std::uint64_t deadline = deadlineAfterNs(duration_ns);
  Scheduler* const scheduler = Scheduler::current();
  if (scheduler == nullptr) {
    outside_ticks = deadline;
    return;
  }
  scheduler->throwIfUnwinding();
  while (deadline > scheduler->now()) {
    scheduler->block(WaitKind::kSleep, nullptr, deadline);
    scheduler->throwIfUnwinding();
  }
}

std::uint64_t randomNumber() {
  static SplitMix outside(0);
  Scheduler* const scheduler = Scheduler::current();
  return scheduler == nullptr ? outside.next() : scheduler->randomNumber();
}

void*& threadSlot(ThreadSlot slot) {
  static std::array<void*, static_cast<std::size_t>(ThreadSlot::kCount)> outside{};
  Scheduler* const scheduler = Scheduler::current();
  auto& slots = scheduler == nullptr ? outside : scheduler->running().slots;
  return slots.at(static_cast<std::size_t>(slot));
}

void panic(const char* reason) {
  std::string line = std::string("panic: ") + reason;
  if (Scheduler* const scheduler = Scheduler::current(); scheduler != nullptr) {
    if (scheduler->unwinding()) scheduler->giveUpRunning();
    line += " (" + scheduler->describe() + ")";
  }
  line += "\n";
  [[maybe_unused]] const ssize_t written = write(STDERR_FILENO, line.data(), line.size());
  std::abort();
}

}  // namespace spacekeep::rt
