#include "support/ipc/linux/wire_text.h"

#include <cstddef>
#include <cstdint>

namespace spacekeep::ipc {

namespace {

constexpr std::string_view kReplacement = "\xEF\xBF\xBD";

std::size_t lengthByFirstByte(unsigned char first) {
  if (first < 0x80) return 1;
  if (first >= 0xC2 && first < 0xE0) return 2;
  if (first >= 0xE0 && first < 0xF0) return 3;
  if (first >= 0xF0 && first < 0xF5) return 4;
  return 0;
}

bool isAccepted(std::uint32_t character, std::size_t length) {
  constexpr std::uint32_t kSmallest[] = {0, 1, 0x80, 0x800, 0x10000};
  if (character < kSmallest[length] || character > 0x10FFFF) return false;
  const bool surrogate = character >= 0xD800 && character < 0xE000;
  const bool noncharacter =
      (character >= 0xFDD0 && character <= 0xFDEF) || (character & 0xFFFEU) == 0xFFFE;
  return !surrogate && !noncharacter;
}

/// Length of the character at the start of `text`, 0 when it is not accepted.
std::size_t characterLength(std::string_view text) {
  const auto first = static_cast<unsigned char>(text.front());
  if (first > 0 && first < 0x80) return 1;
  const std::size_t length = lengthByFirstByte(first);
  if (length == 0 || length > text.size()) return 0;
  std::uint32_t character = length == 1 ? first : first & (0x7FU >> length);
  for (std::size_t i = 1; i < length; ++i) {
    const auto next = static_cast<unsigned char>(text[i]);
    if ((next & 0xC0U) != 0x80) return 0;
    character = character << 6U | (next & 0x3FU);
  }
  return isAccepted(character, length) ? length : 0;
}

/// Bytes at the start of `text` that are accepted as they are.
std::size_t acceptedLength(std::string_view text) {
  std::size_t accepted = 0;
  while (accepted < text.size()) {
    const std::size_t length = characterLength(text.substr(accepted));
    if (length == 0) break;
    accepted += length;
  }
  return accepted;
}

}  // namespace

std::string wireText(std::string_view text) {
  std::string result;
  result.reserve(text.size());
  while (!text.empty()) {
    const std::size_t accepted = acceptedLength(text);
    result += text.substr(0, accepted);
    text.remove_prefix(accepted);
    if (text.empty()) break;
    result += kReplacement;
    text.remove_prefix(1);
  }
  return result;
}

}  // namespace spacekeep::ipc
