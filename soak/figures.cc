#include "soak/figures.h"

#include <algorithm>
#include <cmath>
#include <numeric>

namespace soak {

double percentile(std::vector<double> values, double share) {
  if (values.empty()) return 0;
  const auto place = static_cast<std::ptrdiff_t>(share * static_cast<double>(values.size() - 1));
  std::nth_element(values.begin(), values.begin() + place, values.end());
  return values[static_cast<std::size_t>(place)];
}

double mean(const std::vector<double>& values) {
  if (values.empty()) return 0;
  return std::accumulate(values.begin(), values.end(), 0.0) / static_cast<double>(values.size());
}

Line fittedLine(const std::vector<double>& x, const std::vector<double>& y) {
  if (x.size() < 3) return {};
  const double mean_x = mean(x);
  const double mean_y = mean(y);
  double squares = 0;
  double products = 0;
  for (std::size_t i = 0; i < x.size(); ++i) {
    squares += (x[i] - mean_x) * (x[i] - mean_x);
    products += (x[i] - mean_x) * (y[i] - mean_y);
  }
  if (squares <= 0) return {};
  Line line;
  line.slope = products / squares;
  double rest = 0;
  for (std::size_t i = 0; i < x.size(); ++i) {
    const double off = y[i] - mean_y - line.slope * (x[i] - mean_x);
    rest += off * off;
  }
  line.standard_error = std::sqrt(rest / static_cast<double>(x.size() - 2) / squares);
  return line;
}

}  // namespace soak
