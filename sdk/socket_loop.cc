#include "sdk/socket_loop.h"

#include <fcntl.h>
#include <fmt/core.h>
#include <sys/socket.h>
#include <unistd.h>

#include <algorithm>
#include <utility>

#include "sdk/daemon_account.h"
#include "support/access/peer_identity.h"
#include "support/ipc/linux/bus_server.h"
#include "support/ipc/linux/sockets.h"

namespace spacekeep::sdk {
namespace {

bool hasSocketOption(int fd, int option, int wanted) {
  int value = 0;
  socklen_t size = sizeof value;
  return getsockopt(fd, SOL_SOCKET, option, &value, &size) == 0 && value == wanted;
}

bool isListeningUnixStream(int fd) {
  return hasSocketOption(fd, SO_DOMAIN, AF_UNIX) && hasSocketOption(fd, SO_TYPE, SOCK_STREAM) &&
         hasSocketOption(fd, SO_ACCEPTCONN, 1);
}

/// Who is let in counts as activity: its first call may not have been read yet when the time of
/// idleness is over.
std::function<bool(ipc::PeerConnection&, std::string&)> admission(
    std::optional<uid_t> allowed, std::shared_ptr<ServedService> served) {
  return [allowed, served = std::move(served), own = geteuid(),
          daemon = accountNumber(kDaemonAccount)](ipc::PeerConnection& peer, std::string& why) {
    const uid_t uid = peer.identity().uid();
    if (mayCall(uid, own, allowed) || uid == daemon) {
      served->noteCall();
      return true;
    }
    why = fmt::format("uid {} may not call this service", uid);
    return false;
  };
}

}  // namespace

bool mayCall(uid_t peer, uid_t own, std::optional<uid_t> allowed) {
  return peer == 0 || peer == own || peer == allowed;
}

Result<ipc::SharedDescriptor> listeningSocket(const SocketOptions& options) {
  if (options.listening_fd) {
    const int fd = *options.listening_fd;
    if (isListeningUnixStream(fd) && fcntl(fd, F_SETFL, O_NONBLOCK) == 0) {
      ipc::takeOverListening(fd);
      return std::make_shared<ipc::Descriptor>(fd);
    }
    return Error{ErrorKind::kInvalidArgument,
                 fmt::format("descriptor {} is not a listening unix stream socket", fd)};
  }
  if (auto handed = ipc::listeningSocketFromServiceManager()) return handed;
  return Error{
      ErrorKind::kInvalidArgument,
      "the service manager handed over no listening socket (LISTEN_PID, LISTEN_FDS); start "
      "this service through its socket unit, or name a descriptor"};
}

SocketLoop::SocketLoop(ipc::SharedDescriptor listening, SocketOptions options, Engine& engine,
                       std::shared_ptr<HostControl> control, std::shared_ptr<ServedService> served)
    : listening_(std::move(listening)),
      options_(std::move(options)),
      engine_(engine),
      control_(std::move(control)),
      served_(std::move(served)) {}

void SocketLoop::run() {
  ipc::ServerOptions options;
  options.limits.connections = 16;
  options.admit = admission(options_.allowed_uid, served_);
  ipc::BusServer server(engine_.loop, engine_.queue, served_->interface(), std::move(options));
  server.serveListening(listening_);
  control_->report(HostState::kServing);
  if (options_.stop_when_idle) {
    waitForIdleness();
  } else {
    control_->waitUntil(rt::kNever, [] { return false; });
  }
  served_->cancelAll();
}

void SocketLoop::waitForIdleness() {
  const auto patience = options_.stop_when_idle.value_or(std::chrono::milliseconds(0));
  const auto idle_ms = std::max<std::int64_t>(0, patience.count());
  const std::uint64_t idle_ns = static_cast<std::uint64_t>(idle_ms) * 1'000'000;
  while (!control_->stopping()) {
    const auto before = served_->activity();
    control_->waitUntil(rt::deadlineAfterNs(idle_ns), [] { return false; });
    const auto after = served_->activity();
    const bool idle = before.pending == 0 && after.pending == 0 &&
                      before.last_call_ticks == after.last_call_ticks;
    if (idle) return;
  }
}

}  // namespace spacekeep::sdk
