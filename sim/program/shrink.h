// Thread safety: pure functions, apart from what the given function does.
//
// Makes a failing plan smaller: takes elements away as long as it still fails in the same way.
#pragma once

#include <cstddef>
#include <cstdint>
#include <functional>
#include <string>
#include <vector>

namespace spacekeep::sim {

/// Positions of the elements that are kept, ascending.
using Kept = std::vector<std::size_t>;

struct Shrunk {
  Kept kept;
  unsigned runs = 0;       ///< how often `fails` was asked
  bool is_minimal = true;  ///< no single element can go any more; false when the runs were used up
};

/// Halves, quarters and so on down to single elements are taken away, again and again until nothing
/// can go, in at most `max_runs` runs. `fails` is not asked about all elements together: that they
/// fail is why one is here.
[[nodiscard]] Shrunk shrink(std::size_t elements, const std::function<bool(const Kept&)>& fails,
                            unsigned max_runs);

/// A smaller plan, and the schedule by which it fails.
struct SmallerPlan {
  Shrunk shrunk;
  std::uint64_t schedule = 0;
};

/// The same for a failure that hangs on the order of events, which changes with each element that is
/// taken away: each smaller plan is played by schedule 0, which is the seed's own, and by further
/// ones up to `schedules` in all, until one fails. `max_plans` bounds the plans, not the runs.
[[nodiscard]] SmallerPlan shrinkOverSchedules(
    std::size_t elements, const std::function<bool(const Kept&, std::uint64_t schedule)>& fails,
    unsigned max_plans, unsigned schedules);

/// What to say where not every element could be tried, or none could go; else empty.
[[nodiscard]] std::string limitsText(const Shrunk& shrunk, std::size_t elements,
                                     unsigned schedules);

}  // namespace spacekeep::sim
