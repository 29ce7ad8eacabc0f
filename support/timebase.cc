#include "support/timebase.h"

namespace spacekeep {

std::atomic<double> gTimebaseConversion{0.0};

double elapsedNs(std::uint64_t start_ticks, std::uint64_t now_ticks) {
  // Subtracted as integers: a double has no room for the single ticks of a large count. Signed, so
  // that a start that lies ahead of now gives a negative time, not a huge one.
  const auto elapsed_ticks = static_cast<std::int64_t>(now_ticks - start_ticks);
  return static_cast<double>(elapsed_ticks) * gTimebaseConversion;
}

}  // namespace spacekeep
