// Thread safety: pure functions over plain values.
//
// What can be said about a purge that runs. The daemon answers only at the end, so the space gained
// is measured on the volume and the urgency is estimated from the waits.
#pragma once

#include <cstdint>
#include <optional>
#include <string>

namespace spacekeep::ctl {

struct PurgePlan {
  std::uint64_t asked_bytes = 0;
  int urgency_limit = 3;
  std::optional<std::uint64_t> timeout_seconds;  ///< per urgency; none: 2 x urgency
};

struct UrgencyEstimate {
  int urgency = 1;          ///< the highest is kept once every wait has passed
  double seconds_left = 0;  ///< at most; 0 once every wait has passed
  bool all_waits_over = false;
};

/// An urgency ends early when every service has answered, so the purge may be further than this.
[[nodiscard]] UrgencyEstimate estimateUrgency(const PurgePlan& plan, double elapsed_seconds);

/// "12.0 MiB of 500.0 MiB gained, urgency 2 of 3, at most 7 s left". `gained_bytes` is none when
/// the volume's free space cannot be read from here.
[[nodiscard]] std::string progressText(const PurgePlan& plan, double elapsed_seconds,
                                       std::optional<std::uint64_t> gained_bytes);

}  // namespace spacekeep::ctl
