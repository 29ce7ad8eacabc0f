// Thread safety: pure functions, but for what they print.
//
// What the soak has found, and whether it is as it should be.
#pragma once

#include <cstddef>
#include <map>
#include <string>
#include <utility>
#include <vector>

#include "soak/plan.h"
#include "soak/samples.h"

namespace soak {

/// A phase as it happened, in monotonic seconds.
struct Period {
  Phase phase;
  double begin_seconds;
  double end_seconds;
};

/// Microseconds of the probe's calls, by phase and by the number of the peer.
using Latencies = std::map<std::pair<Phase, std::size_t>, std::vector<double>>;

[[nodiscard]] Latencies latenciesOf(const std::string& log, const std::vector<Period>& periods);

/// In microseconds; 0 without calls.
[[nodiscard]] double p99Of(const Latencies& latencies, Phase phase, std::size_t peer);

/// Prints tables and verdicts. Answers the number of missed targets.
int reportFlatness(const std::vector<Sample>& samples, const std::vector<Period>& periods);
int reportLatencies(const Latencies& latencies);

}  // namespace soak
