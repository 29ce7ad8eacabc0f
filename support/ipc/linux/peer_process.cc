#include "support/ipc/linux/peer_process.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/epoll.h>
#include <sys/socket.h>
#include <sys/syscall.h>
#include <systemd/sd-event.h>
#include <time.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <filesystem>
#include <memory>
#include <optional>
#include <sstream>
#include <string>
#include <system_error>
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

/// 0 when it is not known.
pid_t peerPid(int socket) {
  ucred peer{};
  socklen_t length = sizeof peer;
  return ::getsockopt(socket, SOL_SOCKET, SO_PEERCRED, &peer, &length) == 0 ? peer.pid : 0;
}

/// Whether a thread has begun to exit, by the flags in its stat file (proc(5)); none when they cannot
/// be read. The kernel sets PF_EXITING before it closes the descriptors that the thread shares.
std::optional<bool> threadIsExiting(const std::string& directory) {
  constexpr unsigned long kExiting = 0x4;  // PF_EXITING of the kernel's sched.h
  const Descriptor file(::open((directory + "/stat").c_str(), O_RDONLY | O_CLOEXEC));
  std::array<char, 1024> bytes{};  // the flags come within the first hundred or so
  const ssize_t size = file.fd() < 0 ? -1 : ::read(file.fd(), bytes.data(), bytes.size());
  if (size <= 0) return std::nullopt;
  const std::string text(bytes.data(), static_cast<std::size_t>(size));
  // The name of the program stands in parentheses and may hold anything, these included.
  const std::size_t name_end = text.rfind(')');
  if (name_end == std::string::npos) return std::nullopt;
  std::istringstream fields(text.substr(name_end + 1));
  std::string skipped;
  for (int i = 0; i < 6; ++i) fields >> skipped;  // state to tpgid
  unsigned long flags = 0;
  if (!(fields >> flags)) return std::nullopt;
  return (flags & kExiting) != 0;
}

/// Whether the process has begun to exit; none when that cannot be read. The flags of a process are
/// those of its main thread, which may have ended for good while others work on, so that each is
/// looked at. One that has gone meanwhile has exited.
std::optional<bool> processIsExiting(pid_t pid) {
  const std::string directory = "/proc/" + std::to_string(pid);
  const std::optional<bool> of_main_thread = threadIsExiting(directory);
  if (of_main_thread != true) return of_main_thread;
  std::error_code problem;
  for (std::filesystem::directory_iterator threads(directory + "/task", problem), end;
       !problem && threads != end; threads.increment(problem)) {
    if (threadIsExiting(threads->path().string()) == false) return false;
  }
  return problem ? std::nullopt : of_main_thread;
}

}  // namespace

PeerProcess::~PeerProcess() { stopWatching(); }

void PeerProcess::remember(int socket) {
  const int pidfd = openPeerPidfd(socket);
  const int problem = errno;
  died_already_ = pidfd < 0 && problem == ESRCH;
  pid_ = peerPid(socket);
  if (pidfd >= 0) pidfd_ = std::make_shared<Descriptor>(pidfd);
}

void PeerProcess::whenKnown(std::uint64_t patience_ns, std::function<void(bool)> done) {
  done_ = std::move(done);
  if (pidfd_ == nullptr) return tell(died_already_);
  const std::optional<bool> is_exiting = pid_ > 0 ? processIsExiting(pid_) : std::nullopt;
  if (isDead(pidfd_->fd())) return tell(true);  // so that the number may be another one's by now
  if (is_exiting) return tell(*is_exiting);
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
