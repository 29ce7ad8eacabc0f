#include "support/access/linux/capture_peer_identity.h"

#include <fcntl.h>
#include <grp.h>
#include <gtest/gtest.h>
#include <sys/prctl.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <cstring>
#include <string>

namespace spacekeep::access {
namespace {

/// A listening socket with a name that only this process knows.
class Door {
 public:
  Door() : fd_(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0)) {
    address_.sun_family = AF_UNIX;
    const std::string name = "spacekeep-test-" + std::to_string(::getpid());
    std::memcpy(address_.sun_path + 1, name.data(), name.size());
    bytes_ = static_cast<socklen_t>(offsetof(sockaddr_un, sun_path) + 1 + name.size());
    EXPECT_EQ(::bind(fd_, address(), bytes_), 0);
    EXPECT_EQ(::listen(fd_, 5), 0);
  }
  ~Door() { ::close(fd_); }
  [[nodiscard]] int accept() const { return ::accept4(fd_, nullptr, nullptr, SOCK_CLOEXEC); }
  /// Only what may be called after a fork.
  [[nodiscard]] int enter() const {
    const int fd = ::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
    return ::connect(fd, address(), bytes_) == 0 ? fd : -1;
  }

 private:
  [[nodiscard]] const sockaddr* address() const {
    return reinterpret_cast<const sockaddr*>(&address_);
  }
  const int fd_;
  sockaddr_un address_{};
  socklen_t bytes_ = 0;
};

/// A process that connects as another user and then waits to be told to end.
class Visitor {
 public:
  Visitor(const Door& door, uid_t uid, gid_t gid, const std::vector<gid_t>& groups) {
    pid_ = ::fork();
    if (pid_ != 0) return;
    const bool changed =
        ::setgroups(groups.size(), groups.data()) == 0 && ::setgid(gid) == 0 && ::setuid(uid) == 0;
    const int fd = changed ? door.enter() : -1;
    char byte = 0;
    (void)!::read(fd, &byte, 1);  // until the other end is closed
    ::_exit(fd < 0 ? 1 : 0);
  }
  ~Visitor() { end(); }
  [[nodiscard]] pid_t pid() const { return pid_; }
  void end() {
    if (pid_ > 0) {
      ::kill(pid_, SIGKILL);
      ::waitpid(pid_, nullptr, 0);
    }
    pid_ = -1;
  }

 private:
  pid_t pid_ = -1;
};

TEST(CapturePeerIdentity, AnotherUserWithGroups) {
  ASSERT_EQ(::geteuid(), 0U) << "this test changes users and has to run as root";
  const Door door;
  const Visitor visitor(door, 4711, 4712, {4713, 4714});
  const ipc::Descriptor accepted(door.accept());
  const auto identity = capturePeerIdentity(accepted.fd());
  ASSERT_NE(identity, nullptr);
  EXPECT_EQ(identity->uid(), 4711U);
  EXPECT_EQ(identity->gid(), 4712U);
  EXPECT_EQ(identity->groups(), (std::vector<std::uint32_t>{4713, 4714}));
  EXPECT_TRUE(identity->isMemberOf(4712));
  EXPECT_TRUE(identity->isMemberOf(4714));
  EXPECT_FALSE(identity->isMemberOf(0));
  EXPECT_EQ(identity->pid(), visitor.pid());
}

TEST(CapturePeerIdentity, ManyGroups) {
  ASSERT_EQ(::geteuid(), 0U) << "this test changes users and has to run as root";
  std::vector<gid_t> groups;
  for (gid_t group = 5000; group < 5300; ++group) groups.push_back(group);
  const Door door;
  const Visitor visitor(door, 4711, 4712, groups);
  const ipc::Descriptor accepted(door.accept());
  EXPECT_EQ(capturePeerIdentity(accepted.fd())->groups(), groups);
}

TEST(CapturePeerIdentity, TheIdentityStaysWhenTheProcessHasDied) {
  ASSERT_EQ(::geteuid(), 0U) << "this test changes users and has to run as root";
  const Door door;
  Visitor visitor(door, 4711, 4712, {});
  const ipc::Descriptor accepted(door.accept());
  visitor.end();
  const auto identity = capturePeerIdentity(accepted.fd());
  ASSERT_NE(identity, nullptr);
  EXPECT_EQ(identity->uid(), 4711U);
  EXPECT_EQ(identity->unit(), std::nullopt) << "a dead process has no unit";
  EXPECT_EQ(identity->program(), std::nullopt) << "and no name";
}

TEST(CapturePeerIdentity, TheProgramIsWhatTheProcessCallsItselfOnOneLine) {
  std::array<char, 16> own{};
  ASSERT_EQ(::prctl(PR_GET_NAME, own.data()), 0);
  ASSERT_EQ(::prctl(PR_SET_NAME, "a\nb\x01"), 0);
  const Door door;
  const ipc::Descriptor entered(door.enter());
  const ipc::Descriptor accepted(door.accept());
  const auto identity = capturePeerIdentity(accepted.fd());
  ASSERT_EQ(::prctl(PR_SET_NAME, own.data()), 0);
  EXPECT_EQ(identity->program(), "a\\nb\\x01");
}

TEST(CapturePeerIdentity, ThePidfdIsOfTheVeryProcessAndNotInherited) {
  const Door door;
  const ipc::Descriptor entered(door.enter());
  const ipc::Descriptor accepted(door.accept());
  const auto identity = capturePeerIdentity(accepted.fd());
  ASSERT_NE(identity->pidfd(), nullptr) << "kernels of 6.5 and newer have SO_PEERPIDFD";
  EXPECT_NE(::fcntl(identity->pidfd()->fd(), F_GETFD) & FD_CLOEXEC, 0);
}

TEST(CapturePeerIdentity, AListeningOrUnconnectedSocketOrAPipeIsNobody) {
  const ipc::Descriptor lonely(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
  EXPECT_EQ(capturePeerIdentity(lonely.fd()), nullptr);
  std::array<int, 2> ends{};
  ASSERT_EQ(::pipe2(ends.data(), O_CLOEXEC), 0);
  const ipc::Descriptor reader(ends[0]);
  const ipc::Descriptor writer(ends[1]);
  EXPECT_EQ(capturePeerIdentity(reader.fd()), nullptr);
  EXPECT_EQ(capturePeerIdentity(-1), nullptr);
}

}  // namespace
}  // namespace spacekeep::access
