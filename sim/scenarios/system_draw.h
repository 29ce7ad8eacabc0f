// Thread safety: belongs to one thread.
//
// Random parts of a plan. What is drawn depends on the faults that are switched on.
#pragma once

#include <cstdint>
#include <set>
#include <string>

#include "sim/scenarios/random.h"
#include "sim/scenarios/system_scenario.h"

namespace spacekeep::sim {

inline constexpr std::uint64_t kMs = 1'000'000;
inline constexpr std::uint64_t kSecond = 1'000 * kMs;

/// Everything that parts of one plan are drawn from.
struct Draw {
  Random random;
  SystemPlan plan;
  std::uint64_t about_bytes = 1000;  ///< what a service owns, about
  std::set<std::uint64_t> amounts;   ///< of the purges so far
  unsigned lives = 1;

  [[nodiscard]] bool on(Fault fault) const { return plan.faults.contains(fault); }
  /// With that chance while the fault is switched on, else never.
  [[nodiscard]] bool chance(Fault fault, std::uint64_t percent) {
    return on(fault) && random.percent(percent);
  }
  [[nodiscard]] const std::string& volume() {
    return plan.volumes[random.percent(70) ? 0 : random.below(plan.volumes.size())].path;
  }
};

/// Deadlines of the waits are at 2, 6, 12 and 20 seconds after a purge starts and 10 after a query:
/// some delays meet them.
[[nodiscard]] std::uint64_t drawSystemDelay(Random& random);
/// Around the 120 seconds that answers are remembered, as often as not.
[[nodiscard]] std::uint64_t drawMoment(Random& random);
[[nodiscard]] OwnedBytes drawOwnedBytes(Random& random, std::uint64_t about_bytes);
[[nodiscard]] Dictionary drawCheckIn(Draw& draw);
[[nodiscard]] std::string idOfService(std::size_t index);

void drawServices(Draw& draw);
void drawBadDescriptors(Draw& draw);
void drawServiceActions(Draw& draw);
void drawClientActions(Draw& draw);
void drawWorldActions(Draw& draw);

}  // namespace spacekeep::sim
