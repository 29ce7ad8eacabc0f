#include "support/events/low_space_watch.h"

#include <algorithm>
#include <cmath>

namespace spacekeep {
namespace {

std::uint64_t above(std::uint64_t available, std::uint64_t threshold) {
  return available > threshold ? available - threshold : 0;
}

std::uint64_t usedSince(std::uint64_t before, std::uint64_t now) {
  return before > now ? before - now : 0;
}

bool isNear(const VolumeSpace& space, const SpaceThresholds& thresholds) {
  return space.available_bytes / 2 < thresholds.low_bytes ||
         (space.inodes != 0 && space.available_inodes / 2 < thresholds.low_inodes);
}

std::uint64_t flagOf(SpaceLevel level) {
  switch (level) {
    case SpaceLevel::kEnough:
      return 0;
    case SpaceLevel::kLow:
      return kVqLowDisk;
    case SpaceLevel::kVeryLow:
      return kVqVeryLowDisk;
  }
  return 0;
}

}  // namespace

std::uint64_t timeToUseUpNs(std::uint64_t amount, double per_second) {
  const double ns = static_cast<double>(amount) / per_second * 1e9;
  return ns < 1e18 ? static_cast<std::uint64_t>(ns) : UINT64_MAX;
}

double fastestRate(double previous, std::uint64_t used, std::uint64_t elapsed_ns, double slowest,
                   std::uint64_t half_life_ns) {
  if (elapsed_ns == 0) return std::max(previous, slowest);
  const auto elapsed = static_cast<double>(elapsed_ns);
  const double seen = static_cast<double>(used) / (elapsed / 1e9);
  const double faded = previous * std::exp2(-elapsed / static_cast<double>(half_life_ns));
  return std::max({seen, faded, slowest});
}

WatchStep LowSpaceWatch::look(const std::vector<VolumeSample>& samples, std::uint64_t now_ns) {
  WatchStep step{.flags = 0, .pause_ns = limits_.longest_pause_ns};
  std::map<Key, Watched> now_watched;
  for (const VolumeSample& sample : samples) {
    Watched watched = observe(sample, now_ns);
    step.flags |= report(watched, sample.level, now_ns);
    step.pause_ns = std::min(step.pause_ns, pauseFor(watched, sample.level, now_ns));
    now_watched.emplace(Key{sample.volume, sample.file_system}, watched);
  }
  watched_ = std::move(now_watched);
  return step;
}

LowSpaceWatch::Watched LowSpaceWatch::observe(const VolumeSample& sample,
                                              std::uint64_t now_ns) const {
  const auto known = watched_.find({sample.volume, sample.file_system});
  Watched watched;
  if (known == watched_.end()) {
    watched.bytes_per_second = limits_.slowest_bytes_per_second;
    watched.inodes_per_second = limits_.slowest_inodes_per_second;
  } else {
    watched = known->second;
    const std::uint64_t elapsed_ns = now_ns - watched.looked_at_ns;
    watched.bytes_per_second =
        fastestRate(watched.bytes_per_second,
                    usedSince(watched.space.available_bytes, sample.space.available_bytes),
                    elapsed_ns, limits_.slowest_bytes_per_second, limits_.rate_half_life_ns);
    watched.inodes_per_second =
        fastestRate(watched.inodes_per_second,
                    usedSince(watched.space.available_inodes, sample.space.available_inodes),
                    elapsed_ns, limits_.slowest_inodes_per_second, limits_.rate_half_life_ns);
  }
  watched.space = sample.space;
  watched.thresholds = sample.thresholds;
  watched.looked_at_ns = now_ns;
  return watched;
}

std::uint64_t LowSpaceWatch::report(Watched& watched, SpaceLevel level,
                                    std::uint64_t now_ns) const {
  if (level == SpaceLevel::kEnough) {
    watched.reported = level;
    return 0;
  }
  if (level > watched.reported) {  // newly short, or shorter than before: at once
    watched.repeat_pause_ns = limits_.first_repeat_ns;
  } else if (now_ns >= watched.next_report_ns) {
    watched.repeat_pause_ns = std::min(watched.repeat_pause_ns * 2, limits_.last_repeat_ns);
  } else {
    watched.reported = std::min(watched.reported, level);  // what gets worse again is news again
    return 0;
  }
  watched.reported = level;
  watched.next_report_ns = now_ns + watched.repeat_pause_ns;
  return flagOf(level);
}

std::uint64_t LowSpaceWatch::pauseFor(const Watched& watched, SpaceLevel level,
                                      std::uint64_t now_ns) const {
  const std::uint64_t until_report = usedSince(watched.next_report_ns, now_ns);
  // Nothing worse can come; that it recovers needs no haste.
  if (level == SpaceLevel::kVeryLow) return std::max(until_report, limits_.shortest_pause_ns);

  const SpaceThresholds& thresholds = watched.thresholds;
  const bool is_low = level == SpaceLevel::kLow;
  const std::uint64_t bytes_left = above(watched.space.available_bytes,
                                         is_low ? thresholds.very_low_bytes : thresholds.low_bytes);
  const std::uint64_t inodes_left = above(
      watched.space.available_inodes, is_low ? thresholds.very_low_inodes : thresholds.low_inodes);
  std::uint64_t pause = timeToUseUpNs(bytes_left, watched.bytes_per_second);
  if (watched.space.inodes != 0) {
    pause = std::min(pause, timeToUseUpNs(inodes_left, watched.inodes_per_second));
  }
  if (is_low) pause = std::min(pause, until_report);
  if (is_low || isNear(watched.space, thresholds)) {
    return std::clamp(pause, limits_.shortest_pause_ns, limits_.near_pause_ns);
  }
  return std::clamp(pause, limits_.near_pause_ns, limits_.longest_pause_ns);
}

}  // namespace spacekeep
