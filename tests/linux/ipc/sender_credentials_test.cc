// Who a caller of the bus is, from the broker's answer.
#include "support/ipc/linux/sender_credentials.h"

#include <gtest/gtest.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <cstdint>
#include <functional>
#include <memory>
#include <string>

#include "support/ipc/linux/authenticated_bus.h"
#include "support/ipc/linux/owned_message.h"
#include "support/ipc/linux/sockets.h"

namespace spacekeep::ipc {
namespace {

class Credentials : public ::testing::Test {
 protected:
  Credentials() : bus_(makeAuthenticatedBus(pair_.first->fd()).bus) {}
  ~Credentials() override { sd_bus_close_unref(bus_); }

  /// From an answer that `fill` has put the entries into.
  std::shared_ptr<const access::PeerIdentity> identity(
      const std::function<void(sd_bus_message*)>& fill) {
    sd_bus_message* made = nullptr;
    EXPECT_GE(sd_bus_message_new_signal(bus_, &made, "/a", "a.b", "c"), 0);
    const OwnedMessage message(made);
    EXPECT_GE(sd_bus_message_open_container(made, 'a', "{sv}"), 0);
    fill(made);
    EXPECT_GE(sd_bus_message_close_container(made), 0);
    EXPECT_GE(sd_bus_message_seal(made, 1, 0), 0);
    return identityFromCredentials(made);
  }

  const SocketPair pair_ = makeSocketPair();
  sd_bus* bus_;
};

template <class... Parts>
void add(sd_bus_message* message, const char* key, const char* type, Parts... parts) {
  EXPECT_GE(sd_bus_message_append(message, "{sv}", key, type, parts...), 0);
}

TEST_F(Credentials, TheUserAndItsGroupsAreTaken) {
  const auto peer = identity([](sd_bus_message* answer) {
    add(answer, "UnixUserID", "u", 1000);
    add(answer, "ProcessID", "u", 4711);
    add(answer, "UnixGroupIDs", "au", 2, 50, 60);
  });
  ASSERT_NE(peer, nullptr);
  EXPECT_EQ(peer->uid(), 1000U);
  EXPECT_TRUE(peer->isMemberOf(50));
  EXPECT_TRUE(peer->isMemberOf(60));
  EXPECT_FALSE(peer->isMemberOf(0));
  EXPECT_FALSE(peer->unclear().groups);
  EXPECT_EQ(peer->describe(), "uid 1000 gid unknown pid 4711");
}

TEST_F(Credentials, WithoutTheUserThereIsNoIdentity) {
  EXPECT_EQ(identity([](sd_bus_message* answer) { add(answer, "ProcessID", "u", 4711); }), nullptr);
}

TEST_F(Credentials, AUserThatIsNoneIsNoIdentity) {
  EXPECT_EQ(identity([](sd_bus_message* answer) { add(answer, "UnixUserID", "u", UINT32_MAX); }),
            nullptr);
}

TEST_F(Credentials, AUserOfAnotherTypeIsNoIdentity) {
  EXPECT_EQ(identity([](sd_bus_message* answer) { add(answer, "UnixUserID", "s", "root"); }),
            nullptr);
}

TEST_F(Credentials, WhatIsMissingIsUnclear) {
  const auto peer = identity([](sd_bus_message* answer) { add(answer, "UnixUserID", "u", 7); });
  ASSERT_NE(peer, nullptr);
  EXPECT_TRUE(peer->unclear().groups);
  EXPECT_TRUE(peer->unclear().label);
  EXPECT_TRUE(peer->unclear().unit);
  EXPECT_FALSE(peer->isMemberOf(0));
  EXPECT_FALSE(peer->isMemberOf(7));
}

TEST_F(Credentials, TheLabelComesWithoutItsZero) {
  const auto peer = identity([](sd_bus_message* answer) {
    add(answer, "UnixUserID", "u", 7);
    add(answer, "LinuxSecurityLabel", "ay", 4, 'a', '_', 't', 0);
  });
  ASSERT_NE(peer, nullptr);
  EXPECT_EQ(peer->label(), "a_t");
  EXPECT_FALSE(peer->unclear().label);
}

/// With a label of that many letters.
std::function<void(sd_bus_message*)> labelOf(std::size_t letters) {
  return [letters](sd_bus_message* answer) {
    add(answer, "UnixUserID", "u", 7);
    const std::string label(letters, 'l');
    EXPECT_GE(sd_bus_message_open_container(answer, 'e', "sv"), 0);
    EXPECT_GE(sd_bus_message_append(answer, "s", "LinuxSecurityLabel"), 0);
    EXPECT_GE(sd_bus_message_open_container(answer, 'v', "ay"), 0);
    EXPECT_GE(sd_bus_message_append_array(answer, 'y', label.data(), label.size()), 0);
    EXPECT_GE(sd_bus_message_close_container(answer), 0);
    EXPECT_GE(sd_bus_message_close_container(answer), 0);
  };
}

TEST_F(Credentials, ALabelHasAtMostFourKibibytes) {
  const auto peer = identity(labelOf(4096));
  ASSERT_NE(peer, nullptr);
  EXPECT_EQ(peer->label(), std::string(4096, 'l'));
  EXPECT_EQ(identity(labelOf(4097)), nullptr);
}

TEST_F(Credentials, FactsThatNobodyKnowsAreSkipped) {
  const auto peer = identity([](sd_bus_message* answer) {
    add(answer, "Containers", "a{sv}", 1, "Name", "s", "box");
    add(answer, "UnixUserID", "u", 7);
  });
  ASSERT_NE(peer, nullptr);
  EXPECT_EQ(peer->uid(), 7U);
}

TEST_F(Credentials, AProcessByNumberAloneLeavesTheUnitUnclear) {
  const auto peer = identity([](sd_bus_message* answer) {
    add(answer, "UnixUserID", "u", 7);
    add(answer, "ProcessID", "u", static_cast<std::uint32_t>(::getpid()));
  });
  ASSERT_NE(peer, nullptr);
  EXPECT_TRUE(peer->unclear().unit);
  EXPECT_EQ(peer->pidfd(), nullptr);
}

TEST_F(Credentials, AProcessThatIsPassedOnMakesTheUnitClear) {
  const int pidfd = static_cast<int>(::syscall(SYS_pidfd_open, ::getpid(), 0));
  ASSERT_GE(pidfd, 0);
  const auto peer = identity([pidfd](sd_bus_message* answer) {
    add(answer, "UnixUserID", "u", 7);
    add(answer, "ProcessFD", "h", pidfd);
  });
  ::close(pidfd);
  ASSERT_NE(peer, nullptr);
  EXPECT_NE(peer->pidfd(), nullptr);
  EXPECT_FALSE(peer->unclear().unit);
}

TEST_F(Credentials, ADescriptorThatIsNoProcessLeavesTheUnitUnclear) {
  const auto peer = identity([](sd_bus_message* answer) {
    add(answer, "UnixUserID", "u", 7);
    add(answer, "ProcessFD", "h", STDIN_FILENO);
  });
  ASSERT_NE(peer, nullptr);
  EXPECT_TRUE(peer->unclear().unit);
  EXPECT_FALSE(peer->unit());
}

}  // namespace
}  // namespace spacekeep::ipc
