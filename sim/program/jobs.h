// Thread safety: to be called from the only thread of the process.
//
// Plays seeds in several processes at once: the deterministic runtime runs one schedule at a time
// in a process, and a run that brings its process down must not take the others with it.
#pragma once

#include <cstdint>

#include "sim/program/options.h"

namespace spacekeep::sim {

/// Prints failures as they come and a summary at the end. Answers the status for the shell.
int playInProcesses(const Options& options);

}  // namespace spacekeep::sim
