// Thread safety: constants.
//
// What the daemon asks for by itself on each volume that is short of space. The same for both
// thresholds: a volume that is very short gets no more and no faster.
#pragma once

#include <cstdint>

namespace spacekeep {

inline constexpr std::uint64_t kLowDiskAmountBytes = 262'144'000;
inline constexpr int kLowDiskTimeoutSeconds = 300;

}  // namespace spacekeep
