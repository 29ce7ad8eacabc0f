// A hostile client: does as much as it can for a time, on as many connections as it gets.
// Usage: soak-hostile SOCKET SECONDS everything|calls
//
// "everything": garbage, half-open connections, huge messages, answers that are never read, queries
// and state writes within its rights, and small calls. "calls": the small calls alone, which any peer
// takes. Ends with one line of what it has sent.
#include <fcntl.h>
#include <fmt/format.h>
#include <poll.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <array>
#include <atomic>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <deque>
#include <memory>
#include <string>
#include <string_view>
#include <thread>
#include <utility>
#include <vector>

#include "tests/linux/system/raw_peer.h"

namespace {

using Clock = std::chrono::steady_clock;
using spacekeep::system_test::callClaiming;
using spacekeep::system_test::methodCall;

constexpr std::string_view kOpening("\0AUTH EXTERNAL\r\nDATA\r\nNEGOTIATE_UNIX_FD\r\nBEGIN\r\n",
                                    48);
constexpr std::size_t kCallers = 60;
constexpr std::size_t kWriters = 20;
constexpr std::size_t kAskers = 20;
constexpr std::size_t kDeaf = 10;
constexpr std::size_t kHalfOpen = 60;
constexpr int kCallsPerBurst = 32;

std::string path;
Clock::time_point end;
std::atomic<long> connections{0}, refused{0}, bytes_sent{0};

bool isOver() { return Clock::now() >= end; }

/// A connection that never waits.
class Line {
 public:
  Line() : fd_(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0)) {
    sockaddr_un address = {};
    address.sun_family = AF_UNIX;
    std::snprintf(address.sun_path, sizeof address.sun_path, "%s", path.c_str());
    if (::connect(fd_, reinterpret_cast<const sockaddr*>(&address), sizeof address) == 0) {
      ++connections;
    } else {
      ++refused;
      drop();
    }
  }
  Line(Line&& other) noexcept : fd_(std::exchange(other.fd_, -1)), rest_(std::move(other.rest_)) {}
  Line& operator=(Line&& other) noexcept {
    std::swap(fd_, other.fd_);
    std::swap(rest_, other.rest_);
    return *this;
  }
  ~Line() { drop(); }

  [[nodiscard]] bool open() const { return fd_ >= 0; }
  /// Sends what is left of the last burst, or begins another one. Answers whether any of it went.
  bool push(const std::string& burst) {
    if (!open()) return false;
    if (rest_.empty()) rest_ = burst;
    const ssize_t sent = ::send(fd_, rest_.data(), rest_.size(), MSG_NOSIGNAL);
    if (sent > 0) {
      bytes_sent += sent;
      rest_.erase(0, static_cast<std::size_t>(sent));
    } else if (errno != EAGAIN) {
      drop();
    }
    return sent > 0;
  }
  /// Reads away whatever has come.
  void drain() {
    std::array<char, 65'536> buffer{};
    while (open()) {
      const ssize_t got = ::recv(fd_, buffer.data(), buffer.size(), 0);
      if (got < 0 && errno == EAGAIN) return;
      if (got <= 0) drop();
    }
  }

 private:
  void drop() {
    if (fd_ >= 0) ::close(fd_);
    fd_ = -1;
    rest_.clear();
  }

  int fd_;
  std::string rest_;
};

std::string repeated(const std::string& text, int times) {
  std::string all;
  for (int i = 0; i < times; ++i) all += text;
  return all;
}

void putLength(std::string& body, std::size_t length) {
  for (unsigned shift = 0; shift < 32; shift += 8) {
    body.push_back(static_cast<char>((length >> shift) & 0xff));
  }
}

void putString(std::string& body, std::string_view text) {
  while (body.size() % 4 != 0) body.push_back('\0');
  putLength(body, text.size());
  body.append(text);
  body.push_back('\0');
}

std::string readCall() {
  std::string body;
  putString(body, "HOSTILE");
  return methodCall("clientGetState", "s", body);
}

/// A value of some size under a key of its own.
std::string writeCall() {
  std::string value("\1s\0", 3);
  value.push_back('\0');  // to the length of the string
  putString(value, std::string(2000, 'h'));
  std::string body;
  putLength(body, value.size());
  body += value;
  putString(body, "HOSTILE");
  return methodCall("clientSetState", "avs", body);
}

/// A query with no volume is answered with nothing; this one goes all the way.
std::string queryCall() {
  std::string entry;
  putString(entry, "SPACEKEEP_VOLUME");
  entry += std::string("\1s\0", 3);
  std::string body;
  // The entry begins at a multiple of eight, so what is aligned within it stays so.
  putString(entry, "/volumes/a");
  putLength(body, entry.size());
  putLength(body, 0);
  return methodCall("clientPurgeableSpace", "a{sv}", body + entry);
}

/// As fast as it goes on many connections; what ends is opened anew.
void flood(std::size_t lines_wanted, const std::string& burst, bool reads) {
  std::vector<Line> lines(lines_wanted);
  for (Line& line : lines) line.push(std::string(kOpening));
  while (!isOver()) {
    bool any_went = false;
    for (Line& line : lines) {
      if (reads) line.drain();
      if (!line.open()) {
        line = Line();
        line.push(std::string(kOpening));
      }
      any_went = line.push(burst) || any_went;
    }
    // Whoever only spins takes the processor from everybody, which is no matter of the daemon's.
    if (!any_went) std::this_thread::sleep_for(std::chrono::milliseconds(1));
  }
}

/// Strangers who never get as far as a call.
void pester() {
  const std::string garbage(4096, '\xfe');
  const std::string huge =
      callClaiming("clientPurge", "a{sv}", 100U * 1024 * 1024) + std::string(256 * 1024, 'x');
  std::deque<Line> half_open;
  while (!isOver()) {
    Line().push(garbage);
    Line large;
    // As in flood().
    if (!large.open()) std::this_thread::sleep_for(std::chrono::milliseconds(1));
    large.push(std::string(kOpening));
    large.push(huge);
    half_open.emplace_back();
    half_open.back().push(std::string("\0AUTH EXTER", 11));
    if (half_open.size() > kHalfOpen) half_open.pop_front();
  }
}

std::vector<std::thread> attack(bool with_everything) {
  std::vector<std::thread> threads;
  threads.emplace_back([] { flood(kCallers, repeated(readCall(), kCallsPerBurst), true); });
  if (!with_everything) return threads;
  threads.emplace_back([] { flood(kWriters, repeated(writeCall(), 8), true); });
  threads.emplace_back([] { flood(kAskers, repeated(queryCall(), 8), true); });
  threads.emplace_back([] { flood(kDeaf, repeated(readCall(), kCallsPerBurst), false); });
  threads.emplace_back(pester);
  return threads;
}

}  // namespace

int main(int count, char** arguments) {
  if (count != 4) return 2;
  path = arguments[1];
  end = Clock::now() + std::chrono::seconds(std::strtol(arguments[2], nullptr, 10));
  for (std::thread& thread : attack(std::string_view(arguments[3]) == "everything")) thread.join();
  fmt::print("hostile: {} connections, {} refused by the kernel, {:.1f} MiB sent\n",
             connections.load(), refused.load(), static_cast<double>(bytes_sent) / 1'048'576);
}
