#include "fuzz/helpers/value_maker.h"

#include <array>
#include <bit>
#include <limits>

namespace spacekeep::fuzz {
namespace {

// One deeper than anything accepts.
constexpr int kDeepest = kMaxValueDepth + 6;

}  // namespace

std::uint8_t ValueMaker::byte() {
  if (input_.empty()) return 0;
  const std::uint8_t first = input_[0];
  input_ = input_.subspan(1);
  return first;
}

std::uint64_t ValueMaker::bits() {
  std::uint64_t number = 0;
  for (int i = 0; i < 8; ++i) number = number << 8 | byte();
  return number;
}

std::string ValueMaker::text() {
  const std::uint8_t choice = byte();
  if (choice < 128 && !words_.empty()) return words_[choice % words_.size()];
  std::string text;
  for (std::size_t length = choice % 24; length > 0 && !usedUp(); --length) {
    text += static_cast<char>(byte());
  }
  return text;
}

std::int64_t ValueMaker::integer() {
  static constexpr std::array<std::int64_t, 8> kEdges{
      0, 1, -1, INT64_MAX, INT64_MIN, INT32_MAX, INT64_MAX - 1, std::int64_t{1} << 53};
  const std::uint8_t choice = byte();
  if (choice < 64) return kEdges[choice % kEdges.size()];
  if (choice < 160) return byte();
  return std::bit_cast<std::int64_t>(bits());
}

double ValueMaker::real() {
  using Limits = std::numeric_limits<double>;
  static constexpr std::array<double, 10> kEdges{0.0,
                                                 -0.0,
                                                 0.5,
                                                 1e300,
                                                 -1e300,
                                                 Limits::infinity(),
                                                 -Limits::infinity(),
                                                 Limits::quiet_NaN(),
                                                 Limits::denorm_min(),
                                                 50.000001};
  const std::uint8_t choice = byte();
  if (choice < 96) return kEdges[choice % kEdges.size()];
  if (choice < 160) return byte() / 4.0;
  return std::bit_cast<double>(bits());
}

Value ValueMaker::container(int depth) {
  if (byte() % 2 == 0) return dictionary(depth);
  Array array;
  for (std::size_t count = below(6); count > 0 && !usedUp(); --count) {
    array.push_back(value(depth + 1));
  }
  return array;
}

Value ValueMaker::value(int depth) {
  switch (below(9)) {
    case 0:
      return text();
    case 1:
      return byte() % 2 == 1;
    case 2:
      return integer();
    case 3:
      return bits();
    case 4:
      return real();
    case 5: {
      Data data;
      for (std::size_t count = below(80); count > 0 && !usedUp(); --count) {
        data.bytes.push_back(byte());
      }
      return data;
    }
    case 6:
      return Date{integer()};
    default:
      return depth < kDeepest ? container(depth) : Value(depth);
  }
}

Dictionary ValueMaker::dictionary(int depth) {
  Dictionary dictionary;
  for (std::size_t count = below(8); count > 0 && !usedUp(); --count) {
    const std::string key = text();
    dictionary.set(key, value(depth + 1));
  }
  return dictionary;
}

}  // namespace spacekeep::fuzz
