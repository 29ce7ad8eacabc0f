// Thread safety: call from the thread of the test.
//
// Runs the body of a test in many orders of events. On the deterministic runtime these are real
// schedules, drawn from seeds; on real threads the body runs a few times with fast clocks.
#pragma once

#include <cstdint>
#include <functional>

namespace spacekeep {

/// On real threads time runs this much faster inside inEverySchedule: a wait of 12 s takes 60 ms.
/// A busy machine may then oversleep by seconds, so only exact-time tests of the deterministic
/// runtime may ask that something happened before a deadline.
inline constexpr std::uint32_t kTestTimeScale = 200;

/// Runs `body` with seeds 1 to `seeds`, random and priority schedules in turn (on real threads at
/// most 10 times), and fails the test when a schedule deadlocks, is stuck, leaves threads behind,
/// or fails an expectation. It ends at the first failing schedule and prints one line that replays
/// it: the environment variable SPACEKEEP_SCHEDULE picks a single schedule.
void inEverySchedule(unsigned seeds, const std::function<void()>& body);

/// True on real threads. For bounds that only virtual time can keep.
[[nodiscard]] bool onRealThreads();

}  // namespace spacekeep
