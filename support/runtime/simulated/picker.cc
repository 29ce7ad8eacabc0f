#include "support/runtime/simulated/picker.h"

#include <algorithm>
#include <functional>

namespace spacekeep::rt::simulated {
namespace {

// Above every priority that a change point gives.
constexpr std::uint64_t kInitialPriority = std::uint64_t{1} << 63;

std::vector<std::uint64_t> drawChangePoints(const ScheduleOptions& options, SplitMix& random) {
  std::vector<std::uint64_t> points;
  if (options.strategy != Strategy::kPct) return points;
  const std::uint64_t steps = std::max<std::uint64_t>(options.pct_expected_steps, 1);
  for (unsigned point = 1; point < options.pct_depth; ++point) {
    points.push_back(1 + random.below(steps));
  }
  std::sort(points.begin(), points.end(), std::greater<>());
  return points;
}

bool lowerPriority(const Fiber* left, const Fiber* right) {
  if (left->priority != right->priority) return left->priority < right->priority;
  return left->id < right->id;
}

}  // namespace

Picker::Picker(const ScheduleOptions& options)
    : strategy_(options.strategy),
      random_(SplitMix::mix(options.seed)),
      change_points_(drawChangePoints(options, random_)) {}

void Picker::prepare(Fiber& fiber) {
  if (strategy_ == Strategy::kPct) fiber.priority = random_.next() | kInitialPriority;
}

Fiber& Picker::pick(const std::vector<Fiber*>& runnable, Fiber* running, std::uint64_t step) {
  switch (strategy_) {
    case Strategy::kRandom:
      return *runnable[random_.below(runnable.size())];
    case Strategy::kPct:
      changePriority(running, step);
      return **std::max_element(runnable.begin(), runnable.end(), lowerPriority);
  }
  panic("unknown strategy");
}

/// The fiber that runs at a change point falls below all others; one that falls later falls deeper.
void Picker::changePriority(Fiber* running, std::uint64_t step) {
  while (!change_points_.empty() && change_points_.back() <= step) {
    if (running != nullptr) running->priority = change_points_.size();
    change_points_.pop_back();
  }
}

}  // namespace spacekeep::rt::simulated
