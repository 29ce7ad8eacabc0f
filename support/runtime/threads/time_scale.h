// Thread safety: set it while no other thread waits with a deadline or reads a clock.
//
// For tests on real threads: lets both clocks, and with them every deadline, run faster than the
// real ones, so that a twelve-second wait passes in milliseconds. The deterministic runtime needs
// none of this. Programs that never call it read the clocks unchanged.
#pragma once

#include <cstdint>

namespace spacekeep::rt {

/// From now on one real second counts as `scale` seconds (scale >= 1). Clocks go on from the value
/// they show, so they never step back.
void setTimeScaleForTests(std::uint32_t scale);

[[nodiscard]] std::uint32_t timeScaleForTests();

}  // namespace spacekeep::rt
