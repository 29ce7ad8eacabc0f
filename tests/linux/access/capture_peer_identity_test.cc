#include "support/access/linux/capture_peer_identity.h"

#include <fcntl.h>
#include <grp.h>
#include <gtest/gtest.h>
#include <linux/filter.h>
#include <linux/seccomp.h>
#include <sys/prctl.h>
#include <sys/socket.h>
#include <sys/syscall.h>
#include <sys/un.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <cstddef>
#include <cstring>
#include <string>

#include "support/access/entitlement_rules.h"
#include "tests/helpers/threads/other_process.h"

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

/// A process that connects as another user.
class Visitor : public test::OtherProcess {
 public:
  Visitor(const Door& door, uid_t uid, gid_t gid, const std::vector<gid_t>& groups)
      : OtherProcess([&](int ready) {
          const bool changed = ::setgroups(groups.size(), groups.data()) == 0 &&
                               ::setgid(gid) == 0 && ::setuid(uid) == 0;
          if (!changed || door.enter() < 0) ::_exit(1);
          test::tellReady(ready);
        }) {}
};

/// Makes the kernel answer this process as one that does not know the socket option.
bool forgetOption(unsigned option) {
  std::array<sock_filter, 6> steps = {{
      BPF_STMT(BPF_LD | BPF_W | BPF_ABS, offsetof(seccomp_data, nr)),
      BPF_JUMP(BPF_JMP | BPF_JEQ | BPF_K, SYS_getsockopt, 0, 3),
      BPF_STMT(BPF_LD | BPF_W | BPF_ABS, offsetof(seccomp_data, args[2])),
      BPF_JUMP(BPF_JMP | BPF_JEQ | BPF_K, option, 0, 1),
      BPF_STMT(BPF_RET | BPF_K, SECCOMP_RET_ERRNO | ENOPROTOOPT),
      BPF_STMT(BPF_RET | BPF_K, SECCOMP_RET_ALLOW),
  }};
  const sock_fprog program{steps.size(), steps.data()};
  return ::prctl(PR_SET_NO_NEW_PRIVS, 1, 0, 0, 0) == 0 &&
         ::prctl(PR_SET_SECCOMP, SECCOMP_MODE_FILTER, &program) == 0;
}

/// Whether it holds of the identity that a kernel without the option tells of this process.
bool holdsWithoutOption(unsigned option, bool (*claim)(const PeerIdentity& identity)) {
  const Door door;
  const ipc::Descriptor entered(door.enter());
  const ipc::Descriptor accepted(door.accept());
  return test::holdsInAnotherProcess([&] {
    const auto identity = forgetOption(option) ? capturePeerIdentity(accepted.fd()) : nullptr;
    return identity != nullptr && claim(*identity);
  });
}

/// User 4711 may purge, the unit may not.
std::vector<Rule> rulesAgainstUnit(const std::string& unit) {
  Rule grant;
  grant.name = "grant";
  grant.users = {4711};
  grant.grants = {"PURGE_ENTITLEMENT"};
  Rule denial;
  denial.name = "deny";
  denial.units = {unit};
  denial.denies = grant.grants;
  return {grant, denial};
}

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
  EXPECT_FALSE(identity->unclear().groups);
}

TEST(CapturePeerIdentity, AProcessThatHasDiedMayBeOfADeniedUnit) {
  ASSERT_EQ(::geteuid(), 0U) << "this test changes users and has to run as root";
  const Door door;
  Visitor visitor(door, 4711, 4712, {});
  const ipc::Descriptor accepted(door.accept());
  visitor.end();
  const auto identity = capturePeerIdentity(accepted.fd());
  EXPECT_TRUE(identity->unclear().unit);
  const Verdict verdict = judge(rulesAgainstUnit("cache.service"), *identity, "PURGE_ENTITLEMENT");
  EXPECT_EQ(verdict.decision, Decision::kDenied);
  EXPECT_TRUE(verdict.open);
}

TEST(CapturePeerIdentity, AProcessThatLivesIsOfItsUnitOrOfNone) {
  ASSERT_EQ(::geteuid(), 0U) << "this test changes users and has to run as root";
  const Door door;
  const Visitor visitor(door, 4711, 4712, {});
  const ipc::Descriptor accepted(door.accept());
  const auto identity = capturePeerIdentity(accepted.fd());
  if (identity->pidfd() == nullptr) GTEST_SKIP() << "this kernel has no SO_PEERPIDFD";
  EXPECT_FALSE(identity->unclear().unit);
  EXPECT_FALSE(identity->unclear().groups);
  EXPECT_TRUE(judge(rulesAgainstUnit("no-such.service"), *identity, "PURGE_ENTITLEMENT").granted());
}

TEST(CapturePeerIdentity, WithoutAPidfdTheUnitIsUnclear) {
  constexpr unsigned kPeerPidfd = 77;
  EXPECT_TRUE(holdsWithoutOption(kPeerPidfd, [](const PeerIdentity& identity) {
    return identity.pidfd() == nullptr && identity.unclear().unit && !identity.unclear().groups;
  }));
}

TEST(CapturePeerIdentity, GroupsThatTheKernelDoesNotTellAreUnclear) {
  EXPECT_TRUE(holdsWithoutOption(SO_PEERGROUPS, [](const PeerIdentity& identity) {
    return identity.groups().empty() && identity.unclear().groups;
  }));
}

TEST(CapturePeerIdentity, ALabelThatTheKernelDoesNotTellIsUnclear) {
  EXPECT_TRUE(holdsWithoutOption(SO_PEERSEC, [](const PeerIdentity& identity) {
    return !identity.label() && identity.unclear().label && !identity.unclear().groups;
  }));
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
