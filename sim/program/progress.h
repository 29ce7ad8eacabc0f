// Thread safety: plain values and pure functions.
//
// What a long run says of itself while it runs.
#pragma once

#include <cstdint>
#include <string>

namespace spacekeep::sim {

struct Progress {
  std::uint64_t done = 0;
  std::uint64_t total = 0;
  std::uint64_t failed = 0;
  double elapsed_seconds = 0;
};

/// "12300 of 100000 schedules, 0 failed, 1310/s, 1 min 07 s left"
[[nodiscard]] std::string progressText(const Progress& progress);

/// When to say it. A terminal has one line, which is written over once a second; anything else gets
/// a line a minute.
class ProgressPace {
 public:
  ProgressPace(bool is_terminal, double now_seconds)
      : pause_seconds_(is_terminal ? 1 : 60), last_seconds_(now_seconds) {}

  /// True at most once in each pause, for the first time when one has passed.
  [[nodiscard]] bool isDue(double now_seconds);

 private:
  const double pause_seconds_;
  double last_seconds_;
};

}  // namespace spacekeep::sim
