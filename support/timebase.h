// Thread safety: may be read and written from any thread; written once, at start-up.
//
// Elapsed time: (ticks now - ticks then) x gTimebaseConversion = nanoseconds.
#pragma once

#include <atomic>
#include <cstdint>

namespace spacekeep {

/// Nanoseconds per tick. 0.0 until start-up has read the timebase, and for good if it could not.
extern std::atomic<double> gTimebaseConversion;

/// Nanoseconds between two readings of rt::ticks().
[[nodiscard]] double elapsedNs(std::uint64_t start_ticks, std::uint64_t now_ticks);

}  // namespace spacekeep
