// Thread safety: one run at a time in a process.
//
// One run of either scenario, and what the invariants say of it.
#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include "sim/invariants/invariants.h"
#include "sim/program/options.h"
#include "sim/program/shrink.h"

namespace spacekeep::sim {

struct Verdict {
  std::uint64_t steps = 0;
  std::uint64_t virtual_ns = 0;
  std::uint64_t hash = 0;
  std::size_t events = 0;
  std::vector<Violation> violations;
};

/// Plays the seed without those elements of its plan (the purge scenario has none to take away, and
/// no schedule but the seed's own).
[[nodiscard]] Verdict playOnce(Scenario scenario, std::uint64_t seed,
                               const std::vector<std::size_t>& without = {},
                               std::uint64_t schedule = 0);

/// How many elements the plan of that seed has.
[[nodiscard]] std::size_t elementsOf(Scenario scenario, std::uint64_t seed);

/// The same run, told event by event to the standard output.
Verdict tellRun(Scenario scenario, std::uint64_t seed, const std::vector<std::size_t>& without,
                std::uint64_t schedule = 0);

/// The plan in words.
[[nodiscard]] std::string planText(Scenario scenario, std::uint64_t seed,
                                   const std::vector<std::size_t>& without);

/// The elements that are not kept.
[[nodiscard]] std::vector<std::size_t> complementOf(const Kept& kept, std::size_t elements);

}  // namespace spacekeep::sim
