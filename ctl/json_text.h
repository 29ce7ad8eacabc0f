// Thread safety: pure function.
//
// Values as JSON (RFC 8259), for programs that read the tool's output.
#pragma once

#include <string>

#include "support/values/value.h"

namespace spacekeep::ctl {

/// One line. Numbers keep all their digits; data is an array of bytes, a date a number of seconds
/// since 1970. A number that JSON cannot write is null, and bytes that are no UTF-8 become U+FFFD.
[[nodiscard]] std::string jsonOf(const Value& value);

}  // namespace spacekeep::ctl
