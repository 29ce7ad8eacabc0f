// Thread safety: pure functions.
//
// Spans of the monotonic counter in nanoseconds.
#pragma once

#include <cstdint>

#include "support/runtime/runtime.h"

namespace spacekeep::cachedir {

inline constexpr std::uint64_t kNsPerMs = 1'000'000;

/// Nanoseconds since `begin_ticks`. A counter that cannot be read counts ticks as nanoseconds.
[[nodiscard]] inline std::uint64_t elapsedNs(std::uint64_t begin_ticks) {
  const rt::Timebase base = rt::timebase().value_or(rt::Timebase{1, 1});
  return (rt::ticks() - begin_ticks) * base.numerator / base.denominator;
}

}  // namespace spacekeep::cachedir
