// Thread safety: pure function.
//
// How long to pause before the next try to check in.
#pragma once

#include <cstdint>

namespace spacekeep::sdk {

inline constexpr std::uint64_t kShortestPauseNs = 100'000'000;
inline constexpr std::uint64_t kLongestPauseNs = 30'000'000'000;

/// `failures` is how many tries in a row have failed, at least 1; `random` any number. Even spread
/// from the shortest pause up to a limit that doubles with each failure, so that the services of a
/// device do not all come back at the same moment after the daemon was restarted.
[[nodiscard]] std::uint64_t retryPauseNs(unsigned failures, std::uint64_t random);

}  // namespace spacekeep::sdk
