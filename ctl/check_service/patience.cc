#include "ctl/check_service/patience.h"

#include "support/runtime/runtime.h"

namespace spacekeep::ctl {

bool within(std::uint64_t timeout_ns, const std::function<bool()>& condition) {
  const std::uint64_t deadline = rt::deadlineAfterNs(timeout_ns);
  while (!condition()) {
    if (rt::ticks() >= deadline) return false;
    rt::sleepNs(kMillisecondNs);
  }
  return true;
}

std::uint64_t elapsedNs(std::uint64_t from_ticks, std::uint64_t to_ticks) {
  if (to_ticks <= from_ticks) return 0;
  const auto base = rt::timebase().value_or(rt::Timebase{1, 1});
  return (to_ticks - from_ticks) * base.numerator / base.denominator;
}

}  // namespace spacekeep::ctl
