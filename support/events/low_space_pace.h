// Thread safety: plain values and pure functions.
//
// How soon a volume has to be looked at again, by one measure (its bytes or its inodes): so soon
// that nothing which fills it can take more than half of what is left at its threshold unseen.
#pragma once

#include <cstdint>
#include <vector>

#include "support/volumes/space_source.h"

namespace spacekeep {

struct WatchLimits {
  std::uint64_t shortest_pause_ns = 250'000'000;
  /// A volume that has less than twice its threshold left is near, and looked at this often at
  /// least. One that is far, by what it has left and by how fast it is filled, is looked at this
  /// often at most.
  std::uint64_t near_pause_ns = 60'000'000'000;
  std::uint64_t longest_pause_ns = 4 * 3'600'000'000'000;
  /// First pause between two events for a volume that stays short and quiet; each further one is
  /// twice as long, up to the last.
  std::uint64_t first_repeat_ns = 60'000'000'000;
  std::uint64_t last_repeat_ns = 3'600'000'000'000;
  /// The same where space still comes and goes.
  std::uint64_t first_hasty_repeat_ns = 1'000'000'000;
  /// What a quiet volume can be filled with out of the blue: writers of 80 MiB/s that were held up
  /// for a moment catch up at twice that. On a small volume it is less: nobody can be in time for
  /// one whose whole threshold is used up within less than this time.
  double burst_bytes_per_second = 160.0 * 1024 * 1024;
  double burst_inodes_per_second = 20'000;
  std::uint64_t threshold_lasts_ns = 625'000'000;
  /// After this time without a faster filling the fastest one seen counts half.
  std::uint64_t rate_half_life_ns = 600'000'000'000;
  /// While an event is handled no further one can be sent, so a low volume is looked at this often
  /// at most.
  std::uint64_t handling_pause_ns = 1'000'000'000;
};

/// Time in which `amount` could be used up at `per_second`, UINT64_MAX when that is beyond reason.
[[nodiscard]] std::uint64_t timeToUseUpNs(std::uint64_t amount, double per_second);

/// The fastest filling to reckon with after another look: the one just seen, or the old one, which
/// fades.
[[nodiscard]] double fastestRate(double previous, std::uint64_t used, std::uint64_t elapsed_ns,
                                 std::uint64_t half_life_ns);

/// One of the two things that a volume can run out of.
struct SpaceMeasure {
  std::uint64_t available = 0;
  std::uint64_t total = 0;
  std::uint64_t low = 0;  ///< 0: never short by this measure
  double burst_per_second = 0;
};
/// The bytes first, then the inodes.
[[nodiscard]] std::vector<SpaceMeasure> measuresOf(const VolumeSample& sample,
                                                   const WatchLimits& limits);

/// What is known of a measure from the looks so far.
struct MeasureHistory {
  std::uint64_t available = 0;  ///< at the last look
  double rate = 0;              ///< fastest filling seen, per second
  std::uint64_t used = 0;       ///< since the last event for the volume
  std::uint64_t gained = 0;     ///< since the last event for the volume
  std::uint64_t quiet_available = 0;
  std::uint64_t quiet_since_ns = 0;  ///< about as much available as then, all the time since
};
[[nodiscard]] MeasureHistory historyFrom(const SpaceMeasure& measure, std::uint64_t now_ns);
void recordLook(MeasureHistory& history, const SpaceMeasure& measure, std::uint64_t elapsed_ns,
                std::uint64_t now_ns, const WatchLimits& limits);

/// A change worth a further event: a purge has something to do again, or was seen to help.
[[nodiscard]] bool hasBeenUsed(const MeasureHistory& history, const SpaceMeasure& measure);
[[nodiscard]] bool hasGained(const MeasureHistory& history, const SpaceMeasure& measure);

/// What was done about the volume so far.
struct VolumeCare {
  bool is_reported = false;  ///< it is short, and an event has told so
  bool is_handled = false;   ///< an event is being handled
};
[[nodiscard]] std::uint64_t pauseForMeasure(const SpaceMeasure& measure,
                                            const MeasureHistory& history, VolumeCare care,
                                            std::uint64_t now_ns, const WatchLimits& limits);

}  // namespace spacekeep
