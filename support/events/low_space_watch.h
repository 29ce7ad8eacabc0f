// Thread safety: none; an object belongs to one thread.
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
#include "support/events/low_space_pace.h"
#include "support/volumes/space_source.h"

namespace spacekeep {

struct WatchStep {
  std::uint64_t flags = 0;     ///< of the event to send now, 0 for none
  std::uint64_t pause_ns = 0;  ///< until the next look
};

/// A volume is reported at once when it becomes short, and when it becomes shorter than reported.
/// One that stays short is reported again with a growing pause; soon, when its space was used
/// further or came back since the last event, unless events do not help any more.
class LowSpaceWatch {
 public:
  explicit LowSpaceWatch(WatchLimits limits = {}) : limits_(limits) {}

  /// `samples` are all local volumes; those that are missing are forgotten. `now_ns` is monotonic.
  /// While `is_handling` (an event is being handled) nothing is reported, but nothing is forgotten
  /// either.
  [[nodiscard]] WatchStep look(const std::vector<VolumeSample>& samples, std::uint64_t now_ns,
                               bool is_handling = false);

  /// The event sent last has been handled. Pauses between events count from here, since that may
  /// take many minutes.
  void handlingEnded(std::uint64_t now_ns);

 private:
  struct Watched {
    std::vector<SpaceMeasure> measures;
    std::vector<MeasureHistory> histories;  // of the measures, in their order
    std::uint64_t looked_at_ns = 0;
    SpaceLevel reported = SpaceLevel::kEnough;
    std::uint64_t repeats_from_ns = 0;  // the last event, or the end of its handling
    std::uint64_t repeat_pause_ns = 0;
    std::uint64_t hasty_pause_ns = 0;
  };
  using Key = std::pair<std::string, std::uint64_t>;  // mount point, file system

  [[nodiscard]] Watched observe(const VolumeSample& sample, std::uint64_t now_ns) const;
  [[nodiscard]] std::uint64_t report(Watched& watched, SpaceLevel level,
                                     std::uint64_t now_ns) const;
  void noteReport(Watched& watched, SpaceLevel level, std::uint64_t now_ns) const;
  [[nodiscard]] static bool hasGained(const Watched& watched);
  /// When a volume that stays short is next reported, as far as can be told now.
  [[nodiscard]] static std::uint64_t nextReportNs(const Watched& watched);
  [[nodiscard]] std::uint64_t pauseFor(const Watched& watched, bool is_handling,
                                       std::uint64_t now_ns) const;

  const WatchLimits limits_;
  std::map<Key, Watched> watched_;
};

}  // namespace spacekeep
