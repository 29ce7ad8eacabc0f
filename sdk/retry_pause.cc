#include "sdk/retry_pause.h"

#include <algorithm>

namespace spacekeep::sdk {

std::uint64_t retryPauseNs(unsigned failures, std::uint64_t random) {
  // Nine doublings pass the longest pause; more would overflow for no use.
  const unsigned doublings = std::clamp(failures, 1U, 9U);
  const std::uint64_t limit_ns = std::min(kShortestPauseNs << doublings, kLongestPauseNs);
  return kShortestPauseNs + random % (limit_ns - kShortestPauseNs + 1);
}

}  // namespace spacekeep::sdk
