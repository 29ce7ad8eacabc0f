// Thread safety: pure function.
//
// The text form that monitoring systems scrape (openmetrics.io, version 1.0).
#pragma once

#include <prometheus/metric_family.h>

#include <string>
#include <vector>

namespace spacekeep {

/// Counters and histograms only. prometheus-cpp's own serializer writes the older format, without
/// `_total` and `# EOF`.
[[nodiscard]] std::string openMetricsText(const std::vector<prometheus::MetricFamily>& families);

}  // namespace spacekeep
