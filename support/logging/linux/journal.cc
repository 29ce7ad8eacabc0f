#include "support/logging/linux/journal.h"

#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <string_view>

#include "support/logging/linux/standard_error.h"
#include "support/values/text.h"

namespace spacekeep {
namespace {

std::atomic<std::uint64_t> dropped_lines{0};

// One socket for the life of the process, made when the first line wants it.
int journalDescriptor() {
  static const int descriptor = socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0);
  return descriptor;
}

// syslog(3): 3 is an error, 6 information, 7 debugging.
int priorityOf(std::int32_t level) {
  if (level <= kLogProblem) return 3;
  return level < kLogTrace ? 6 : 7;
}

void addField(std::string& datagram, const char* name, std::string_view value) {
  datagram += name;
  datagram += '=';
  // A line feed would start the next field.
  datagram += lineOf(value);
  datagram += '\n';
}

std::string_view operationOf(const char* format, std::span<const LogArgument> arguments) {
  if (arguments.empty() || !std::string_view(format).starts_with("%s ")) return {};
  const auto* operation = std::get_if<std::string_view>(&arguments.front());
  return operation == nullptr ? std::string_view() : *operation;
}

}  // namespace

bool standardErrorIsJournal() {
  const char* stream = std::getenv("JOURNAL_STREAM");
  struct stat error {};
  if (stream == nullptr || fstat(STDERR_FILENO, &error) != 0) return false;
  return std::to_string(error.st_dev) + ':' + std::to_string(error.st_ino) == stream;
}

bool installPlatformLog() {
  if (!standardErrorIsJournal() || access(kJournalSocket, W_OK) != 0) return false;
  gMOLogWrite.store(&writeLogLineToJournal, std::memory_order_release);
  return true;
}

std::string journalDatagram(std::int32_t level, const char* category, const char* format,
                            std::span<const LogArgument> arguments, std::uint64_t dropped) {
  std::string datagram;
  addField(datagram, "MESSAGE", formatLogLine(format, arguments));
  addField(datagram, "PRIORITY", std::to_string(priorityOf(level)));
  addField(datagram, "SYSLOG_IDENTIFIER", program_invocation_short_name);
  addField(datagram, "SPACEKEEP_LEVEL", std::to_string(level));
  addField(datagram, "SPACEKEEP_CATEGORY", category);
  const std::string_view operation = operationOf(format, arguments);
  if (!operation.empty()) addField(datagram, "SPACEKEEP_OPERATION", operation);
  if (dropped > 0) addField(datagram, "SPACEKEEP_DROPPED", std::to_string(dropped));
  return datagram;
}

JournalSend sendToJournal(const std::string& socket_path, const std::string& datagram) {
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  if (socket_path.size() >= sizeof(address.sun_path)) return JournalSend::kUnreachable;
  std::memcpy(address.sun_path, socket_path.data(), socket_path.size());
  // Addressed anew each time: a connection would not survive a restart of the journal.
  const ssize_t sent =
      sendto(journalDescriptor(), datagram.data(), datagram.size(), MSG_DONTWAIT | MSG_NOSIGNAL,
             reinterpret_cast<const sockaddr*>(&address), sizeof(address));
  if (sent >= 0) return JournalSend::kSent;
  const bool full = errno == EAGAIN || errno == ENOBUFS;
  return full ? JournalSend::kFull : JournalSend::kUnreachable;
}

void writeLogLineToJournal(const LogHandle* handle, std::int32_t level, const char* category,
                           const char* format, std::span<const LogArgument> arguments) {
  const std::uint64_t dropped = dropped_lines.exchange(0);
  switch (
      sendToJournal(kJournalSocket, journalDatagram(level, category, format, arguments, dropped))) {
    case JournalSend::kSent:
      return;
    case JournalSend::kFull:
      dropped_lines.fetch_add(dropped + 1);
      return;
    case JournalSend::kUnreachable:
      dropped_lines.fetch_add(dropped);
      writeLogLineToStandardError(handle, level, category, format, arguments);
      return;
  }
}

}  // namespace spacekeep
