// Thread safety: one run at a time in a process.
//
// Plays seeds and tells what came of them.
#pragma once

#include <cstdint>
#include <functional>
#include <string>

#include "sim/program/options.h"

namespace spacekeep::sim {

struct Played {
  std::uint64_t runs = 0;
  std::uint64_t failed = 0;
  std::uint64_t repeated = 0;  ///< runs that were played twice to compare them
  std::uint64_t steps = 0;
  std::uint64_t virtual_seconds = 0;
};

/// Plays the seeds of the options that are `index` modulo their number of jobs. `tell` gets the
/// story of each failed seed, of several lines; `played_one`, which may be empty, is called after
/// each seed.
Played playSeeds(const Options& options, unsigned index,
                 const std::function<void(const std::string& story)>& tell,
                 const std::function<void(const Played& so_far)>& played_one = nullptr);

/// Plays one seed and prints plan, events and verdict. Answers whether all invariants held.
bool replaySeed(const Options& options);

}  // namespace spacekeep::sim
