#include "support/events/low_space_pace.h"

#include <algorithm>
#include <cmath>

namespace spacekeep {
namespace {

/// How many times its threshold a volume must have left to be far, where it is less than half empty.
constexpr std::uint64_t kFarThresholds = 4;
/// Parts of the threshold: what counts as a change worth an event, and as a change at all.
constexpr std::uint64_t kEventParts = 16;
constexpr std::uint64_t kQuietParts = 64;
/// A short volume that nobody touches is looked at again after this part of the quiet time.
constexpr std::uint64_t kQuietDivisor = 4;

std::uint64_t decrease(std::uint64_t before, std::uint64_t now) {
  return before > now ? before - now : 0;
}

std::uint64_t partOf(std::uint64_t threshold, std::uint64_t parts) {
  return std::max<std::uint64_t>(threshold / parts, 1);
}

std::uint64_t addSaturating(std::uint64_t sum, std::uint64_t more) {
  return more > UINT64_MAX - sum ? UINT64_MAX : sum + more;
}

SpaceMeasure makeMeasure(std::uint64_t available, std::uint64_t total, std::uint64_t low,
                         double device_per_second, const WatchLimits& limits) {
  const double lasts_seconds = static_cast<double>(limits.threshold_lasts_ns) / 1e9;
  return {
      .available = available,
      .total = total,
      .low = low,
      .burst_per_second = std::min(device_per_second, static_cast<double>(low) / lasts_seconds)};
}

bool isFar(const SpaceMeasure& measure, std::uint64_t by_rate_seen_ns, const WatchLimits& limits) {
  const bool much_left =
      measure.available >= measure.total / 2 && measure.available / kFarThresholds >= measure.low;
  return much_left && by_rate_seen_ns >= limits.near_pause_ns;
}

}  // namespace

std::uint64_t timeToUseUpNs(std::uint64_t amount, double per_second) {
  const double ns = static_cast<double>(amount) / per_second * 1e9;
  return ns < 1e18 ? static_cast<std::uint64_t>(ns) : UINT64_MAX;
}

double fastestRate(double previous, std::uint64_t used, std::uint64_t elapsed_ns,
                   std::uint64_t half_life_ns) {
  if (elapsed_ns == 0) return previous;
  const auto elapsed = static_cast<double>(elapsed_ns);
  const double seen = static_cast<double>(used) / (elapsed / 1e9);
  const double faded = previous * std::exp2(-elapsed / static_cast<double>(half_life_ns));
  return std::max(seen, faded);
}

std::vector<SpaceMeasure> measuresOf(const VolumeSample& sample, const WatchLimits& limits) {
  const VolumeSpace& space = sample.space;
  return {makeMeasure(space.available_bytes, space.size_bytes, sample.thresholds.low_bytes,
                      limits.burst_bytes_per_second, limits),
          makeMeasure(space.available_inodes, space.inodes, sample.thresholds.low_inodes,
                      limits.burst_inodes_per_second, limits)};
}

MeasureHistory historyFrom(const SpaceMeasure& measure, std::uint64_t now_ns) {
  MeasureHistory history;
  history.available = measure.available;
  history.quiet_available = measure.available;
  history.quiet_since_ns = now_ns;
  return history;
}

void recordLook(MeasureHistory& history, const SpaceMeasure& measure, std::uint64_t elapsed_ns,
                std::uint64_t now_ns, const WatchLimits& limits) {
  const std::uint64_t used = decrease(history.available, measure.available);
  history.rate = fastestRate(history.rate, used, elapsed_ns, limits.rate_half_life_ns);
  history.used = addSaturating(history.used, used);
  history.gained = addSaturating(history.gained, decrease(measure.available, history.available));
  history.available = measure.available;
  const std::uint64_t change = decrease(history.quiet_available, measure.available) +
                               decrease(measure.available, history.quiet_available);
  if (change < partOf(measure.low, kQuietParts)) return;
  history.quiet_available = measure.available;
  history.quiet_since_ns = now_ns;
}

bool hasBeenUsed(const MeasureHistory& history, const SpaceMeasure& measure) {
  return measure.low != 0 && history.used >= partOf(measure.low, kEventParts);
}

bool hasGained(const MeasureHistory& history, const SpaceMeasure& measure) {
  return measure.low != 0 && history.gained >= partOf(measure.low, kEventParts);
}

std::uint64_t pauseForMeasure(const SpaceMeasure& measure, const MeasureHistory& history,
                              VolumeCare care, std::uint64_t now_ns, const WatchLimits& limits) {
  if (measure.low == 0) return limits.longest_pause_ns;
  const std::uint64_t to_spare = measure.available - std::min(measure.available, measure.low) / 2;
  const double rate = std::max(history.rate, measure.burst_per_second);
  std::uint64_t pause_ns = timeToUseUpNs(to_spare, rate);
  if (care.is_handled) {
    // What the purge frees may be used up within seconds, and must be seen to have come.
    pause_ns = std::max(pause_ns, limits.handling_pause_ns);
  } else if (care.is_reported && measure.available < measure.low) {
    // What could be done has been done. Who waits for it to recover needs no haste, and it may
    // stay like this for weeks.
    const std::uint64_t quiet_ns = now_ns - history.quiet_since_ns;
    pause_ns = std::max(pause_ns, std::min(quiet_ns / kQuietDivisor, limits.near_pause_ns));
  }
  if (isFar(measure, timeToUseUpNs(to_spare, history.rate), limits)) {
    pause_ns = std::max(pause_ns, limits.near_pause_ns);
  }
  const bool is_near = measure.available / 2 < measure.low;
  return std::clamp(pause_ns, limits.shortest_pause_ns,
                    is_near ? limits.near_pause_ns : limits.longest_pause_ns);
}

}  // namespace spacekeep
