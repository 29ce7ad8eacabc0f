// Thread safety: pure functions.
//
// The arithmetic of the report.
#pragma once

#include <vector>

namespace soak {

/// The value below which that share of the values lies; 0 when there is none.
[[nodiscard]] double percentile(std::vector<double> values, double share);

struct Line {
  double slope = 0;           ///< per unit of x
  double standard_error = 0;  ///< of the slope
};

/// The line of least squares.
[[nodiscard]] Line fittedLine(const std::vector<double>& x, const std::vector<double>& y);

[[nodiscard]] double mean(const std::vector<double>& values);

}  // namespace soak
