// Thread safety: readLogLevel from any thread; setUpLogging once at start.
//
// The log level comes from a small property-list file, since the daemon takes neither a command
// line nor environment variables.
#pragma once

#include <cstdint>
#include <string>
#include <variant>

#include "support/logging/log.h"

namespace spacekeep {

/// Problems, no tracing.
inline constexpr std::int32_t kDefaultLogLevel = 4;
/// The key of the level in the file, an integer.
inline constexpr const char* kLogLevelKey = "LogLevel";
/// Largest file that is read, in bytes.
inline constexpr std::size_t kMaxLogLevelFileBytes = 64 * 1024;

struct LogLevelProblem {
  std::string reason;
};

/// A missing file, and a file without the key, give kDefaultLogLevel.
[[nodiscard]] std::variant<std::int32_t, LogLevelProblem> readLogLevel(const std::string& path);

/// Makes `handle` the process's log handle, with the level that the file says, and the journal the
/// place of log lines where there is one, else standard error (logToStandardError()). A bad file is
/// a problem line and kDefaultLogLevel.
void setUpLogging(LogHandle& handle, const std::string& level_file);

}  // namespace spacekeep
