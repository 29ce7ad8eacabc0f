// Thread safety: pure function.
//
// JSON (RFC 8259) as values, for what a person writes on a command line.
#pragma once

#include <string>
#include <string_view>
#include <variant>

#include "support/values/value.h"

namespace spacekeep::ctl {

/// What is wrong, and at which byte (from 0).
struct JsonError {
  std::string text;
};

/// One value with nothing behind it. Numbers without fraction and exponent that fit become
/// integers, others floating; of a name that stands twice the last value counts. Refuses null,
/// which has no place among the values of the state, and nesting deeper than kMaxValueDepth.
[[nodiscard]] std::variant<Value, JsonError> parseJson(std::string_view text);

}  // namespace spacekeep::ctl
