#include "sim/scenarios/system_scenario.h"

#include "sim/scenarios/random.h"

namespace spacekeep::sim {

SystemPlan deriveSystemScenario(std::uint64_t seed) {
  Random random(seed);
  SystemPlan plan;
  plan.volumes = {{"/", 1'000'000, random.below(1'000'000)}};
  return plan;
}

}  // namespace spacekeep::sim
