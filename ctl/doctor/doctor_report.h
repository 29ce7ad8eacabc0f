// Thread safety: pure functions over plain values.
//
// What the doctor has found, for people and programs.
#pragma once

#include <cstddef>
#include <string>
#include <vector>

#include "ctl/doctor/finding.h"
#include "ctl/style.h"

namespace spacekeep::ctl::doctor {

[[nodiscard]] std::size_t countOf(const std::vector<Group>& groups, Severity severity);

/// A line per finding under the name of its group, and a closing line; on a terminal broken where
/// its width demands it.
[[nodiscard]] std::string textOf(const std::vector<Group>& groups, const Style& style);
/// One object; the man page of the tool describes its members.
[[nodiscard]] std::string jsonOf(const std::vector<Group>& groups);

}  // namespace spacekeep::ctl::doctor
