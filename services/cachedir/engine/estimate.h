// Thread safety: plain values.
//
// How much could be freed, by urgency.
#pragma once

#include <array>
#include <cstdint>
#include <string>
#include <vector>

#include "services/cachedir/engine/rules.h"

namespace spacekeep::cachedir {

struct Estimate {
  /// What urgency 1 to 4 could free; each holds what the milder ones hold.
  std::array<std::uint64_t, kUrgencies> bytes{};
  std::array<std::uint64_t, kUrgencies> files{};
  bool cancelled = false;
  std::vector<std::string> problems;
};

}  // namespace spacekeep::cachedir
