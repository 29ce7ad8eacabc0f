// Thread safety: for one thread.
//
// What the command line says.
#pragma once

#include <functional>
#include <string>
#include <variant>

#include "ctl/complaint.h"

namespace spacekeep::ctl {

/// A command with its options, ready to run.
using Command = std::function<ExitCode()>;

/// What is to be done, or the exit code of a tool that has already said all it had to say: help,
/// the version, or what is wrong.
[[nodiscard]] std::variant<Command, int> parseCommandLine(int argc, const char* const* argv,
                                                          const std::string& version);

}  // namespace spacekeep::ctl
