#include "sim/program/play.h"

#include <cstdio>

#include "sim/invariants/invariants.h"
#include "sim/scenarios/purge_run.h"

namespace spacekeep::sim {
namespace {

// So many runs for each that is played a second time, to see that a seed means one run only.
constexpr std::uint64_t kRepeatEvery = 100;

std::string firstProblem(const PurgeRun& run) {
  const auto violations = judge(run);
  if (violations.empty()) return {};
  const std::string more =
      violations.size() == 1 ? "" : " (and " + std::to_string(violations.size() - 1) + " more)";
  return violations.front().invariant + ": " + violations.front().text + more;
}

std::string differenceOnRepeat(std::uint64_t seed, const PurgeRun& run) {
  const PurgeRun again = runPurgeScenario(seed);
  if (again.report.trace_hash == run.report.trace_hash &&
      again.events.size() == run.events.size()) {
    return {};
  }
  return "a seed means one run: the second run of this seed went another way";
}

const char* strategyName(const rt::ScheduleOptions& options) {
  return options.strategy == rt::Strategy::kPct ? "PCT" : "random";
}

}  // namespace

Played playSeeds(std::uint64_t first, std::uint64_t end, std::uint64_t stride,
                 const std::function<void(const std::string& line)>& tell) {
  Played played;
  for (std::uint64_t seed = first; seed < end; seed += stride) {
    const PurgeRun run = runPurgeScenario(seed);
    ++played.runs;
    played.steps += run.report.steps;
    played.virtual_seconds += run.report.virtual_ns / 1'000'000'000;
    std::string problem = firstProblem(run);
    if (problem.empty() && seed % kRepeatEvery == 0) {
      ++played.repeated;
      problem = differenceOnRepeat(seed, run);
    }
    if (problem.empty()) continue;
    ++played.failed;
    tell("FAILED seed " + std::to_string(seed) + ", replay with --replay " + std::to_string(seed) +
         ": " + problem);
  }
  return played;
}

bool replaySeed(std::uint64_t seed) {
  const PurgeRun run = runPurgeScenario(seed);
  const rt::ScheduleOptions options = scheduleFor(seed);
  std::printf("seed %llu, %s schedule\n%s\n", static_cast<unsigned long long>(seed),
              strategyName(options), textOf(run.scenario).c_str());
  for (const Event& event : run.events) std::printf("%s\n", textOfEvent(event).c_str());
  std::printf("\n%llu steps, %.3f virtual seconds, trace hash %016llx\n",
              static_cast<unsigned long long>(run.report.steps),
              static_cast<double>(run.report.virtual_ns) / 1e9,
              static_cast<unsigned long long>(run.report.trace_hash));
  const auto violations = judge(run);
  for (const Violation& violation : violations) {
    std::printf("VIOLATED %s: %s\n", violation.invariant.c_str(), violation.text.c_str());
  }
  if (violations.empty()) std::printf("all invariants hold\n");
  return violations.empty();
}

}  // namespace spacekeep::sim
