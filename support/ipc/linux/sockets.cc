#include "support/ipc/linux/sockets.h"

#include <poll.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <systemd/sd-daemon.h>
#include <unistd.h>

#include <cerrno>
#include <cstddef>
#include <cstring>
#include <memory>
#include <optional>
#include <string_view>

namespace spacekeep::ipc {

namespace {

struct UnixAddress {
  sockaddr_un address{};
  socklen_t length = 0;
  [[nodiscard]] const sockaddr* get() const {
    return reinterpret_cast<const sockaddr*>(&address);  // NOLINT: sockets API
  }
};

std::optional<UnixAddress> addressOf(const std::string& path) {
  UnixAddress result;
  if (path.empty() || path.size() >= sizeof result.address.sun_path) return std::nullopt;
  result.address.sun_family = AF_UNIX;
  std::memcpy(result.address.sun_path, path.c_str(), path.size() + 1);
  result.length = static_cast<socklen_t>(offsetof(sockaddr_un, sun_path) + path.size() + 1);
  return result;
}

std::string failure(std::string_view what, const std::string& path) {
  return std::string(what) + " " + path + ": " + std::strerror(errno);
}

SharedDescriptor newSocket() {
  const int fd = ::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0);
  return fd < 0 ? nullptr : std::make_shared<Descriptor>(fd);
}

/// Answers true when nothing stands at `path`, or a socket stood there that nobody serves.
bool clearPath(const std::string& path, std::string& why) {
  struct stat status {};
  if (::lstat(path.c_str(), &status) != 0) return errno == ENOENT;
  if (!S_ISSOCK(status.st_mode)) {
    why = path + " exists and is not a socket; remove it";
    return false;
  }
  std::string ignored;
  if (connectSocket(path, ignored) != nullptr || errno == EAGAIN) {
    why = path + " is served by another process already";
    return false;
  }
  return ::unlink(path.c_str()) == 0 || errno == ENOENT;
}

bool isUnixStreamSocket(int fd) {
  int domain = 0;
  int type = 0;
  socklen_t length = sizeof domain;
  if (::getsockopt(fd, SOL_SOCKET, SO_DOMAIN, &domain, &length) != 0) return false;
  length = sizeof type;
  if (::getsockopt(fd, SOL_SOCKET, SO_TYPE, &type, &length) != 0) return false;
  return domain == AF_UNIX && type == SOCK_STREAM;
}

/// The address of the peer as in sun_path; none when not connected; empty for a socket pair.
std::optional<std::string> peerAddress(int fd) {
  UnixAddress peer;
  peer.length = sizeof peer.address;
  auto* generic = reinterpret_cast<sockaddr*>(&peer.address);  // NOLINT: sockets API
  if (::getpeername(fd, generic, &peer.length) != 0) return std::nullopt;
  if (peer.length <= offsetof(sockaddr_un, sun_path)) return "";
  const std::size_t size = peer.length - offsetof(sockaddr_un, sun_path);
  return std::string(peer.address.sun_path, ::strnlen(peer.address.sun_path, size));
}

bool hasHungUp(int fd) {
  pollfd state{fd, POLLRDHUP, 0};
  if (::poll(&state, 1, 0) < 0) return true;
  return (state.revents & (POLLHUP | POLLRDHUP | POLLERR | POLLNVAL)) != 0;
}

bool peerIsThisProcess(int fd) {
  ucred peer{};
  socklen_t length = sizeof peer;
  if (::getsockopt(fd, SOL_SOCKET, SO_PEERCRED, &peer, &length) != 0) return true;
  return peer.pid == ::getpid();
}

}  // namespace

SharedDescriptor bindListeningSocket(const std::string& path, mode_t mode, std::string& why) {
  const auto address = addressOf(path);
  if (!address) {
    why = "\"" + path + "\" is no path for a socket: it must have 1 to 107 bytes";
    return nullptr;
  }
  if (!clearPath(path, why)) {
    if (why.empty()) why = failure("cannot replace", path);
    return nullptr;
  }
  SharedDescriptor listening = newSocket();
  // The permissions are set on the socket before it gets its name, so that it never stands there
  // with others (they are cut by the umask, hence once more by path).
  if (listening == nullptr || ::fchmod(listening->fd(), mode) != 0 ||
      ::bind(listening->fd(), address->get(), address->length) != 0 ||
      ::chmod(path.c_str(), mode) != 0 || ::listen(listening->fd(), SOMAXCONN) != 0) {
    why = failure("cannot listen at", path);
    return nullptr;
  }
  return listening;
}

SharedDescriptor listeningSocketFromServiceManager() {
  const int count = sd_listen_fds(1);
  SharedDescriptor found;
  for (int fd = SD_LISTEN_FDS_START; fd < SD_LISTEN_FDS_START + count; ++fd) {
    if (sd_is_socket_unix(fd, SOCK_STREAM, 1, nullptr, 0) <= 0) continue;
    if (found == nullptr) found = std::make_shared<Descriptor>(fd);
  }
  if (found != nullptr) takeOverListening(found->fd());
  return found;
}

// It goes on listening when this fails. The backlog cannot be read, so it becomes the largest.
void takeOverListening(int fd) { static_cast<void>(::listen(fd, SOMAXCONN)); }

SharedDescriptor connectSocket(const std::string& path, std::string& why) {
  const auto address = addressOf(path);
  if (!address) {
    errno = ENAMETOOLONG;
    why = failure("cannot connect to", path);
    return nullptr;
  }
  SharedDescriptor connected = newSocket();
  if (connected == nullptr || ::connect(connected->fd(), address->get(), address->length) != 0) {
    const int error = errno;
    why = failure("cannot connect to", path);
    connected = nullptr;
    errno = error;
  }
  return connected;
}

std::string endpointProblem(int fd, const EndpointRules& rules) {
  if (!isUnixStreamSocket(fd)) return "it is not a unix stream socket";
  const auto peer = peerAddress(fd);
  if (!peer) return "it is not connected";
  if (hasHungUp(fd)) return "its other end is closed";
  if (!rules.own_address.empty() && *peer == rules.own_address) {
    return "its other end is this process's own socket";
  }
  if (rules.refuse_own_process && peerIsThisProcess(fd)) return "its other end is this process";
  return "";
}

SocketPair makeSocketPair() {
  int fds[2] = {-1, -1};
  if (::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0, fds) != 0) return {};
  return {std::make_shared<Descriptor>(fds[0]), std::make_shared<Descriptor>(fds[1])};
}

}  // namespace spacekeep::ipc
