// Thread safety: every function may be called from any thread.
//
// Waiting for what another process does, and how long it took.
#pragma once

#include <cstdint>
#include <functional>

namespace spacekeep::ctl {

inline constexpr std::uint64_t kSecondNs = 1'000'000'000;
inline constexpr std::uint64_t kMillisecondNs = 1'000'000;

/// Looks every millisecond until `condition` holds, for at most so long; answers whether it does.
/// The state of another process announces itself to nobody, so there is nothing to sleep on.
bool within(std::uint64_t timeout_ns, const std::function<bool()>& condition);

/// Between two readings of the monotonic counter; 0 when the later one is the earlier.
[[nodiscard]] std::uint64_t elapsedNs(std::uint64_t from_ticks, std::uint64_t to_ticks);

}  // namespace spacekeep::ctl
