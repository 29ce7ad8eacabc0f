// Thread safety: pure function.
//
// The client state as a table for people.
#pragma once

#include <string>

#include "ctl/style.h"
#include "support/values/value.h"

namespace spacekeep::ctl {

/// A line per key with its value, and one with the meaning of a key that means something to the
/// daemon. Keys that a person may set stand there also while they are not set, with their default
/// in parentheses.
[[nodiscard]] std::string stateTableOf(const Dictionary& state, const Style& style);

}  // namespace spacekeep::ctl
