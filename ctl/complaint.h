// Thread safety: for one thread at a time.
//
// How the tool ends, and how it says that something went wrong.
#pragma once

#include <spacekeep/error.h>

#include <string>

namespace spacekeep::ctl {

/// How the tool ends. Scripts rely on these numbers; the man page lists them.
enum class ExitCode : int {
  kDone = 0,          ///< what was asked for was done; purge: the amount was reached
  kNotReached = 1,    ///< the purge ended with less
  kUsage = 2,         ///< the command line is wrong; nothing was asked
  kUnreachable = 3,   ///< nobody listens at the socket
  kRefused = 4,       ///< the daemon refused: no right, or no such volume
  kFailed = 5,        ///< the connection or the daemon failed meanwhile
  kNoValue = 6,       ///< state get: the key has no value
  kChecksFailed = 7,  ///< check-service: at least one check failed
};

struct CommonOptions {
  std::string socket_path;
  bool json = false;
};

/// Says `text` on standard error, and with --json as an object on standard output too. Gives `code`
/// back.
[[nodiscard]] ExitCode complain(const CommonOptions& common, ExitCode code,
                                const std::string& text);
[[nodiscard]] ExitCode complain(const CommonOptions& common, const sdk::Error& error);

[[nodiscard]] ExitCode exitCodeOf(sdk::ErrorKind kind);

/// Something to know that does not change how the tool ends; standard error only.
void remark(const std::string& text);

}  // namespace spacekeep::ctl
