#include "tests/linux/system/raw_peer.h"

#include <poll.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <cstdint>
#include <cstdio>
#include <cstring>
#include <utility>

namespace spacekeep::system_test {
namespace {

void pad(std::string& bytes, std::size_t alignment) {
  while (bytes.size() % alignment != 0) bytes.push_back('\0');
}

void putUint32(std::string& bytes, std::uint32_t number) {
  pad(bytes, 4);
  for (unsigned shift = 0; shift < 32; shift += 8) {
    bytes.push_back(static_cast<char>((number >> shift) & 0xff));
  }
}

void putString(std::string& bytes, std::string_view text) {
  putUint32(bytes, static_cast<std::uint32_t>(text.size()));
  bytes.append(text);
  bytes.push_back('\0');
}

void putSignature(std::string& bytes, std::string_view signature) {
  bytes.push_back(static_cast<char>(signature.size()));
  bytes.append(signature);
  bytes.push_back('\0');
}

/// One header field: its code, and a string-like value of type `type`.
void putField(std::string& fields, char code, char type, std::string_view value) {
  pad(fields, 8);
  fields.push_back(code);
  putSignature(fields, std::string_view(&type, 1));
  type == 'g' ? putSignature(fields, value) : putString(fields, value);
}

std::string header(std::string_view member, std::string_view signature, std::uint32_t body_length,
                   std::string_view sender) {
  std::string fields;
  putField(fields, 1, 'o', "/com/quorvel/Spacekeep");
  putField(fields, 2, 's', "com.quorvel.SpacekeepClientProtocol");
  putField(fields, 3, 's', member);
  if (!signature.empty()) putField(fields, 8, 'g', signature);
  if (!sender.empty()) putField(fields, 7, 's', sender);
  std::string bytes = {'l', 1, 0, 1};
  putUint32(bytes, body_length);
  putUint32(bytes, 7);  // serial
  putUint32(bytes, static_cast<std::uint32_t>(fields.size()));
  bytes += fields;
  pad(bytes, 8);
  return bytes;
}

}  // namespace

RawPeer::RawPeer(const std::string& socket_path) {
  fd_ = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0);
  sockaddr_un address = {};
  address.sun_family = AF_UNIX;
  std::snprintf(address.sun_path, sizeof address.sun_path, "%s", socket_path.c_str());
  if (connect(fd_, reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0) {
    close(fd_);
    fd_ = -1;
  }
}

RawPeer::RawPeer(RawPeer&& other) noexcept : fd_(std::exchange(other.fd_, -1)) {}

RawPeer::~RawPeer() {
  if (fd_ >= 0) close(fd_);
}

std::size_t RawPeer::send(std::string_view bytes) const {
  std::size_t sent = 0;
  while (sent < bytes.size()) {
    const ssize_t written = ::send(fd_, bytes.data() + sent, bytes.size() - sent, MSG_NOSIGNAL);
    if (written > 0) {
      sent += static_cast<std::size_t>(written);
      continue;
    }
    pollfd waiting = {fd_, POLLOUT, 0};
    if (errno != EAGAIN || poll(&waiting, 1, 200) <= 0) return sent;
  }
  return sent;
}

void RawPeer::authenticate() const {
  send(std::string_view("\0AUTH EXTERNAL 30\r\nNEGOTIATE_UNIX_FD\r\nBEGIN\r\n", 45));
  std::string answers;
  while (answers.find("AGREE_UNIX_FD\r\n") == std::string::npos) {
    const std::string more = receive();
    if (more.empty()) return;
    answers += more;
  }
}

bool RawPeer::closedByPeer() const {
  char buffer[4096];
  for (int i = 0; i < 100; ++i) {
    pollfd waiting = {fd_, POLLIN, 0};
    if (poll(&waiting, 1, 100) <= 0) continue;
    const ssize_t got = recv(fd_, buffer, sizeof buffer, 0);
    if (got == 0 || (got < 0 && errno != EAGAIN)) return true;
  }
  return false;
}

std::string RawPeer::receive() const {
  std::string all;
  char buffer[65536];
  pollfd waiting = {fd_, POLLIN, 0};
  for (int patience_ms = 2000; poll(&waiting, 1, patience_ms) > 0; patience_ms = 0) {
    const ssize_t got = recv(fd_, buffer, sizeof buffer, 0);
    if (got <= 0) break;
    all.append(buffer, static_cast<std::size_t>(got));
  }
  return all;
}

std::string methodCall(std::string_view member, std::string_view signature, std::string_view body,
                       std::string_view sender) {
  return header(member, signature, static_cast<std::uint32_t>(body.size()), sender) +
         std::string(body);
}

std::string callClaiming(std::string_view member, std::string_view signature,
                         std::uint32_t body_length) {
  return header(member, signature, body_length, {});
}

std::string nestedVariants(int depth) {
  std::string body;
  putUint32(body, 0);  // length of the array, filled in below
  pad(body, 8);
  const std::size_t start = body.size();
  putString(body, "deep");
  for (int i = 1; i < depth; ++i) putSignature(body, "v");
  putSignature(body, "y");
  body.push_back('x');
  const auto length = static_cast<std::uint32_t>(body.size() - start);
  for (unsigned i = 0; i < 4; ++i) body[i] = static_cast<char>((length >> (8 * i)) & 0xff);
  return body;
}

}  // namespace spacekeep::system_test
