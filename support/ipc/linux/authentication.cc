#include "support/ipc/linux/authentication.h"

#include <sys/socket.h>

#include <array>
#include <cerrno>
#include <cstddef>
#include <cstring>
#include <optional>
#include <utility>

namespace spacekeep::ipc {

namespace {

constexpr std::size_t kMaxLineBytes = 512;
constexpr unsigned kMaxLines = 16;
// Peers know a server by it; nothing here depends on its value.
constexpr std::string_view kOk = "OK 5350414345204b454550206f6e206c6f\r\n";

int hexDigit(char c) {
  if (c >= '0' && c <= '9') return c - '0';
  if (c >= 'a' && c <= 'f') return c - 'a' + 10;
  if (c >= 'A' && c <= 'F') return c - 'A' + 10;
  return -1;
}

std::optional<std::string> fromHex(std::string_view hex) {
  if (hex.size() % 2 != 0) return std::nullopt;
  std::string text;
  for (std::size_t i = 0; i < hex.size(); i += 2) {
    const int high = hexDigit(hex[i]);
    const int low = hexDigit(hex[i + 1]);
    if (high < 0 || low < 0) return std::nullopt;
    text += static_cast<char>(high * 16 + low);
  }
  return text;
}

/// Takes the first word off `text`.
std::string_view takeWord(std::string_view& text) {
  const std::size_t space = text.find(' ');
  const std::string_view word = text.substr(0, space);
  text = space == std::string_view::npos ? std::string_view() : text.substr(space + 1);
  return word;
}

}  // namespace

Authentication::Authentication(Role role, int fd, uid_t peer_uid)
    : role_(role),
      fd_(fd),
      peer_uid_(peer_uid),
      state_(role == Role::kServer ? State::kNul : State::kStart) {}

bool Authentication::begin() {
  if (role_ == Role::kServer) return true;
  // The empty token means "whoever the kernel says I am", which also holds across user namespaces.
  constexpr std::string_view kOpening("\0AUTH EXTERNAL\r\nDATA\r\nNEGOTIATE_UNIX_FD\r\nBEGIN\r\n",
                                      48);
  static_assert(kOpening.back() == '\n');
  return send(kOpening);
}

Authentication::Progress Authentication::advance(std::string& why) {
  while (true) {
    switch (readLine(why)) {
      case Read::kNothing:
        return Progress::kMore;
      case Read::kLeft:
        why = "the peer left during authentication";
        return Progress::kLeft;
      case Read::kWrong:
        return Progress::kFailed;
      case Read::kLine:
        break;
    }
    const std::string line = std::exchange(line_, {});
    const std::string_view text(line.data(), line.size() - 2);
    const Progress progress = role_ == Role::kServer ? serve(text, why) : follow(text, why);
    if (progress != Progress::kMore) return progress;
  }
}

/// Takes at most up to the next line end off the socket, so that what follows stays there.
Authentication::Read Authentication::readLine(std::string& why) {
  std::array<char, kMaxLineBytes> ahead{};
  const ssize_t seen = ::recv(fd_, ahead.data(), ahead.size(), MSG_PEEK | MSG_DONTWAIT);
  if (seen < 0 && (errno == EAGAIN || errno == EINTR)) return Read::kNothing;
  if (seen <= 0) return Read::kLeft;
  std::size_t wanted = static_cast<std::size_t>(seen);
  if (state_ == State::kNul) {
    wanted = 1;
  } else if (const void* end = std::memchr(ahead.data(), '\n', wanted); end != nullptr) {
    wanted = static_cast<std::size_t>(static_cast<const char*>(end) - ahead.data()) + 1;
  }
  if (::recv(fd_, ahead.data(), wanted, MSG_DONTWAIT) != static_cast<ssize_t>(wanted)) {
    return Read::kLeft;
  }
  if (state_ == State::kNul) {
    if (ahead[0] != '\0') {
      why = "what the peer sent is no D-Bus authentication";
      return Read::kWrong;
    }
    state_ = State::kStart;
    return readLine(why);
  }
  line_.append(ahead.data(), wanted);
  if (line_.size() > kMaxLineBytes) {
    why = "a line of the authentication is too long";
    return Read::kWrong;
  }
  if (line_.back() != '\n') return readLine(why);
  if (line_.size() < 2 || line_[line_.size() - 2] != '\r' || ++lines_ > kMaxLines) {
    why = "what the peer sent is no D-Bus authentication";
    return Read::kWrong;
  }
  return Read::kLine;
}

bool Authentication::send(std::string_view text) {
  const ssize_t sent_bytes = ::send(fd_, text.data(), text.size(), MSG_DONTWAIT | MSG_NOSIGNAL);
  return sent_bytes == static_cast<ssize_t>(text.size());
}

Authentication::Progress Authentication::sent(bool whole, std::string& why) {
  if (whole) return Progress::kMore;
  why = "the peer does not read during authentication";
  return Progress::kFailed;
}

Authentication::Progress Authentication::serve(std::string_view line, std::string& why) {
  const std::string_view command = takeWord(line);
  if (state_ == State::kAuthenticated) {
    if (command == "BEGIN") return Progress::kDone;
    if (command == "NEGOTIATE_UNIX_FD") return sent(send("AGREE_UNIX_FD\r\n"), why);
  }
  if (state_ == State::kStart && command == "AUTH") return answerAuth(line, why);
  if (state_ == State::kData && command == "DATA") return accept(line, why);
  if (command == "CANCEL" || command == "ERROR") return reject(why);
  if (command == "BEGIN") {
    why = "the peer began without being authenticated";
    return Progress::kFailed;
  }
  return sent(send("ERROR\r\n"), why);
}

Authentication::Progress Authentication::answerAuth(std::string_view argument, std::string& why) {
  if (takeWord(argument) != "EXTERNAL") return reject(why);
  if (!argument.empty()) return accept(argument, why);
  state_ = State::kData;
  return sent(send("DATA\r\n"), why);
}

Authentication::Progress Authentication::accept(std::string_view token, std::string& why) {
  const auto claimed = fromHex(token);
  if (!claimed || (!claimed->empty() && *claimed != std::to_string(peer_uid_))) return reject(why);
  state_ = State::kAuthenticated;
  return sent(send(kOk), why);
}

Authentication::Progress Authentication::reject(std::string& why) {
  state_ = State::kStart;
  return sent(send("REJECTED EXTERNAL\r\n"), why);
}

Authentication::Progress Authentication::follow(std::string_view line, std::string& why) {
  const std::string_view answer = takeWord(line);
  if (lines_ == 1 && answer == "DATA") return Progress::kMore;
  if (lines_ == 2 && answer == "OK") return Progress::kMore;
  // Whoever takes no descriptors says ERROR; only a call that carries one will then fail.
  if (lines_ == 3 && (answer == "AGREE_UNIX_FD" || answer == "ERROR")) return Progress::kDone;
  why = "the peer does not accept this process (" + std::string(answer.substr(0, 32)) + ")";
  return Progress::kFailed;
}

}  // namespace spacekeep::ipc
