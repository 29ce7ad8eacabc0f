#include "sim/scenarios/system_run.h"

namespace spacekeep::sim {

SystemRun playSystem(const SystemPlan& plan, std::uint64_t seed) {
  SystemRun run;
  run.plan = plan;
  run.seed = seed;
  return run;
}

}  // namespace spacekeep::sim
