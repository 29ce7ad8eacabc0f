// Thread safety: every function may be called from any thread; checkLogLines() once, at the start.
//
// What every fuzzer holds the code under test to, beyond not crashing.
#pragma once

#include <cstddef>
#include <cstdint>
#include <span>
#include <string>
#include <string_view>

#include "support/values/value.h"

namespace spacekeep::fuzz {

/// Ends the run like a crash, so that the input is kept, when a promise is broken.
void require(bool holds, const char* promise);

/// From now on log lines go nowhere, but each is formatted and has to be a single line: no input
/// may forge a line of its own.
void checkLogLines();

/// To the fuzzer each reason that a problem line gives in brackets counts as code that was reached:
/// for what stands behind a library that is not compiled for fuzzing. After checkLogLines().
void learnFromLogLines();

/// `text` has no control character and is UTF-8.
[[nodiscard]] bool isOneLine(std::string_view text);

/// Equal, where two numbers that are none count as equal. What a document looks like does not
/// matter: of equal values the encoder keeps any one.
[[nodiscard]] bool isSame(const Value& left, const Value& right);

/// Writes `value` as a binary property list and reads it again: what comes back must be stable from
/// the second round on. False when it cannot be written.
bool requireStableRoundTrip(const Value& value);

[[nodiscard]] inline std::span<const std::uint8_t> inputOf(const std::uint8_t* data,
                                                           std::size_t size) {
  return {data, size};
}
[[nodiscard]] std::string textOfInput(const std::uint8_t* data, std::size_t size);

}  // namespace spacekeep::fuzz
