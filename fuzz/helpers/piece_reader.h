// Thread safety: confined to one thread.
//
// Cuts an input into numbers and texts. Any input will do; used-up input gives zeros and empty texts.
#pragma once

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>

namespace spacekeep::fuzz {

class PieceReader {
 public:
  explicit PieceReader(std::string_view input) : input_(input) {}

  [[nodiscard]] bool usedUp() const { return input_.empty(); }
  std::uint8_t byte() {
    const std::string_view first = take(1);
    return first.empty() ? std::uint8_t{0} : static_cast<std::uint8_t>(first[0]);
  }
  /// Two bytes, the low one first.
  std::size_t number() {
    const std::size_t low = byte();
    return low | static_cast<std::size_t>(byte()) << 8;
  }
  std::string_view take(std::size_t count) {
    const std::string_view piece = input_.substr(0, std::min(count, input_.size()));
    input_.remove_prefix(piece.size());
    return piece;
  }
  /// A byte that says how many bytes follow, and those.
  std::string_view shortPiece() { return take(byte()); }
  /// The same with two bytes.
  std::string_view piece() { return take(number()); }
  std::string_view rest() { return take(input_.size()); }

 private:
  std::string_view input_;
};

}  // namespace spacekeep::fuzz
