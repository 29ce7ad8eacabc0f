#include "soak/plan.h"

#include <algorithm>

namespace soak {

std::string_view nameOf(Phase phase) {
  switch (phase) {
    case Phase::kUnloaded:
      return "unloaded";
    case Phase::kComingUp:
      return "coming up";
    case Phase::kLoaded:
      return "loaded";
    case Phase::kFlooded:
      return "flooded";
    case Phase::kBareFlooded:
      return "bare flooded";
  }
  return "";
}

std::vector<Step> planOf(double minutes) {
  const double total_seconds = std::max(2.0, minutes) * 60;
  const double unit_seconds = std::clamp(total_seconds / 30, 8.0, 45.0);
  std::vector<Step> plan = {{Phase::kUnloaded, std::clamp(total_seconds / 20, 15.0, 60.0)},
                            {Phase::kComingUp, unit_seconds}};
  double left_seconds = total_seconds - plan[0].seconds - plan[1].seconds;
  const double cycle_seconds = 5 * unit_seconds;
  while (left_seconds >= cycle_seconds + unit_seconds) {
    plan.push_back({Phase::kLoaded, 2 * unit_seconds});
    plan.push_back({Phase::kFlooded, unit_seconds});
    plan.push_back({Phase::kLoaded, unit_seconds});
    plan.push_back({Phase::kBareFlooded, unit_seconds});
    left_seconds -= cycle_seconds;
  }
  plan.push_back({Phase::kLoaded, left_seconds});
  return plan;
}

}  // namespace soak
