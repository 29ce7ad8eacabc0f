// Thread safety: pure functions.
//
// The text form of values, as log lines show it. One line, control characters escaped, so that no
// peer can forge a line of its own; longer than kMaxTextBytes is cut with an ellipsis.
#pragma once

#include <optional>
#include <string>

#include "support/values/value.h"

namespace spacekeep {

inline constexpr std::size_t kMaxTextBytes = 16 * 1024;

/// A string stands as it is at the top and quoted inside containers; booleans are true and false;
/// an array is [1, 2], a dictionary {"A": 1, "B": [2]}; data is <0a0b ...>; a date is ISO 8601 UTC.
[[nodiscard]] std::string textOf(const Value& value);
[[nodiscard]] std::string textOf(const Dictionary& dictionary);
/// "(none)" when absent.
[[nodiscard]] std::string textOf(const Value* value);

}  // namespace spacekeep
