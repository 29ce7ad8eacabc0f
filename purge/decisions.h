// Thread safety: pure functions.
//
// The decisions of a purge, over plain values.
#pragma once

#include <cstdint>
#include <string>

#include "support/values/value.h"

namespace spacekeep::purge {

/// The longest wait per urgency that a request may ask for.
inline constexpr std::uint64_t kMaxUserTimeoutSeconds = 300;
inline constexpr std::uint64_t kNsPerSecond = 1'000'000'000;

/// Bytes that one service is asked for: an equal share of what is missing, the remainder dropped.
/// A divisor of 0 counts as 1. `purged_bytes` is below `needed_bytes`.
[[nodiscard]] std::uint64_t donation(std::uint64_t needed_bytes, std::uint64_t purged_bytes,
                                     std::uint64_t viable_services);

/// The wait for one urgency: the user's when it is not 0, else 2 seconds per urgency level.
[[nodiscard]] std::uint64_t waitSeconds(std::uint64_t user_timeout_seconds, std::int32_t urgency);

/// The ten-percent bucket of `purged_bytes` in `requested_bytes` (not 0), computed in single
/// precision. What does not fit into 32 bits becomes the nearest multiple of ten that does.
[[nodiscard]] std::int32_t percentBucket(std::uint64_t requested_bytes, std::uint64_t purged_bytes);

// Keys and texts that hold a number.
[[nodiscard]] std::string urgencyInfoKey(std::int32_t urgency);
[[nodiscard]] std::string urgencyTimeoutKey(std::int32_t urgency);
[[nodiscard]] std::string urgencyStatsKey(std::int32_t urgency);
[[nodiscard]] std::string urgencyStatsText(std::uint64_t reported_bytes, std::uint64_t purged_bytes,
                                           std::uint64_t needed_bytes, bool cancelled);

}  // namespace spacekeep::purge
