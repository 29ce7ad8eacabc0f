// Thread safety: every function may be called from any thread; installPlatformLog once at start.
//
// Log lines for the journal, with level, category and operation as fields of their own. Spoken is
// the journal's native datagram protocol (systemd.journal-fields(7)) without the library's sender:
// that one waits while the journal is stuck, and a log line must never hold up a queue.
#pragma once

#include <cstdint>
#include <span>
#include <string>

#include "support/logging/log.h"

namespace spacekeep {

inline constexpr const char* kJournalSocket = "/run/systemd/journal/socket";

/// Standard error is the journal: the service manager says so in JOURNAL_STREAM (systemd.exec(5)).
[[nodiscard]] bool standardErrorIsJournal();

/// Makes writeLogLineToJournal the log-write entry when standard error is the journal and its
/// socket is there; otherwise leaves everything as it is. Answers whether it did.
bool installPlatformLog();

/// Sends the line to the journal; to standard error when it cannot be reached. A line that finds
/// the journal's queue full is dropped, and the next line that gets through says how many were
/// (SPACEKEEP_DROPPED).
void writeLogLineToJournal(const LogHandle* handle, std::int32_t level, const char* category,
                           const char* format, std::span<const LogArgument> arguments);

/// The datagram of one line: NAME=value, one each line.
[[nodiscard]] std::string journalDatagram(std::int32_t level, const char* category,
                                          const char* format,
                                          std::span<const LogArgument> arguments,
                                          std::uint64_t dropped);

enum class JournalSend { kSent, kFull, kUnreachable };
/// Never waits. `socket_path` as in unix(7).
[[nodiscard]] JournalSend sendToJournal(const std::string& socket_path,
                                        const std::string& datagram);

}  // namespace spacekeep
