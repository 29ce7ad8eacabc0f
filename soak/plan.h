// Thread safety: pure functions and values.
//
// What happens when in a soak of a given length.
#pragma once

#include <string_view>
#include <vector>

namespace soak {

enum class Phase {
  kUnloaded,     ///< nobody but the probe
  kComingUp,     ///< services check in, clients connect; belongs to no figure
  kLoaded,       ///< the steady load
  kFlooded,      ///< the same, and the hostile client at the daemon
  kBareFlooded,  ///< the same, and the hostile client's small calls at a bare sd-bus peer
};

[[nodiscard]] std::string_view nameOf(Phase phase);

struct Step {
  Phase phase;
  double seconds;
};

/// At least two minutes. Begins unloaded, ends loaded and without a flood.
[[nodiscard]] std::vector<Step> planOf(double minutes);

}  // namespace soak
