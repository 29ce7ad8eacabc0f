// Thread safety: each function is for one thread; they share nothing.
//
// What the tool does once its command line is understood. Results go to standard output, progress
// and complaints to standard error.
#pragma once

#include <cstdint>
#include <optional>
#include <string>

namespace spacekeep::ctl {

/// How the tool ends. Scripts rely on these numbers; the man page lists them.
enum class ExitCode : int {
  kDone = 0,         ///< purge: the amount was reached; cancel: the daemon took the request
  kNotReached = 1,   ///< the purge ended with less
  kUsage = 2,        ///< the command line is wrong; nothing was asked
  kUnreachable = 3,  ///< nobody listens at the socket
  kRefused = 4,      ///< the daemon refused: no right, or no such volume
  kFailed = 5,       ///< the connection or the daemon failed meanwhile
};

struct CommonOptions {
  std::string socket_path;
  bool json = false;
};

struct PurgeOptions {
  std::string volume;
  std::uint64_t amount = 0;  ///< bytes
  std::optional<int> urgency;
  std::optional<std::uint64_t> timeout_seconds;
  std::optional<std::string> token;
  bool wait_all = false;
};

[[nodiscard]] ExitCode runPurge(const CommonOptions& common, const PurgeOptions& options);
[[nodiscard]] ExitCode runCancel(const CommonOptions& common, const std::string& token);

}  // namespace spacekeep::ctl
