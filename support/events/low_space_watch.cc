#include "support/events/low_space_watch.h"

#include <algorithm>

namespace spacekeep {
namespace {

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

WatchStep LowSpaceWatch::look(const std::vector<VolumeSample>& samples, std::uint64_t now_ns,
                              bool is_handling) {
  WatchStep step{.flags = 0, .pause_ns = limits_.longest_pause_ns};
  std::map<Key, Watched> now_watched;
  for (const VolumeSample& sample : samples) {
    Watched watched = observe(sample, now_ns);
    if (is_handling) {
      watched.reported = std::min(watched.reported, sample.level);
    } else {
      step.flags |= report(watched, sample.level, now_ns);
    }
    step.pause_ns = std::min(step.pause_ns, pauseFor(watched, is_handling, now_ns));
    now_watched.emplace(Key{sample.volume, sample.file_system}, std::move(watched));
  }
  watched_ = std::move(now_watched);
  return step;
}

void LowSpaceWatch::handlingEnded(std::uint64_t now_ns) {
  for (auto& [key, watched] : watched_) {
    watched.repeats_from_ns = now_ns;
    // Some file systems give space back only a while after a file is gone.
    for (MeasureHistory& history : watched.histories) history.quiet_since_ns = now_ns;
  }
}

LowSpaceWatch::Watched LowSpaceWatch::observe(const VolumeSample& sample,
                                              std::uint64_t now_ns) const {
  const auto known = watched_.find({sample.volume, sample.file_system});
  Watched watched = known == watched_.end() ? Watched{} : known->second;
  watched.measures = measuresOf(sample, limits_);
  for (std::size_t i = 0; i < watched.measures.size(); ++i) {
    const SpaceMeasure& measure = watched.measures[i];
    if (known == watched_.end()) {
      watched.histories.push_back(historyFrom(measure, now_ns));
    } else {
      recordLook(watched.histories[i], measure, now_ns - watched.looked_at_ns, now_ns, limits_);
    }
  }
  watched.looked_at_ns = now_ns;
  return watched;
}

std::uint64_t LowSpaceWatch::report(Watched& watched, SpaceLevel level,
                                    std::uint64_t now_ns) const {
  const bool is_worse = level > watched.reported;
  if (level == SpaceLevel::kEnough || (!is_worse && now_ns < nextReportNs(watched))) {
    watched.reported = std::min(watched.reported, level);  // what gets worse again is news again
    return 0;
  }
  noteReport(watched, level, now_ns);
  return flagOf(level);
}

void LowSpaceWatch::noteReport(Watched& watched, SpaceLevel level, std::uint64_t now_ns) const {
  const bool is_new = watched.reported == SpaceLevel::kEnough;
  const bool is_due = now_ns >= watched.repeats_from_ns + watched.repeat_pause_ns;
  if (is_new || hasGained(watched)) {
    watched.repeat_pause_ns = limits_.first_repeat_ns;
    watched.hasty_pause_ns = limits_.first_hasty_repeat_ns;
  } else {
    // The last event brought nothing.
    if (is_due) {
      watched.repeat_pause_ns = std::min(watched.repeat_pause_ns * 2, limits_.last_repeat_ns);
    }
    watched.hasty_pause_ns = std::min(watched.hasty_pause_ns * 2, watched.repeat_pause_ns);
  }
  watched.reported = level;
  watched.repeats_from_ns = now_ns;
  for (MeasureHistory& history : watched.histories) history.used = history.gained = 0;
}

bool LowSpaceWatch::hasGained(const Watched& watched) {
  for (std::size_t i = 0; i < watched.measures.size(); ++i) {
    if (spacekeep::hasGained(watched.histories[i], watched.measures[i])) return true;
  }
  return false;
}

std::uint64_t LowSpaceWatch::nextReportNs(const Watched& watched) {
  if (hasGained(watched)) return watched.repeats_from_ns;
  for (std::size_t i = 0; i < watched.measures.size(); ++i) {
    if (hasBeenUsed(watched.histories[i], watched.measures[i])) {
      return watched.repeats_from_ns + watched.hasty_pause_ns;
    }
  }
  return watched.repeats_from_ns + watched.repeat_pause_ns;
}

std::uint64_t LowSpaceWatch::pauseFor(const Watched& watched, bool is_handling,
                                      std::uint64_t now_ns) const {
  const bool is_reported = watched.reported != SpaceLevel::kEnough;
  const VolumeCare care{.is_reported = is_reported, .is_handled = is_handling};
  std::uint64_t pause_ns = limits_.longest_pause_ns;
  for (std::size_t i = 0; i < watched.measures.size(); ++i) {
    pause_ns = std::min(pause_ns, pauseForMeasure(watched.measures[i], watched.histories[i], care,
                                                  now_ns, limits_));
  }
  if (!is_reported || is_handling) return pause_ns;
  const std::uint64_t next_ns = nextReportNs(watched);
  const std::uint64_t until_report_ns = next_ns > now_ns ? next_ns - now_ns : 0;
  return std::clamp(until_report_ns, limits_.shortest_pause_ns,
                    std::max(pause_ns, limits_.shortest_pause_ns));
}

}  // namespace spacekeep
