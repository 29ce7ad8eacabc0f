// Thread safety: pure functions over the file system.
//
// How much the files of some directories occupy. Files with several hard links count once, and only
// when all of their names are there: their blocks would not come back otherwise.
#pragma once

#include <cstdint>
#include <functional>
#include <optional>
#include <set>
#include <string>

#include "services/cachedir/engine/cancel_token.h"
#include "services/cachedir/engine/roots.h"
#include "services/command/rules/rule.h"

namespace spacekeep::command {

struct Measured {
  std::uint64_t bytes = 0;  // allocated
  std::uint64_t files = 0;
  /// Everything could be looked at, and the looking was not cancelled.
  bool whole = true;
};

[[nodiscard]] Measured measure(const std::vector<cachedir::Root>& roots,
                               const cachedir::CancelToken& cancel);
/// Only of those files that a clean would take.
[[nodiscard]] Measured measureThoseThatGo(const std::vector<cachedir::Root>& roots,
                                          const FilesThatGo& go, std::int64_t now_ns,
                                          const cachedir::CancelToken& cancel);
/// Only of those that lie at or below one of these absolute paths.
[[nodiscard]] Measured measureBelow(const std::vector<cachedir::Root>& roots,
                                    const std::set<std::string>& paths,
                                    const cachedir::CancelToken& cancel);

}  // namespace spacekeep::command
