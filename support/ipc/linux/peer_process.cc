#include "support/ipc/linux/peer_process.h"

#include <poll.h>
#include <sys/epoll.h>
#include <sys/socket.h>
#include <sys/syscall.h>
#include <systemd/sd-event.h>
#include <time.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <memory>
#include <utility>

namespace spacekeep::ipc {

namespace {

// Linux 6.5, missing from older headers.
constexpr int kSoPeerPidfd = 77;

/// A descriptor of the process, -1 with errno when there is none.
int openPeerPidfd(int socket) {
  int pidfd = -1;
  socklen_t length = sizeof pidfd;
  if (::getsockopt(socket, SOL_SOCKET, kSoPeerPidfd, &pidfd, &length) == 0) return pidfd;
  if (errno != ENOPROTOOPT) return -1;
  // An older kernel: by number. That is no proof of identity, but here only the end of a
  // connection is given its name by it.
  ucred peer{};
  length = sizeof peer;
  if (::getsockopt(socket, SOL_SOCKET, SO_PEERCRED, &peer, &length) != 0) return -1;
  return static_cast<int>(::syscall(SYS_pidfd_open, peer.pid, 0));
}

bool isDead(int pidfd) {
  pollfd state = {pidfd, POLLIN, 0};
  return ::poll(&state, 1, 0) > 0;
}

}  // namespace

PeerProcess::~PeerProcess() { stopWatching(); }

void PeerProcess::remember(int socket) {
  const int pidfd = openPeerPidfd(socket);
  died_already_ = pidfd < 0 && errno == ESRCH;
  if (pidfd >= 0) pidfd_ = std::make_shared<Descriptor>(pidfd);
}

void PeerProcess::whenKnown(std::uint64_t patience_ns, std::function<void(bool)> done) {
  done_ = std::move(done);
  if (pidfd_ == nullptr) {
    tell(died_already_);
    return;
  }
  const std::uint64_t patience_usec = std::max<std::uint64_t>(patience_ns / 1000, 1);
  if (sd_event_add_io(loop_.event(), &death_, pidfd_->fd(), EPOLLIN, &PeerProcess::onDeath, this) <
          0 ||
      sd_event_add_time_relative(loop_.event(), &patience_, CLOCK_MONOTONIC, patience_usec, 1000,
                                 &PeerProcess::onPatienceEnd, this) < 0) {
    tell(false);
  }
}

void PeerProcess::forget() {
  stopWatching();
  done_ = nullptr;
  pidfd_ = nullptr;
}

int PeerProcess::onDeath(sd_event_source*, int, std::uint32_t, void* self) {
  static_cast<PeerProcess*>(self)->tell(true);
  return 0;
}

// Where this thread had to wait for its turn, both have happened, and the death may be told second.
int PeerProcess::onPatienceEnd(sd_event_source*, std::uint64_t, void* self) {
  auto* process = static_cast<PeerProcess*>(self);
  process->tell(isDead(process->pidfd_->fd()));
  return 0;
}

void PeerProcess::tell(bool died) {
  stopWatching();
  pidfd_ = nullptr;
  if (const auto done = std::exchange(done_, nullptr)) done(died);
}

void PeerProcess::stopWatching() {
  death_ = sd_event_source_disable_unref(death_);
  patience_ = sd_event_source_disable_unref(patience_);
}

}  // namespace spacekeep::ipc
