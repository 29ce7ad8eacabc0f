#include "sim/program/shrink.h"

#include <algorithm>
#include <numeric>

namespace spacekeep::sim {
namespace {

Kept without(const Kept& kept, std::size_t first, std::size_t count) {
  Kept rest(kept.begin(), kept.begin() + static_cast<std::ptrdiff_t>(first));
  const std::size_t end = std::min(first + count, kept.size());
  rest.insert(rest.end(), kept.begin() + static_cast<std::ptrdiff_t>(end), kept.end());
  return rest;
}

/// Tries each row of `count` elements, from the back: what comes last depends on what comes first.
/// Answers whether any went.
bool takeRows(Shrunk& shrunk, std::size_t count, const std::function<bool(const Kept&)>& fails,
              unsigned max_runs) {
  bool any_went = false;
  for (std::size_t end = shrunk.kept.size(); end > 0;) {
    if (shrunk.runs == max_runs) {
      shrunk.is_minimal = false;
      return false;
    }
    const std::size_t first = end > count ? end - count : 0;
    Kept rest = without(shrunk.kept, first, end - first);
    ++shrunk.runs;
    if (fails(rest)) {
      shrunk.kept = std::move(rest);
      any_went = true;
    }
    end = first;
  }
  return any_went;
}

}  // namespace

Shrunk shrink(std::size_t elements, const std::function<bool(const Kept&)>& fails,
              unsigned max_runs) {
  Shrunk shrunk;
  shrunk.kept.resize(elements);
  std::iota(shrunk.kept.begin(), shrunk.kept.end(), std::size_t{0});
  for (std::size_t count = std::max<std::size_t>(elements / 2, 1); shrunk.is_minimal;) {
    const bool any_went = takeRows(shrunk, count, fails, max_runs);
    if (any_went && count == 1) continue;
    if (count == 1) break;
    count = std::max<std::size_t>(std::min(count / 2, shrunk.kept.size() / 2), 1);
  }
  return shrunk;
}

SmallerPlan shrinkOverSchedules(
    std::size_t elements, const std::function<bool(const Kept&, std::uint64_t schedule)>& fails,
    unsigned max_plans, unsigned schedules) {
  SmallerPlan smaller;
  const auto fails_somehow = [&](const Kept& kept) {
    for (std::uint64_t schedule = 0; schedule < schedules; ++schedule) {
      if (!fails(kept, schedule)) continue;
      smaller.schedule = schedule;
      return true;
    }
    return false;
  };
  smaller.shrunk = shrink(elements, fails_somehow, max_plans);
  return smaller;
}

std::string limitsText(const Shrunk& shrunk, std::size_t elements, unsigned schedules) {
  const std::string tried = std::to_string(shrunk.runs) + " smaller plans, by " +
                            std::to_string(schedules) + " schedules each";
  if (shrunk.kept.size() == elements) {
    return "could not be made smaller: it failed in none of " + tried;
  }
  return shrunk.is_minimal ? "" : "may not be the smallest: no more than " + tried + ", were tried";
}

}  // namespace spacekeep::sim
