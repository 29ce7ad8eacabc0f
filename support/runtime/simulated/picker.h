// Thread safety: belongs to one schedule.
//
// Who runs next: the strategies.
#pragma once

#include <cstdint>
#include <vector>

#include "support/runtime/simulated/fiber.h"
#include "support/runtime/simulation.h"
#include "support/runtime/splitmix.h"

namespace spacekeep::rt::simulated {

class Picker {
 public:
  explicit Picker(const ScheduleOptions& options);

  /// Called once for every fiber, before it can be picked.
  void prepare(Fiber& fiber);

  /// Picks from `runnable`, which is not empty. `running` is the fiber that made step `step`, null
  /// when there is none.
  [[nodiscard]] Fiber& pick(const std::vector<Fiber*>& runnable, Fiber* running,
                            std::uint64_t step);

  /// A choice between `bound` equal things, such as the waiters of a condition.
  [[nodiscard]] std::uint64_t below(std::uint64_t bound) { return random_.below(bound); }

 private:
  void changePriority(Fiber* running, std::uint64_t step);

  const Strategy strategy_;
  SplitMix random_;
  std::vector<std::uint64_t> change_points_;  ///< descending; the next one is the last
};

}  // namespace spacekeep::rt::simulated
