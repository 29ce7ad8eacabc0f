// Thread safety: pure functions.
//
// The command line of spacekeep-command.
#pragma once

#include <cstdint>
#include <limits>
#include <optional>
#include <string>
#include <variant>

#include "services/cachedir/program/options.h"
#include "services/command/rules/rule_files.h"

namespace spacekeep::command {

using cachedir::ExitCode;

enum class Mode {
  kServeSocket,  // at the socket that the service manager hands over
  kCheckIn,      // by checking in with the daemon
  kOnce,
  kDryRun,
  kEstimate,
  kDescribe,
};

struct Options {
  Mode mode = Mode::kServeSocket;
  RulesWanted rules;
  bool user = false;
  std::string id;  // empty: by the rules
  std::uint64_t amount = std::numeric_limits<std::uint64_t>::max();
  int urgency = 3;
  std::optional<std::string> volume;
  std::string socket_path;
  std::string allowed_user;  // empty: nobody else
  std::optional<std::uint64_t> stop_when_idle_seconds;
};

/// The options, or the exit code when there is nothing more to do (help, or a mistake: both have
/// been printed).
[[nodiscard]] std::variant<Options, int> readCommandLine(int argc, char** argv);

}  // namespace spacekeep::command
