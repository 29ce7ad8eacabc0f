// Thread safety: none of its own; each generator belongs to one thread or one schedule.
//
// A small, fast pseudo-random generator with a fixed sequence per seed (Steele, Lea, Flood: "Fast
// splittable pseudorandom number generators", 2014). The standard library leaves its distributions
// to each implementation, and a schedule must replay to the byte everywhere.
#pragma once

#include <cstdint>

namespace spacekeep::rt {

class SplitMix {
 public:
  explicit SplitMix(std::uint64_t seed) : state_(seed) {}

  std::uint64_t next() {
    state_ += 0x9e3779b97f4a7c15U;
    return mix(state_);
  }

  /// 0 <= result < bound; bound must not be 0. The bias for small bounds is below 2^-40.
  std::uint64_t below(std::uint64_t bound) { return next() % bound; }

  [[nodiscard]] static std::uint64_t mix(std::uint64_t value) {
    value = (value ^ (value >> 30)) * 0xbf58476d1ce4e5b9U;
    value = (value ^ (value >> 27)) * 0x94d049bb133111ebU;
    return value ^ (value >> 31);
  }

 private:
  std::uint64_t state_;
};

}  // namespace spacekeep::rt
