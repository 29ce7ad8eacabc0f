// Thread safety: one run at a time in a process.
//
// Plays seeds and tells what came of them.
#pragma once

#include <cstdint>
#include <functional>
#include <string>

namespace spacekeep::sim {

struct Played {
  std::uint64_t runs = 0;
  std::uint64_t failed = 0;
  std::uint64_t repeated = 0;  ///< runs that were played twice to compare them
  std::uint64_t steps = 0;
  std::uint64_t virtual_seconds = 0;
};

/// Plays first, first + stride, ... below `end`. `tell` gets one line for each failed seed.
Played playSeeds(std::uint64_t first, std::uint64_t end, std::uint64_t stride,
                 const std::function<void(const std::string& line)>& tell);

/// Plays one seed and prints scenario, events and verdict. Answers whether all invariants held.
bool replaySeed(std::uint64_t seed);

}  // namespace spacekeep::sim
