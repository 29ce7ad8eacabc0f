// Thread safety: none; an object belongs to one thread. The functions are pure.
//
// There is no kernel event for low space, so somebody has to look. This decides when to look again
// and what to report; it knows no clock and no volumes but those it is given.
#pragma once

#include <cstdint>
#include <map>
#include <string>
#include <utility>
#include <vector>

#include "support/events/events.h"
#include "support/volumes/space_source.h"

namespace spacekeep {

struct WatchLimits {
  std::uint64_t shortest_pause_ns = 1'000'000'000;
  /// A volume that has less than twice its threshold left is near, and looked at this often at
  /// least; one that has more is far, and looked at this often at most.
  std::uint64_t near_pause_ns = 60'000'000'000;
  std::uint64_t longest_pause_ns = 4 * 3'600'000'000'000;
  /// First pause between two events for a volume that stays short; each further one is twice as
  /// long, up to the last.
  std::uint64_t first_repeat_ns = 60'000'000'000;
  std::uint64_t last_repeat_ns = 3'600'000'000'000;
  /// Slowest filling that is reckoned with: a volume that has been quiet for long may not stay so.
  double slowest_bytes_per_second = 8.0 * 1024 * 1024;
  double slowest_inodes_per_second = 200.0;
  /// After this time without a faster filling the fastest one counts half.
  std::uint64_t rate_half_life_ns = 6 * 3'600'000'000'000;
};

/// Time in which `amount` could be used up at `per_second`, UINT64_MAX when that is beyond reason.
[[nodiscard]] std::uint64_t timeToUseUpNs(std::uint64_t amount, double per_second);

/// The fastest filling to reckon with after another look: the one just seen, or the old one, which
/// fades, but never less than `slowest`.
[[nodiscard]] double fastestRate(double previous, std::uint64_t used, std::uint64_t elapsed_ns,
                                 double slowest, std::uint64_t half_life_ns);

struct WatchStep {
  std::uint64_t flags = 0;     ///< of the event to send now, 0 for none
  std::uint64_t pause_ns = 0;  ///< until the next look
};

class LowSpaceWatch {
 public:
  explicit LowSpaceWatch(WatchLimits limits = {}) : limits_(limits) {}

  /// `samples` are all local volumes; those that are missing are forgotten. `now_ns` is monotonic.
  [[nodiscard]] WatchStep look(const std::vector<VolumeSample>& samples, std::uint64_t now_ns);

 private:
  struct Watched {
    VolumeSpace space;
    SpaceThresholds thresholds;
    std::uint64_t looked_at_ns = 0;
    double bytes_per_second = 0;
    double inodes_per_second = 0;
    SpaceLevel reported = SpaceLevel::kEnough;
    std::uint64_t repeat_pause_ns = 0;
    std::uint64_t next_report_ns = 0;
  };
  using Key = std::pair<std::string, std::uint64_t>;  // mount point, file system

  [[nodiscard]] Watched observe(const VolumeSample& sample, std::uint64_t now_ns) const;
  [[nodiscard]] std::uint64_t report(Watched& watched, SpaceLevel level,
                                     std::uint64_t now_ns) const;
  [[nodiscard]] std::uint64_t pauseFor(const Watched& watched, SpaceLevel level,
                                       std::uint64_t now_ns) const;

  const WatchLimits limits_;
  std::map<Key, Watched> watched_;
};

}  // namespace spacekeep
