#include "support/access/linux/capture_peer_identity.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/socket.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <string>
#include <utility>

#include "support/access/cgroup_unit.h"
#include "support/access/fdinfo_pid.h"
#include "support/values/text.h"

namespace spacekeep::access {
namespace {

#ifdef SO_PEERPIDFD
constexpr int kPeerPidfd = SO_PEERPIDFD;
#else
constexpr int kPeerPidfd =
    77;  // Linux 6.5 and newer; asm-generic/socket.h, the same on x86 and ARM
#endif

constexpr std::size_t kMaxGroups = 65536;  // NGROUPS_MAX of the kernel
constexpr std::size_t kMaxLabel = 4096;
constexpr std::size_t kMaxProcFile = 16 * 1024;

/// Reads a socket option of variable length into elements of T, at most `limit`. None on failure.
template <class T>
std::optional<std::vector<T>> readOption(int fd, int option, std::size_t limit) {
  std::vector<T> elements(64);
  for (;;) {
    auto bytes = static_cast<socklen_t>(elements.size() * sizeof(T));
    const int result = ::getsockopt(fd, SOL_SOCKET, option, elements.data(), &bytes);
    const std::size_t needed = bytes / sizeof(T);
    if (result == 0) {
      elements.resize(needed < elements.size() ? needed : elements.size());
      return elements;
    }
    // ERANGE comes with the length that would do.
    if (errno != ERANGE || needed <= elements.size() || needed > limit) return std::nullopt;
    elements.resize(needed);
  }
}

std::optional<std::vector<std::uint32_t>> readGroups(int fd) {
  static_assert(sizeof(gid_t) == sizeof(std::uint32_t));
  return readOption<std::uint32_t>(fd, SO_PEERGROUPS, kMaxGroups);
}

std::optional<std::string> readLabel(int fd) {
  const auto bytes = readOption<char>(fd, SO_PEERSEC, kMaxLabel);
  if (!bytes) return std::nullopt;
  std::string label(bytes->begin(), bytes->end());
  // Some security modules count the terminator in, some end the label with a line break.
  while (!label.empty() && (label.back() == '\0' || label.back() == '\n')) label.pop_back();
  if (label.empty() || label.find('\0') != std::string::npos) return std::nullopt;
  return label;
}

ipc::SharedDescriptor readPidfd(int fd) {
  int pidfd = -1;
  socklen_t bytes = sizeof(pidfd);
  if (::getsockopt(fd, SOL_SOCKET, kPeerPidfd, &pidfd, &bytes) < 0) return nullptr;
  if (bytes != sizeof(pidfd) || pidfd < 0) return nullptr;
  return std::make_shared<ipc::Descriptor>(pidfd);
}

std::optional<std::string> readProcFile(const std::string& path) {
  const int fd = ::open(path.c_str(), O_RDONLY | O_CLOEXEC);
  if (fd < 0) return std::nullopt;
  const ipc::Descriptor file(fd);
  std::string text;
  std::array<char, 4096> buffer{};
  for (;;) {
    const ssize_t count = ::read(fd, buffer.data(), buffer.size());
    if (count < 0 && errno == EINTR) continue;
    if (count < 0) return std::nullopt;
    if (count == 0) return text;
    text.append(buffer.data(), static_cast<std::size_t>(count));
    if (text.size() > kMaxProcFile) return std::nullopt;
  }
}

/// As this /proc shows it. None once the process is gone.
std::optional<int> pidOf(int pidfd) {
  const auto text = readProcFile("/proc/self/fdinfo/" + std::to_string(pidfd));
  return text ? pidFromFdinfo(*text) : std::nullopt;
}

bool stillRuns(int pidfd) {
  pollfd exit_of_process{.fd = pidfd, .events = POLLIN, .revents = 0};
  return ::poll(&exit_of_process, 1, 0) == 0;
}

/// proc(5), /proc/pid/comm: up to 15 bytes of the process's own choice and a line break.
std::optional<std::string> programFromComm(const std::string& comm) {
  if (comm.empty() || comm == "\n") return std::nullopt;
  return lineOf(comm.ends_with('\n') ? comm.substr(0, comm.size() - 1) : comm);
}

std::optional<ucred> readCredentials(int fd) {
  ucred credentials{};
  socklen_t bytes = sizeof(credentials);
  if (::getsockopt(fd, SOL_SOCKET, SO_PEERCRED, &credentials, &bytes) < 0) return std::nullopt;
  if (bytes != sizeof(credentials)) return std::nullopt;
  // What a socket without a peer answers.
  if (credentials.uid == static_cast<uid_t>(-1) || credentials.gid == static_cast<gid_t>(-1)) {
    return std::nullopt;
  }
  return credentials;
}

}  // namespace

/// The number is read from the pidfd, and the pidfd is asked afterwards whether its process still
/// runs: only then cannot the number have passed on to another process while /proc was read.
bool addFactsOfProcess(PeerFacts& facts) {
  const auto pid = facts.pidfd == nullptr ? std::nullopt : pidOf(facts.pidfd->fd());
  if (!pid) return false;
  const std::string directory = "/proc/" + std::to_string(*pid);
  const auto cgroup = readProcFile(directory + "/cgroup");
  const auto comm = readProcFile(directory + "/comm");
  if (!stillRuns(facts.pidfd->fd())) return false;
  if (comm) facts.program = programFromComm(*comm);
  if (!cgroup || !tellsUnit(*cgroup)) return false;
  facts.unit = systemUnitFromCgroup(*cgroup);
  return true;
}

std::optional<uid_t> peerUid(int fd) {
  const auto credentials = readCredentials(fd);
  return credentials ? std::optional(credentials->uid) : std::nullopt;
}

std::shared_ptr<const PeerIdentity> capturePeerIdentity(int fd) {
  const auto credentials = readCredentials(fd);
  if (!credentials) return nullptr;
  auto groups = readGroups(fd);
  PeerFacts facts{.uid = credentials->uid,
                  .gid = credentials->gid,
                  .label = readLabel(fd),
                  .pid = credentials->pid,
                  .pidfd = readPidfd(fd)};
  // A process that ends in time would otherwise slip past a rule that denies its unit something.
  facts.unclear = {.groups = !groups, .label = !facts.label, .unit = !addFactsOfProcess(facts)};
  facts.groups = std::move(groups).value_or(std::vector<std::uint32_t>{});
  return std::make_shared<const PeerIdentity>(std::move(facts));
}

}  // namespace spacekeep::access
