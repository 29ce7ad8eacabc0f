// Thread safety: pure functions.
//
// The command line of spacekeep-cachedir.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <variant>

namespace spacekeep::cachedir {

enum class ExitCode : int {
  kDone = 0,
  kLessThanAsked = 1,
  kUsage = 2,
  kBadRules = 3,
  kCannotServe = 4,
};

enum class Mode {
  kServeSocket,  // at the socket that the service manager hands over
  kCheckIn,      // by checking in with the daemon
  kOnce,
  kDryRun,
  kEstimate,
};

struct Options {
  Mode mode = Mode::kServeSocket;
  std::string rules_file;
  std::uint64_t amount = 0;
  int urgency = 3;
  std::optional<std::string> volume;
  std::string socket_path;
  std::optional<std::uint64_t> stop_when_idle_seconds;
};

/// The options, or the exit code when there is nothing more to do (help, or a mistake: both have
/// been printed).
[[nodiscard]] std::variant<Options, int> readCommandLine(int argc, char** argv);

}  // namespace spacekeep::cachedir
