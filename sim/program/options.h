// Thread safety: pure functions.
//
// The command line of spacekeep-sim.
#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <variant>
#include <vector>

namespace spacekeep::sim {

enum class Scenario {
  kSystem,  ///< the whole daemon
  kPurge,   ///< purges alone
};

struct Options {
  Scenario scenario = Scenario::kSystem;
  std::uint64_t seeds = 1000;
  std::uint64_t first = 1;
  unsigned jobs = 2;
  bool stop_at_first = false;
  std::optional<std::uint64_t> replay;
  std::vector<std::size_t> without;  ///< elements of the replayed plan to leave out, ascending
  std::uint64_t schedule = 0;        ///< to replay another order of events than the seed's own
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
    "spacekeep-sim --replay SEED [--without LIST]       play one seed and tell what happened\n"
    "  --scenario system|purge   the whole daemon (as it is without this), or purges alone\n"
    "  --stop                    end at the first failure\n"
    "  --without 0,3,7           leave out these elements of the plan, as a failure tells\n"
    "  --schedule K              another order of events than the seed's own, likewise\n"
    "\n"
    "Each seed stands for one plan and one schedule. Every hundredth seed is played twice, and "
    "both\n"
    "runs must be the same. A failing plan is made smaller before it is shown. The status is 0 "
    "when\n"
    "every invariant held in every run, 1 when one did not, 2 for a wrong command line.\n";

}  // namespace spacekeep::sim
