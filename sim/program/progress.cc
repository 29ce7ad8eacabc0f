#include "sim/program/progress.h"

#include <cmath>
#include <cstdio>

namespace spacekeep::sim {
namespace {

// A rate over less than that says nothing about the rest.
constexpr double kLeastSeconds = 0.5;

/// "12 s", "1 min 07 s", "2 h 05 min".
std::string durationText(double duration_seconds) {
  const auto seconds = static_cast<unsigned long long>(std::ceil(duration_seconds));
  char text[48];
  if (seconds < 60) {
    std::snprintf(text, sizeof text, "%llu s", seconds);
  } else if (seconds < 3600) {
    std::snprintf(text, sizeof text, "%llu min %02llu s", seconds / 60, seconds % 60);
  } else {
    std::snprintf(text, sizeof text, "%llu h %02llu min", seconds / 3600, seconds / 60 % 60);
  }
  return text;
}

}  // namespace

std::string progressText(const Progress& progress) {
  std::string text = std::to_string(progress.done) + " of " + std::to_string(progress.total) +
                     " schedules, " + std::to_string(progress.failed) + " failed";
  if (progress.done == 0 || progress.elapsed_seconds < kLeastSeconds) return text;
  const double per_second = static_cast<double>(progress.done) / progress.elapsed_seconds;
  const std::uint64_t left = progress.total > progress.done ? progress.total - progress.done : 0;
  char rate[32];
  std::snprintf(rate, sizeof rate, ", %.0f/s, ", per_second);
  return text + rate + durationText(static_cast<double>(left) / per_second) + " left";
}

bool ProgressPace::isDue(double now_seconds) {
  if (now_seconds - last_seconds_ < pause_seconds_) return false;
  last_seconds_ = now_seconds;
  return true;
}

}  // namespace spacekeep::sim
