#include "fuzz/helpers/promises.h"

#include <algorithm>
#include <cmath>
#include <cstdio>
#include <cstdlib>
#include <iterator>
#include <string>
#include <variant>

#include "support/logging/log.h"
#include "support/values/plist.h"
#include "support/values/text.h"

namespace spacekeep::fuzz {
namespace {

bool learns_from_lines = false;

// The fuzzer looks at the counters in this section as at those of the code itself (libFuzzer, "Extra
// counters").
__attribute__((section("__libfuzzer_extra_counters"), used)) std::uint8_t reasons_seen[2048];

/// Numbers are left out, or each would be a reason of its own.
void learn(std::string_view line) {
  const std::size_t begin = line.find('(');
  const std::size_t end = line.rfind(')');
  if (begin == std::string_view::npos || end == std::string_view::npos || end < begin) return;
  std::size_t hash = 1469598103934665603U;  // FNV-1a
  for (const char c : line.substr(begin, end - begin)) {
    if (c < '0' || c > '9') hash = (hash ^ static_cast<unsigned char>(c)) * 1099511628211U;
  }
  reasons_seen[hash % std::size(reasons_seen)] = 1;
}

void checkLine(const LogHandle*, std::int32_t, const char*, const char* format,
               std::span<const LogArgument> arguments) {
  const std::string line = formatLogLine(format, arguments);
  require(isOneLine(line), "a log line is one line of UTF-8");
  if (learns_from_lines) learn(line);
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

void learnFromLogLines() { learns_from_lines = true; }

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
