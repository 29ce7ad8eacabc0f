// Thread safety: pure functions.
//
// Reads an amount out of what a tool printed, in the way that its rule declares.
#pragma once

#include <cstdint>
#include <optional>
#include <set>
#include <string>
#include <string_view>

#include "services/command/rules/rule.h"

namespace spacekeep::command {

inline constexpr std::size_t kMaxListedPaths = 65536;

/// "12", "1.5G", "1.5 GiB", "300 kB,", "12 bytes": a number that may have a fraction and a unit. K,
/// M, G, T count in steps of `base` (1000 or 1024), with an "i" always of 1024. None when there is no
/// number at the beginning or the unit is none of these.
[[nodiscard]] std::optional<std::uint64_t> sizeAtBeginning(std::string_view text,
                                                           std::uint64_t base);

/// The sum of what the lines tell. None when a line that should hold an amount does not, except the
/// first one of a table, which may be its heading.
[[nodiscard]] std::optional<std::uint64_t> amountIn(const std::string& output,
                                                    const AmountInOutput& how);

/// The absolute paths among the lines, at most kMaxListedPaths.
[[nodiscard]] std::set<std::string> pathsIn(const std::string& output, const std::string& after);

}  // namespace spacekeep::command
