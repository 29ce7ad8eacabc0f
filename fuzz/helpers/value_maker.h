// Thread safety: confined to one thread.
//
// Values of every kind out of the bytes of an input, so that a fuzzer spends its time on what values
// can be and not on how documents are spelt. Any bytes give a value; used-up input gives zeros.
#pragma once

#include <cstdint>
#include <span>
#include <string>
#include <vector>

#include "support/values/value.h"

namespace spacekeep::fuzz {

class ValueMaker {
 public:
  /// `words` are what texts and keys are made of most of the time.
  ValueMaker(std::span<const std::uint8_t> input, std::vector<std::string> words)
      : input_(input), words_(std::move(words)) {}

  [[nodiscard]] bool usedUp() const { return input_.empty(); }
  std::uint8_t byte();
  /// Below `bound`, which is 1 to 256.
  std::size_t below(std::size_t bound) { return byte() % bound; }
  /// Eight bytes as they come.
  std::uint64_t bits();
  std::string text();
  std::int64_t integer();
  double real();
  Value value(int depth = 0);
  Dictionary dictionary(int depth = 0);

 private:
  Value container(int depth);

  std::span<const std::uint8_t> input_;
  std::vector<std::string> words_;
};

}  // namespace spacekeep::fuzz
