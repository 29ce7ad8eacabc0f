#include "fuzz/helpers/promises.h"

#include <algorithm>
#include <cmath>
#include <cstdio>
#include <cstdlib>
#include <variant>

#include "support/logging/log.h"
#include "support/values/plist.h"
#include "support/values/text.h"

namespace spacekeep::fuzz {
namespace {

void checkLine(const LogHandle*, std::int32_t, const char*, const char* format,
               std::span<const LogArgument> arguments) {
  require(isOneLine(formatLogLine(format, arguments)), "a log line is one line of UTF-8");
}

bool isNoNumber(const Value& value) {
  const auto* number = std::get_if<double>(&value.storage());
  return number != nullptr && std::isnan(*number);
}

}  // namespace

void require(bool holds, const char* promise) {
  if (holds) return;
  static_cast<void>(std::fprintf(stderr, "broken promise: %s\n", promise));
  std::abort();
}

void checkLogLines() {
  static LogHandle handle;
  handle.level = 5;
  setLogHandle(&handle);
  gMOLogWrite = &checkLine;
}

bool isOneLine(std::string_view text) {
  for (const char c : text) {
    const auto byte = static_cast<unsigned char>(c);
    if (byte < 0x20 || byte == 0x7f) return false;
  }
  return isUtf8(text);
}

bool isSame(const Value& left, const Value& right) {
  if (left.array() != nullptr && right.array() != nullptr) {
    return std::ranges::equal(*left.array(), *right.array(), isSame);
  }
  if (left.dictionary() != nullptr && right.dictionary() != nullptr) {
    return std::ranges::equal(*left.dictionary(), *right.dictionary(),
                              [](const auto& first, const auto& second) {
                                return first.key == second.key && isSame(first.value, second.value);
                              });
  }
  return left == right || (isNoNumber(left) && isNoNumber(right));
}

bool requireStableRoundTrip(const Value& value) {
  const auto written = binaryPlist(value);
  if (written.empty()) return false;
  const auto read = parsePlist(written);
  const auto* first = std::get_if<Value>(&read);
  require(first != nullptr, "what was written can be read");
  const auto again = binaryPlist(*first);
  const auto read_again = parsePlist(again);
  const auto* second = std::get_if<Value>(&read_again);
  require(second != nullptr, "what was read and written can be read");
  require(isSame(*first, *second), "a value is stable from the second round on");
  return true;
}

std::string textOfInput(const std::uint8_t* data, std::size_t size) {
  return std::string(data, data + size);
}

}  // namespace spacekeep::fuzz
