#include "sim/scenarios/system_scenario.h"

#include <algorithm>
#include <utility>

#include "sim/scenarios/system_draw.h"

namespace spacekeep::sim {
namespace {

constexpr std::uint64_t kMebibyte = 1024 * 1024;

std::set<Fault> drawFaults(Random& random) {
  std::set<Fault> faults;
  const std::uint64_t style = random.below(20);
  if (style == 0) return faults;
  if (style < 3) {
    faults.insert(static_cast<Fault>(random.below(kFaultCount - 1)));
    return faults;
  }
  const std::uint64_t share = random.oneOf<std::uint64_t>({15, 30, 50});
  for (std::size_t i = 0; i + 1 < kFaultCount; ++i) {
    if (random.percent(share)) faults.insert(static_cast<Fault>(i));
  }
  if (random.percent(50)) faults.erase(Fault::kCrashes);
  if (random.below(100) == 0) faults.insert(Fault::kSilentPing);
  return faults;
}

void drawVolumes(Draw& draw) {
  const std::uint64_t scale = std::max<std::uint64_t>(draw.about_bytes * 50, 1'000'000);
  draw.plan.volumes = {{"/", scale * 100, draw.random.below(scale)}};
  if (draw.random.percent(50)) {
    draw.plan.volumes.push_back({"/data", scale * 20, draw.random.below(scale)});
  }
  if (draw.random.percent(15)) {
    draw.plan.volumes.push_back({"/data/media", scale * 10, draw.random.below(scale)});
  }
}

void drawCrashes(Draw& draw) {
  if (!draw.on(Fault::kCrashes)) return;
  const std::uint64_t crashes = draw.random.percent(75) ? 1 : 2;
  for (std::uint64_t i = 0; i < crashes; ++i) {
    PlannedCrash crash;
    crash.at_step = draw.random.between(1, draw.random.oneOf<std::uint64_t>({200, 1500, 5000}));
    crash.down_for_ns = drawMoment(draw.random);
    crash.store_refuses_to_open = draw.chance(Fault::kFailingDisk, 15);
    draw.plan.crashes.push_back(crash);
  }
  draw.lives = static_cast<unsigned>(draw.plan.crashes.size()) + 1;
}

}  // namespace

SystemPlan deriveSystemScenario(std::uint64_t seed) {
  Draw draw{Random(seed), {}, {}, {}, 1};
  Random& random = draw.random;
  draw.plan.faults = drawFaults(random);
  draw.plan.parallelism = random.oneOf<std::size_t>({1, 2, 4, 4, 8});
  draw.plan.disk_write_ns = random.oneOf<std::uint64_t>({0, 0, 2, 4 * kMs, 60 * kMs});
  draw.about_bytes = random.oneOf<std::uint64_t>({200, 2'000, 10'000, 100 * kMebibyte});
  drawVolumes(draw);
  drawCrashes(draw);
  drawServices(draw);
  drawBadDescriptors(draw);
  drawServiceActions(draw);
  drawClientActions(draw);
  drawWorldActions(draw);
  std::stable_sort(draw.plan.actions.begin(), draw.plan.actions.end(),
                   [](const PlannedAction& a, const PlannedAction& b) {
                     return std::pair{a.life, a.at_ns} < std::pair{b.life, b.at_ns};
                   });
  return std::move(draw.plan);
}

}  // namespace spacekeep::sim
