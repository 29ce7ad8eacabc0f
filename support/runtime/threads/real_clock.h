// Thread safety: every function may be called from any thread at any time.
//
// What the other files of this folder need of the clock beyond runtime.h.
#pragma once

#include <cstdint>
#include <ctime>

namespace spacekeep::rt {

/// The instant of CLOCK_MONOTONIC at which ticks() reaches `deadline_ticks`.
[[nodiscard]] timespec realInstantOf(std::uint64_t deadline_ticks);

}  // namespace spacekeep::rt
