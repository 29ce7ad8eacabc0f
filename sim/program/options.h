// Thread safety: pure functions.
//
// The command line of spacekeep-sim.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <variant>
#include <vector>

namespace spacekeep::sim {

struct Options {
  std::uint64_t seeds = 1000;
  std::uint64_t first = 1;
  unsigned jobs = 2;
  std::optional<std::uint64_t> replay;
  bool help = false;
};

inline constexpr unsigned kMaxJobs = 64;

/// What is wrong with the command line, in words.
struct OptionError {
  std::string text;
};

[[nodiscard]] std::variant<Options, OptionError> parseOptions(
    const std::vector<std::string>& arguments);

inline constexpr const char* kHelp =
    "spacekeep-sim [--seeds N] [--first S] [--jobs J]   play seeds S to S + N - 1 (1000 from 1)\n"
    "spacekeep-sim --replay SEED                        play one seed and print what happened\n"
    "\n"
    "Each seed stands for one scenario and one schedule. The status is 0 when every invariant "
    "held\n"
    "in every run, 1 when one did not, 2 for a wrong command line.\n";

}  // namespace spacekeep::sim
