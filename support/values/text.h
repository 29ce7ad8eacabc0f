// Thread safety: pure functions.
//
// The text form of values, as log lines show it. One line, control characters escaped, so that no
// peer can forge a line of its own; longer than kMaxTextBytes is cut with an ellipsis.
#pragma once

#include <optional>
#include <string>
#include <string_view>

#include "support/values/value.h"

namespace spacekeep {

inline constexpr std::size_t kMaxTextBytes = 16 * 1024;
/// Bytes of data that are shown; the rest of longer data is an ellipsis.
inline constexpr std::size_t kMaxDataBytesInText = 64;

/// A string stands as it is at the top and quoted inside containers; booleans are true and false;
/// an array is [1, 2], a dictionary {"A": 1, "B": [2]}; data is <0a0b ...>; a date is ISO 8601 UTC.
/// Containers nested deeper than kMaxValueDepth are shown as an ellipsis.
[[nodiscard]] std::string textOf(const Value& value);
[[nodiscard]] std::string textOf(const Dictionary& dictionary);
/// "(none)" when absent.
[[nodiscard]] std::string textOf(const Value* value);

/// `text` as one line: control characters (C0, DEL, C1) and bytes that are no UTF-8 become \n, \r,
/// \t or \xNN; cut after kMaxTextBytes.
[[nodiscard]] std::string lineOf(std::string_view text);

/// Length of the UTF-8 sequence that starts at `text[0]`, 0 when that is none (RFC 3629: no
/// overlong forms, no surrogates, nothing above U+10FFFF).
[[nodiscard]] std::size_t utf8SequenceLength(std::string_view text);
[[nodiscard]] bool isUtf8(std::string_view text);

}  // namespace spacekeep
