// Thread safety: belongs to one thread.
//
// Random choices from a seed, the same on every machine.
#pragma once

#include <cstddef>
#include <cstdint>
#include <initializer_list>

#include "support/runtime/splitmix.h"

namespace spacekeep::sim {

class Random {
 public:
  explicit Random(std::uint64_t seed) : bits_(rt::SplitMix::mix(seed)) {}

  /// 0 <= result < bound.
  std::uint64_t below(std::uint64_t bound) { return bits_.below(bound); }
  /// first <= result <= last.
  std::uint64_t between(std::uint64_t first, std::uint64_t last) {
    return first + below(last - first + 1);
  }
  bool percent(std::uint64_t chance) { return below(100) < chance; }
  template <class T>
  T oneOf(std::initializer_list<T> choices) {
    return choices.begin()[below(choices.size())];
  }

 private:
  rt::SplitMix bits_;
};

}  // namespace spacekeep::sim
