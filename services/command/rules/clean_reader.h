// Thread safety: pure function.
//
// The part of a rule file that tells how a tool cleans, by urgency.
#pragma once

#include <array>
#include <optional>

#include "services/command/rules/field_reader.h"
#include "services/command/rules/rule.h"

namespace spacekeep::command {

/// Reads CLEAN of `top`; what is wrong goes to `fields`.
void readClean(const Dictionary& top, FieldReader& fields,
               std::array<std::optional<CleanStep>, kUrgencies>& steps);

}  // namespace spacekeep::command
