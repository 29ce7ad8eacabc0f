#include "support/logging/linux/standard_error.h"

#include <poll.h>
#include <sys/socket.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <climits>
#include <csignal>
#include <mutex>
#include <string>

namespace spacekeep {
namespace {

/// A pipe that is ready takes this much without waiting (pipe(7)).
constexpr std::size_t kMaxPart = PIPE_BUF;

bool isReady(int fd) {
  pollfd output{.fd = fd, .events = POLLOUT, .revents = 0};
  return ::poll(&output, 1, 0) == 1 && (output.revents & POLLOUT) != 0;
}

/// As write(2), but an error where it would have to wait.
ssize_t writePart(int fd, std::string_view part) {
  const ssize_t sent = ::send(fd, part.data(), part.size(), MSG_DONTWAIT | MSG_NOSIGNAL);
  if (sent >= 0 || errno != ENOTSOCK) return sent;
  if (!isReady(fd)) return -1;
  return ::write(fd, part.data(), part.size());
}

LineOutput& standardError() {
  static LineOutput output(STDERR_FILENO);
  return output;
}

}  // namespace

void logToStandardError() {
  std::signal(SIGPIPE, SIG_IGN);
  gMOLogWrite.store(&writeLogLineToStandardError, std::memory_order_release);
}

void writeLogLineToStandardError(const LogHandle* /*handle*/, std::int32_t level,
                                 const char* category, const char* format,
                                 std::span<const LogArgument> arguments) {
  standardError().write(logLineText(level, category, format, arguments));
}

void LineOutput::write(std::string_view line) {
  const std::scoped_lock lock(mutex_);
  if (dropped_ > 0) {
    const std::string told =
        (within_line_ ? "\n" : "") + std::to_string(dropped_) + " log lines were dropped here\n";
    if (!writeWhole(told)) {
      ++dropped_;
      return;
    }
    dropped_ = 0;
  }
  if (!writeWhole(line)) ++dropped_;
}

bool LineOutput::writeWhole(std::string_view line) {
  bool begun = false;
  while (!line.empty()) {
    errno = 0;
    const ssize_t written = writePart(fd_, line.substr(0, std::min(line.size(), kMaxPart)));
    if (written < 0 && errno == EINTR) continue;
    if (written <= 0) {
      within_line_ = within_line_ || begun;
      return false;
    }
    begun = true;
    line.remove_prefix(static_cast<std::size_t>(written));
  }
  within_line_ = false;
  return true;
}

}  // namespace spacekeep
