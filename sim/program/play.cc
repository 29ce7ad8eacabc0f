#include "sim/program/play.h"

#include <algorithm>
#include <cstdio>

#include "sim/program/one_run.h"
#include "sim/scenarios/purge_run.h"

namespace spacekeep::sim {
namespace {

// So many runs for each that is played a second time, to see that a seed means one run only.
constexpr std::uint64_t kRepeatEvery = 100;
// Making a plan smaller takes several runs for each attempt; the first few failures tell the most.
constexpr unsigned kMaxSmallerPlans = 300;
constexpr unsigned kSchedulesTried = 30;
constexpr std::uint64_t kMostShrunk = 3;

constexpr const char* kNotTheSame = "a seed means one run";

std::string listOf(const std::vector<std::size_t>& numbers) {
  std::string list;
  for (const std::size_t number : numbers) {
    list += (list.empty() ? "" : ",") + std::to_string(number);
  }
  return list;
}

std::string replayLine(const Options& options, std::uint64_t seed,
                       const std::vector<std::size_t>& without, std::uint64_t schedule) {
  std::string line = "./dev sim --replay " + std::to_string(seed);
  if (options.scenario == Scenario::kPurge) line += " --scenario purge";
  if (!without.empty()) line += " --without " + listOf(without);
  if (schedule != 0) line += " --schedule " + std::to_string(schedule);
  return line;
}

/// By the name of the invariant that is violated first.
SmallerPlan smallerPlanOf(const Options& options, std::uint64_t seed,
                          const std::string& invariant) {
  const std::size_t elements = elementsOf(options.scenario, seed);
  const auto fails = [&](const Kept& kept, std::uint64_t schedule) {
    const Verdict verdict =
        playOnce(options.scenario, seed, complementOf(kept, elements), schedule);
    return std::any_of(verdict.violations.begin(), verdict.violations.end(),
                       [&](const Violation& one) { return one.invariant == invariant; });
  };
  return shrinkOverSchedules(elements, fails, kMaxSmallerPlans, kSchedulesTried);
}

const Violation& violationOf(const Verdict& verdict, const std::string& invariant) {
  const auto same = std::find_if(verdict.violations.begin(), verdict.violations.end(),
                                 [&](const Violation& one) { return one.invariant == invariant; });
  return same == verdict.violations.end() ? verdict.violations.front() : *same;
}

std::string smallerText(const Options& options, std::uint64_t seed, const std::string& invariant) {
  const std::size_t elements = elementsOf(options.scenario, seed);
  if (elements == 0) return "";
  const SmallerPlan smaller = smallerPlanOf(options, seed, invariant);
  const std::string limits = limitsText(smaller.shrunk, elements, kSchedulesTried);
  const auto without = complementOf(smaller.shrunk.kept, elements);
  if (without.empty()) return "\n" + limits;
  const Verdict verdict = playOnce(options.scenario, seed, without, smaller.schedule);
  std::string text = "\nmade smaller:\n" + planText(options.scenario, seed, without);
  if (!limits.empty()) text += limits + "\n";
  if (!verdict.violations.empty()) {
    text += invariant + ": " + violationOf(verdict, invariant).text + "\n";
  }
  return text + "  " + replayLine(options, seed, without, smaller.schedule);
}

std::string storyOf(const Options& options, std::uint64_t seed, const Verdict& verdict,
                    bool shrinks) {
  const Violation& first = verdict.violations.front();
  std::string story = "FAILED seed " + std::to_string(seed) + ": " + first.invariant + ": " +
                      first.text + "\n  " + replayLine(options, seed, {}, 0);
  if (shrinks && first.invariant != kNotTheSame) {
    story += smallerText(options, seed, first.invariant);
  }
  return story;
}

void compareWithSecondRun(const Options& options, std::uint64_t seed, Verdict& verdict) {
  const Verdict again = playOnce(options.scenario, seed);
  if (again.hash == verdict.hash && again.events == verdict.events) return;
  verdict.violations.push_back({kNotTheSame, "the second run of this seed went another way"});
}

const char* strategyName(const rt::ScheduleOptions& options) {
  return options.strategy == rt::Strategy::kPct ? "PCT" : "random";
}

}  // namespace

Played playSeeds(const Options& options, unsigned index,
                 const std::function<void(const std::string& story)>& tell,
                 const std::function<void(const Played& so_far)>& played_one) {
  Played played;
  const std::uint64_t end = options.first + options.seeds;
  for (std::uint64_t seed = options.first + index; seed < end; seed += options.jobs) {
    Verdict verdict = playOnce(options.scenario, seed);
    ++played.runs;
    played.steps += verdict.steps;
    played.virtual_seconds += verdict.virtual_ns / 1'000'000'000;
    if (verdict.violations.empty() && seed % kRepeatEvery == 0) {
      ++played.repeated;
      compareWithSecondRun(options, seed, verdict);
    }
    const bool failed = !verdict.violations.empty();
    if (failed) {
      ++played.failed;
      const bool shrinks = !options.stop_at_first && played.failed <= kMostShrunk;
      tell(storyOf(options, seed, verdict, shrinks));
    }
    if (played_one) played_one(played);
    if (failed && options.stop_at_first) break;
  }
  return played;
}

bool replaySeed(const Options& options) {
  const std::uint64_t seed = *options.replay;
  std::printf("seed %llu, %s schedule\n%s\n", static_cast<unsigned long long>(seed),
              strategyName(scheduleFor(seed)),
              planText(options.scenario, seed, options.without).c_str());
  const Verdict verdict = tellRun(options.scenario, seed, options.without, options.schedule);
  std::printf("\n%llu steps, %.3f virtual seconds, trace hash %016llx\n",
              static_cast<unsigned long long>(verdict.steps),
              static_cast<double>(verdict.virtual_ns) / 1e9,
              static_cast<unsigned long long>(verdict.hash));
  for (const Violation& violation : verdict.violations) {
    std::printf("VIOLATED %s: %s\n", violation.invariant.c_str(), violation.text.c_str());
  }
  if (verdict.violations.empty()) std::printf("all invariants hold\n");
  return verdict.violations.empty();
}

}  // namespace spacekeep::sim
