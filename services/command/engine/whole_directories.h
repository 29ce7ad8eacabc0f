// Thread safety: pure functions over the file system; two at a time on the same directories would
// find each other's work gone, and nothing worse.
//
// Directories that go as a whole or not at all, because a program that finds half of one would take
// it for all. A directory is as young as the youngest file in it. It is in use when any file in it is,
// when a process stands in it or has a directory of it open, and when a socket or a pipe is there.
// It is renamed before anything in it goes, so nobody ever sees a part; one that turns out to be in
// use after all gets its name back.
#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include "services/cachedir/engine/cache_cleaner.h"
#include "services/command/engine/cache.h"

namespace spacekeep::command {

/// Each entry of `rules` is one directory, without patterns.
[[nodiscard]] cachedir::Estimate estimateWhole(const cachedir::Rules& rules,
                                               const std::optional<std::string>& volume,
                                               const CancelToken& cancel);

struct WholeResult {
  std::uint64_t bytes = 0;
  std::vector<std::string> problems;
};
/// The directory that was used longest ago goes first; before all what a cancel or a crash left of
/// those that `patterns` stand for. KEEP in these speaks of the directories themselves.
[[nodiscard]] WholeResult freeWhole(const cachedir::Rules& rules, const cachedir::Rules& patterns,
                                    const cachedir::FreeRequest& request, const CancelToken& cancel,
                                    const Visitor& visit);

}  // namespace spacekeep::command
