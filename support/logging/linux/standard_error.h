// Thread safety: every function may be called from any thread; logToStandardError once at start.
//
// Log lines on a standard error whose other end somebody else holds: a pipe that nobody empties
// must not hold up a queue, and one that was closed must not end the process.
#pragma once

#include <cstdint>
#include <span>
#include <string_view>

#include "support/logging/log.h"
#include "support/runtime/runtime.h"

namespace spacekeep {

/// For programs that go on for long, before they start other threads: makes
/// writeLogLineToStandardError the log-write entry, and a write to what nobody reads any more an
/// error like others (SIGPIPE is ignored). Whoever starts programs gives them the default back.
void logToStandardError();

/// As writeLogLine, without waiting: a line that finds standard error full is dropped, and before
/// the next one that gets through it is said how many were.
void writeLogLineToStandardError(const LogHandle* handle, std::int32_t level, const char* category,
                                 const char* format, std::span<const LogArgument> arguments);

/// Whole lines to a descriptor that may be anything, without waiting for it. The descriptor's own
/// flags stay as they are, since other processes may share them.
class LineOutput {
 public:
  /// `fd` stays the caller's.
  explicit LineOutput(int fd) : fd_(fd) {}
  /// `line` ends in a line feed.
  void write(std::string_view line);

 private:
  bool writeWhole(std::string_view line);

  const int fd_;
  rt::Mutex mutex_;  // keeps the lines of several threads apart
  // Protected by mutex_.
  std::uint64_t dropped_ = 0;
  bool within_line_ = false;  ///< the last line could only be begun
};

}  // namespace spacekeep
