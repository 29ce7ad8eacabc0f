#include "support/timebase.h"

namespace spacekeep {

std::atomic<double> gTimebaseConversion{0.0};

double elapsedNs(std::uint64_t start_ticks, std::uint64_t now_ticks) {
  // As doubles, so that a start that lies ahead of now gives a negative time, not a huge one. Of very
  // large counts that leaves out the last ticks.
  return (static_cast<double>(now_ticks) - static_cast<double>(start_ticks)) * gTimebaseConversion;
}

}  // namespace spacekeep
