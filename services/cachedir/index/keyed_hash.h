// Thread safety: pure after construction.
//
// A hash that depends on a secret, SipHash with one and three rounds. Whoever names the files of a
// cache must not be able to choose names that all fall on one place of a table.
#pragma once

#include <bit>
#include <cstdint>
#include <cstring>
#include <string_view>

#include "support/runtime/runtime.h"

namespace spacekeep::cachedir {

class KeyedHash {
 public:
  KeyedHash() : key0_(rt::randomNumber()), key1_(rt::randomNumber()) {}

  [[nodiscard]] std::uint64_t of(std::uint64_t number, std::string_view text) const {
    State state{key0_ ^ 0x736f6d6570736575U, key1_ ^ 0x646f72616e646f6dU,
                key0_ ^ 0x6c7967656e657261U, key1_ ^ 0x7465646279746573U};
    state.take(number);
    const std::size_t whole = text.size() / 8 * 8;
    for (std::size_t i = 0; i < whole; i += 8) {
      std::uint64_t word = 0;
      std::memcpy(&word, text.data() + i, 8);
      state.take(word);
    }
    std::uint64_t last = static_cast<std::uint64_t>(text.size()) << 56;
    for (std::size_t i = whole; i < text.size(); ++i) {
      last |= static_cast<std::uint64_t>(static_cast<unsigned char>(text[i])) << (8 * (i - whole));
    }
    state.take(last);
    state.c ^= 0xff;
    for (int round = 0; round < 3; ++round) state.mix();
    return state.a ^ state.b ^ state.c ^ state.d;
  }

 private:
  struct State {
    std::uint64_t a, b, c, d;
    void mix() {
      a += b;
      b = std::rotl(b, 13) ^ a;
      a = std::rotl(a, 32);
      c += d;
      d = std::rotl(d, 16) ^ c;
      a += d;
      d = std::rotl(d, 21) ^ a;
      c += b;
      b = std::rotl(b, 17) ^ c;
      c = std::rotl(c, 32);
    }
    void take(std::uint64_t word) {
      d ^= word;
      mix();
      a ^= word;
    }
  };

  std::uint64_t key0_;
  std::uint64_t key1_;
};

}  // namespace spacekeep::cachedir
