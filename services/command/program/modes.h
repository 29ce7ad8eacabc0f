// Thread safety: called once, from main.
//
// What the program does, by mode. Each answers the exit code.
#pragma once

#include <vector>

#include "services/command/program/options.h"

namespace spacekeep::command {

/// --once and --dry-run: what goes on standard output, one a line with its bytes; what there is to
/// say about it on standard error.
[[nodiscard]] ExitCode freeOnce(std::vector<Rule> rules, const UserFolders* folders,
                                const Options& options);
/// --estimate: also of rules that are switched off, which do not count in the sum.
[[nodiscard]] ExitCode printTable(std::vector<Rule> rules, const UserFolders* folders,
                                  const Options& options);
/// --describe.
[[nodiscard]] ExitCode describe(const std::vector<Rule>& rules);
/// Serves until told to stop.
[[nodiscard]] ExitCode serve(std::vector<Rule> rules, const UserFolders* folders,
                             const Options& options);

}  // namespace spacekeep::command
