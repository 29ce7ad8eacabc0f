#include "support/ipc/linux/acceptor.h"

#include <fcntl.h>
#include <sys/epoll.h>
#include <sys/socket.h>
#include <systemd/sd-event.h>
#include <time.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <memory>
#include <utility>

#include "support/logging/log.h"

namespace spacekeep::ipc {

namespace {

// Then the open connections have their turn. More are waiting at once only when somebody connects as
// fast as it goes, so that a pause costs nobody else much.
constexpr int kConnectionsPerTurn = 4;
constexpr std::uint64_t kPauseBetweenTurnsNs = 1'000'000;

bool isShortage(int error) {
  return error == EMFILE || error == ENFILE || error == ENOBUFS || error == ENOMEM;
}

}  // namespace

Acceptor::Acceptor(IpcLoop& loop, SharedDescriptor listening, std::uint64_t pause_ns,
                   OnConnection on_connection)
    : loop_(loop),
      listening_(std::move(listening)),
      pause_ns_(pause_ns),
      on_connection_(std::move(on_connection)) {}

Acceptor::~Acceptor() {
  sd_event_source_disable_unref(readable_);
  sd_event_source_disable_unref(pause_);
}

bool Acceptor::start() {
  const int fd = listening_->fd();
  ::fcntl(fd, F_SETFL, ::fcntl(fd, F_GETFL) | O_NONBLOCK);
  // Peers that come and go must not hold up the calls of those that are there.
  return sd_event_add_io(loop_.event(), &readable_, fd, EPOLLIN, &Acceptor::onReadable, this) >=
             0 &&
         sd_event_source_set_priority(readable_, SD_EVENT_PRIORITY_IDLE) >= 0;
}

int Acceptor::onReadable(sd_event_source*, int, std::uint32_t, void* self) {
  static_cast<Acceptor*>(self)->acceptSome();
  return 0;
}

int Acceptor::onPauseEnd(sd_event_source*, std::uint64_t, void* self) {
  auto* acceptor = static_cast<Acceptor*>(self);
  acceptor->pause_ = sd_event_source_disable_unref(acceptor->pause_);
  sd_event_source_set_enabled(acceptor->readable_, SD_EVENT_ON);
  return 0;
}

void Acceptor::acceptSome() {
  for (int i = 0; i < kConnectionsPerTurn; ++i) {
    const int fd = ::accept4(listening_->fd(), nullptr, nullptr, SOCK_CLOEXEC | SOCK_NONBLOCK);
    if (fd >= 0) {
      on_connection_(std::make_shared<Descriptor>(fd));
      continue;
    }
    if (errno == EAGAIN) return;
    if (isShortage(errno)) {
      logProblem("%s Accepting pauses: %@", "SpacekeepListener", std::strerror(errno));
      return pause(pause_ns_);
    }
    // Anything else (accept(2) names network errors of the one connection) concerns one peer only.
  }
  pause(kPauseBetweenTurnsNs);
}

void Acceptor::pause(std::uint64_t duration_ns) {
  const std::uint64_t usec = std::max<std::uint64_t>(duration_ns / 1000, 1);
  // The accuracy is given, since 0 stands for a quarter of a second.
  if (sd_event_add_time_relative(loop_.event(), &pause_, CLOCK_MONOTONIC, usec, 1000,
                                 &Acceptor::onPauseEnd, this) >= 0) {
    sd_event_source_set_enabled(readable_, SD_EVENT_OFF);
  }
}

}  // namespace spacekeep::ipc
