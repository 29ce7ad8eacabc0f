// What is said of the next message in a socket, and that looking takes nothing out of it.
#include "support/ipc/linux/look_ahead.h"

#include <gtest/gtest.h>
#include <sys/ioctl.h>
#include <sys/socket.h>

#include <cstring>
#include <string>
#include <string_view>

#include "tests/linux/ipc/bus_world.h"

namespace spacekeep::ipc::test {
namespace {

using Kind = NextMessage::Kind;

constexpr std::size_t kMostBytes = 4096;

class LookAhead : public ::testing::Test {
 protected:
  void arrives(std::string_view bytes) {
    ASSERT_EQ(::send(pair_.second->fd(), bytes.data(), bytes.size(), MSG_NOSIGNAL), bytes.size());
    sent_ += bytes.size();
  }

  void arrivesWithADescriptor(std::string_view bytes) {
    const int passed = pair_.second->fd();
    iovec part{.iov_base = const_cast<char*>(bytes.data()), .iov_len = bytes.size()};
    alignas(cmsghdr) char control[CMSG_SPACE(sizeof(int))] = {};
    msghdr message{};
    message.msg_iov = &part;
    message.msg_iovlen = 1;
    message.msg_control = control;
    message.msg_controllen = sizeof(control);
    cmsghdr* header = CMSG_FIRSTHDR(&message);
    header->cmsg_level = SOL_SOCKET;
    header->cmsg_type = SCM_RIGHTS;
    header->cmsg_len = CMSG_LEN(sizeof(int));
    std::memcpy(CMSG_DATA(header), &passed, sizeof(int));
    ASSERT_EQ(::sendmsg(pair_.second->fd(), &message, MSG_NOSIGNAL), bytes.size());
    sent_ += bytes.size();
  }

  NextMessage look(Traffic traffic, DescriptorsFrom descriptors = DescriptorsFrom::kNobody) {
    const int socket = pair_.first->fd();
    NextMessage next = lookAhead(
        socket, {.traffic = traffic, .descriptors = descriptors, .message_bytes = kMostBytes});
    int left = -1;
    EXPECT_EQ(::ioctl(socket, FIONREAD, &left), 0);
    EXPECT_EQ(left, sent_) << "something was taken out of the socket";
    return next;
  }
  NextMessage lookAtPeer(DescriptorsFrom descriptors = DescriptorsFrom::kNobody) {
    return look(Traffic::kOfOnePeer, descriptors);
  }

  void closes() { pair_.second.reset(); }

 private:
  SocketPair pair_ = makeSocketPair();
  std::size_t sent_ = 0;
};

std::string call() { return RawMessage().callOf("number").bytes(); }

TEST_F(LookAhead, WhereNothingHasArrivedThereIsNothing) {
  EXPECT_EQ(lookAtPeer().kind, Kind::kNothing);
}

TEST_F(LookAhead, BehindTheLastByteThePeerHasLeft) {
  closes();
  EXPECT_EQ(lookAtPeer().kind, Kind::kPeerLeft);
}

TEST_F(LookAhead, ThePartOfAHeaderIsAwaited) {
  arrives(call().substr(0, kWireFixedBytes - 1));
  EXPECT_EQ(lookAtPeer().kind, Kind::kIncomplete);
  arrives(call().substr(kWireFixedBytes - 1, 1));
  const NextMessage next = lookAtPeer();
  EXPECT_EQ(next.kind, Kind::kMessage);
  EXPECT_EQ(next.bytes, call().size());
}

TEST_F(LookAhead, OverABusTheWholeHeaderIsAwaited) {
  arrives(call().substr(0, call().size() - 1));
  EXPECT_EQ(look(Traffic::kOfABus).kind, Kind::kIncomplete);
  arrives(call().substr(call().size() - 1));
  EXPECT_EQ(look(Traffic::kOfABus).kind, Kind::kMessage);
}

TEST_F(LookAhead, WhatIsNoMessageIsRefused) {
  arrives("GET / HTTP/1.1\r\n\r\n");
  const NextMessage next = lookAtPeer();
  EXPECT_EQ(next.kind, Kind::kRefused);
  EXPECT_EQ(next.problem, "it sent something that is no D-Bus message");
}

TEST_F(LookAhead, ATypeThatNobodyKnowsIsRefusedFromAPeerAndLeftOutOverABus) {
  arrives(RawMessage().callOf("number").bytes(kWireSignal + 1));
  EXPECT_EQ(lookAtPeer().kind, Kind::kRefused);
  EXPECT_EQ(look(Traffic::kOfABus).kind, Kind::kLeftOut);
}

TEST_F(LookAhead, AMessageOfTheLargestSizeIsTaken) {
  const std::string largest = RawMessage().callOf("number").bytes(
      kWireCall, 7, std::string(kMostBytes - call().size(), 'x'));
  arrives(largest);
  EXPECT_EQ(lookAtPeer().kind, Kind::kMessage);
  EXPECT_EQ(look(Traffic::kOfABus).kind, Kind::kMessage);
}

TEST_F(LookAhead, AMessageOfAByteTooMuchIsRefusedFromAPeerAndLeftOutOverABus) {
  arrives(RawMessage().callOf("number").bytes(kWireCall, 7,
                                              std::string(kMostBytes - call().size() + 1, 'x')));
  const NextMessage next = lookAtPeer();
  EXPECT_EQ(next.kind, Kind::kRefused);
  EXPECT_EQ(next.problem, "it sent a message of 4097 bytes, more than 4096");
  const NextMessage of_a_bus = look(Traffic::kOfABus);
  EXPECT_EQ(of_a_bus.kind, Kind::kLeftOut);
  EXPECT_EQ(of_a_bus.left_out.bytes, kMostBytes + 1);
  ASSERT_TRUE(of_a_bus.left_out.header);
  EXPECT_EQ(of_a_bus.left_out.header->member, "number");
}

/// With a body of four bytes, the number of its descriptor.
std::string callWithADescriptor(std::uint32_t announced) {
  return RawMessage()
      .callOf("takeDescriptor")
      .text(8, 'g', "h")
      .number(9, announced)
      .bytes(kWireCall, 7, std::string(4, '\0'));
}

TEST_F(LookAhead, ADescriptorIsRefusedWhereNobodyMaySendSome) {
  arrivesWithADescriptor(callWithADescriptor(1));
  const NextMessage next = lookAtPeer(DescriptorsFrom::kNobody);
  EXPECT_EQ(next.kind, Kind::kRefused);
  EXPECT_EQ(next.problem, "it sent a descriptor with an answer");
}

TEST_F(LookAhead, ADescriptorOfATrustedPeerIsLeftToTheReader) {
  arrivesWithADescriptor(callWithADescriptor(2));
  EXPECT_EQ(lookAtPeer(DescriptorsFrom::kAnybody).kind, Kind::kMessage);
}

TEST_F(LookAhead, ADescriptorThatComesWithACallIsTakenWhereCallsMayBringSome) {
  arrivesWithADescriptor(callWithADescriptor(1));
  EXPECT_EQ(lookAtPeer(DescriptorsFrom::kCalls).kind, Kind::kDescriptors);
}

TEST_F(LookAhead, ADescriptorThatTheCallDoesNotAnnounceIsRefused) {
  arrivesWithADescriptor(callWithADescriptor(2));
  const NextMessage next = lookAtPeer(DescriptorsFrom::kCalls);
  EXPECT_EQ(next.kind, Kind::kRefused);
  EXPECT_EQ(next.problem, "it sent a descriptor with a broken message");
}

std::string answerOf(std::string_view sender) {
  return RawMessage().number(5, 2).text(7, 's', sender).number(9, 1).bytes(kWireReturn);
}

TEST_F(LookAhead, OverABusOnlyTheBrokersAnswerMayBringDescriptors) {
  arrivesWithADescriptor(answerOf(kBrokerName));
  EXPECT_EQ(look(Traffic::kOfABus).kind, Kind::kDescriptors);
}

TEST_F(LookAhead, OverABusADescriptorOfAnybodyElseIsLeftOut) {
  arrivesWithADescriptor(answerOf(":1.5"));
  const NextMessage next = look(Traffic::kOfABus);
  EXPECT_EQ(next.kind, Kind::kLeftOut);
  EXPECT_TRUE(next.left_out.brings_descriptors);
}

}  // namespace
}  // namespace spacekeep::ipc::test
