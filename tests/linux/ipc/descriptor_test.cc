// Descriptors that peers pass: the good one, and all that reach their handler with a problem only.
#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/socket.h>
#include <unistd.h>

#include "tests/linux/ipc/ipc_world.h"

namespace spacekeep::ipc::test {
namespace {

/// What is wrong with the descriptor, as the handler sees it; empty for nothing.
std::string problemOf(TestServer& server, const SharedDescriptor& descriptor) {
  const Outcome outcome =
      callAndWait(server.connect(), "takeDescriptor", {descriptor, std::string("text")});
  EXPECT_TRUE(outcome.reply);
  const SharedDescriptor taken = server.descriptor();
  if (taken == nullptr) return "none arrived";
  EXPECT_EQ(taken->fd() < 0, !taken->problem().empty());
  return taken->problem();
}

class PassedDescriptor : public ::testing::Test {
 protected:
  ~PassedDescriptor() override { expectHonestClientIsServed(server); }
  TestServer server;
};

TEST_F(PassedDescriptor, OneEndOfASocketPairArrivesAndWorks) {
  const SocketPair pair = makeSocketPair();
  EXPECT_EQ(problemOf(server, pair.second), "");
  ASSERT_NE(server.descriptor(), nullptr);
  ASSERT_EQ(::send(pair.first->fd(), "x", 1, 0), 1);
  char byte = 0;
  EXPECT_EQ(::recv(server.descriptor()->fd(), &byte, 1, 0), 1);
  EXPECT_EQ(byte, 'x');
  EXPECT_NE(::fcntl(server.descriptor()->fd(), F_GETFD) & FD_CLOEXEC, 0);
}

TEST_F(PassedDescriptor, AServiceOnItCanBeCalled) {
  const SocketPair pair = makeSocketPair();
  server.server().serveConnected(pair.first);
  EXPECT_EQ(problemOf(server, pair.second), "");
  const auto connection = connectionFromDescriptor(server.loop, server.global, server.descriptor());
  connection->setRemoteInterface(testInterface());
  connection->resume();
  EXPECT_TRUE(callAndWait(connection, "number", {std::int32_t{1}}).reply);
}

TEST_F(PassedDescriptor, AFileHasAProblem) {
  const auto file = std::make_shared<Descriptor>(::open("/proc/self/exe", O_RDONLY | O_CLOEXEC));
  EXPECT_EQ(problemOf(server, file), "it is not a unix stream socket");
}

TEST_F(PassedDescriptor, ADatagramSocketHasAProblem) {
  int fds[2];
  ASSERT_EQ(::socketpair(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0, fds), 0);
  const auto kept = std::make_shared<Descriptor>(fds[0]);
  EXPECT_EQ(problemOf(server, std::make_shared<Descriptor>(fds[1])),
            "it is not a unix stream socket");
}

TEST_F(PassedDescriptor, AnUnconnectedSocketHasAProblem) {
  const auto lonely = std::make_shared<Descriptor>(::socket(AF_UNIX, SOCK_STREAM, 0));
  EXPECT_EQ(problemOf(server, lonely), "it is not connected");
}

TEST_F(PassedDescriptor, ASocketWhoseOtherEndIsClosedHasAProblem) {
  SocketPair pair = makeSocketPair();
  pair.first.reset();
  EXPECT_EQ(problemOf(server, pair.second), "its other end is closed");
}

TEST_F(PassedDescriptor, ASocketConnectedToTheListenerItselfHasAProblem) {
  std::string why;
  EXPECT_EQ(problemOf(server, connectSocket(server.path(), why)),
            "its other end is this process's own socket");
}

TEST(PassedDescriptorOfThisProcess, HasAProblem) {
  ServerOptions options = TestServer::defaultOptions();
  options.refuse_own_process = true;
  TestServer server(options);
  const SocketPair pair = makeSocketPair();
  EXPECT_EQ(problemOf(server, pair.second), "its other end is this process");
}

TEST_F(PassedDescriptor, NoneCanBeSentInPlaceOfOne) {
  const Outcome outcome =
      callAndWait(server.connect(), "takeDescriptor", {SharedDescriptor(), std::string("text")});
  EXPECT_TRUE(outcome.error);
  EXPECT_EQ(server.served(), 0U);
}

}  // namespace
}  // namespace spacekeep::ipc::test
