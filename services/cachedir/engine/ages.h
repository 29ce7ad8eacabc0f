// Thread safety: pure functions.
//
// How old is old enough. All times are nanoseconds on the wall clock.
#pragma once

#include <cstdint>
#include <limits>

#include "services/cachedir/engine/file_facts.h"
#include "services/cachedir/engine/rules.h"

namespace spacekeep::cachedir {

/// The latest time of use with which a file may go. A span of 0 spares none, not even a file that a
/// wrong clock has dated into the future.
[[nodiscard]] inline std::int64_t latestFor(std::int64_t unused_seconds, std::int64_t now_ns) {
  if (unused_seconds == 0) return std::numeric_limits<std::int64_t>::max();
  return now_ns - unused_seconds * kNsPerSecond;
}

/// `urgency` is 1 to 4.
[[nodiscard]] inline std::int64_t latestForUrgency(const DirectoryRule& rule, int urgency,
                                                   std::int64_t now_ns) {
  return latestFor(rule.unused_seconds[static_cast<std::size_t>(urgency - 1)], now_ns);
}

[[nodiscard]] inline std::int64_t latestForPeriodic(const DirectoryRule& rule,
                                                    std::int64_t now_ns) {
  if (!rule.periodic_unused_seconds) return std::numeric_limits<std::int64_t>::min();
  return latestFor(*rule.periodic_unused_seconds, now_ns);
}

/// The mildest urgency at which a file last used at `used_ns` may go; kUrgencies + 1 when none.
[[nodiscard]] inline int mildestUrgency(const DirectoryRule& rule, std::int64_t used_ns,
                                        std::int64_t now_ns) {
  for (int urgency = 1; urgency <= kUrgencies; ++urgency) {
    if (used_ns <= latestForUrgency(rule, urgency, now_ns)) return urgency;
  }
  return kUrgencies + 1;
}

}  // namespace spacekeep::cachedir
