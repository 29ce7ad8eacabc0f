// Thread safety: pure functions.
//
// Numbers as people and JSON write them.
#pragma once

#include <optional>
#include <string_view>

#include "support/values/value.h"

namespace spacekeep::ctl {

/// "12", "-3", "0.25": an integer when it is written as one and fits into 64 bits, signed or
/// unsigned, else floating. None for anything else, and for an integer that does not fit.
[[nodiscard]] std::optional<Value> plainNumber(std::string_view text);

/// The numbers of JSON (RFC 8259, section 6): as above, and with an exponent; an integer that does
/// not fit becomes floating. None for what no double can hold, too.
[[nodiscard]] std::optional<Value> jsonNumber(std::string_view text);

}  // namespace spacekeep::ctl
