#include "sim/program/one_run.h"

#include <algorithm>
#include <cstdio>

#include "sim/invariants/system/system_invariants.h"
#include "sim/scenarios/purge_run.h"
#include "sim/scenarios/system_run.h"

namespace spacekeep::sim {
namespace {

SystemPlan planOf(std::uint64_t seed, const std::vector<std::size_t>& without) {
  SystemPlan plan = deriveSystemScenario(seed);
  for (auto gone = without.rbegin(); gone != without.rend(); ++gone) {
    if (*gone < elementCount(plan)) plan = withoutElement(plan, *gone);
  }
  return plan;
}

Verdict verdictOn(const PurgeRun& run) {
  return {run.report.steps, run.report.virtual_ns, run.report.trace_hash, run.events.size(),
          judge(run)};
}

Verdict verdictOn(const SystemRun& run) {
  const std::uint64_t virtual_ns = run.events.empty() ? 0 : run.events.back().at_ns;
  return {run.steps, virtual_ns, run.trace_hash, run.events.size(), judge(run)};
}

void tell(const std::vector<Event>& events) {
  for (const Event& event : events) std::printf("%s\n", textOfEvent(event).c_str());
}

}  // namespace

Verdict playOnce(Scenario scenario, std::uint64_t seed, const std::vector<std::size_t>& without,
                 std::uint64_t schedule) {
  if (scenario == Scenario::kPurge) return verdictOn(runPurgeScenario(seed));
  return verdictOn(playSystem(planOf(seed, without), seed, schedule));
}

std::size_t elementsOf(Scenario scenario, std::uint64_t seed) {
  return scenario == Scenario::kPurge ? 0 : elementCount(deriveSystemScenario(seed));
}

Verdict tellRun(Scenario scenario, std::uint64_t seed, const std::vector<std::size_t>& without,
                std::uint64_t schedule) {
  if (scenario == Scenario::kPurge) {
    const PurgeRun run = runPurgeScenario(seed);
    tell(run.events);
    return verdictOn(run);
  }
  const SystemRun run = playSystem(planOf(seed, without), seed, schedule);
  tell(run.events);
  if (run.end == SystemEnd::kSilentPing) std::printf("deadlock: silent ping\n");
  for (const std::string& blocked : run.blocked) std::printf("waits: %s\n", blocked.c_str());
  return verdictOn(run);
}

std::string planText(Scenario scenario, std::uint64_t seed,
                     const std::vector<std::size_t>& without) {
  if (scenario == Scenario::kPurge) return textOf(derivePurgeScenario(seed));
  return textOf(planOf(seed, without));
}

std::vector<std::size_t> complementOf(const Kept& kept, std::size_t elements) {
  std::vector<std::size_t> rest;
  for (std::size_t element = 0; element < elements; ++element) {
    if (!std::binary_search(kept.begin(), kept.end(), element)) rest.push_back(element);
  }
  return rest;
}

}  // namespace spacekeep::sim
