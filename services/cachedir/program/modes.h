// Thread safety: called once, from main.
//
// What the program does, by mode. Each answers the exit code.
#pragma once

#include <memory>

#include "services/cachedir/engine/cache_cleaner.h"
#include "services/cachedir/program/options.h"

namespace spacekeep::cachedir {

/// --once and --dry-run: the files on standard output, one a line with its bytes; what there is to
/// say about them on standard error.
[[nodiscard]] ExitCode freeOnce(CacheCleaner& cleaner, const Options& options);
/// --estimate.
[[nodiscard]] ExitCode printEstimate(const CacheCleaner& cleaner, const Options& options);
/// Serves until told to stop.
[[nodiscard]] ExitCode serve(const std::shared_ptr<CacheCleaner>& cleaner, const Options& options);

}  // namespace spacekeep::cachedir
