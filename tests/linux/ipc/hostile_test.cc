// Peers that mean no good, and the honest client beside each of them.
#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <array>
#include <string>
#include <string_view>
#include <vector>

#include "support/access/peer_identity.h"
#include "tests/helpers/log_capture.h"
#include "tests/linux/ipc/ipc_world.h"

namespace spacekeep::ipc::test {
namespace {

using namespace std::string_view_literals;

ServerOptions options() { return TestServer::defaultOptions(); }

TEST(HostilePeer, GarbageInsteadOfAuthenticationIsCutOff) {
  for (const std::string_view garbage :
       {"GET / HTTP/1.1\r\n\r\n"sv, "\0\0\0\0"sv, "\0AUTH EXTERNAL 30\n"sv, "\0BEGIN\r\n"sv,
        "\0NEGOTIATE_UNIX_FD\r\nBEGIN\r\n"sv}) {
    TestServer server;
    RawPeer peer(server.path());
    peer.send(garbage);
    // "\0\0\0\0" may still become a line, so it is made an overlong one.
    peer.send(std::string(2000, '\0'));
    EXPECT_TRUE(peer.isCutOff()) << garbage;
    expectHonestClientIsServed(server);
  }
}

TEST(HostilePeer, ClaimingToBeSomebodyElseIsRejected) {
  TestServer server;
  RawPeer peer(server.path());
  // "4294967294", a user that nobody runs as.
  peer.send("\0AUTH EXTERNAL 34323934393637323934\r\n"sv);
  std::string answer;
  ASSERT_TRUE(eventually([&] {
    char bytes[64];
    const ssize_t seen = ::recv(peer.fd(), bytes, sizeof bytes, MSG_DONTWAIT);
    if (seen > 0) answer.append(bytes, static_cast<std::size_t>(seen));
    return answer.find("\r\n") != std::string::npos;
  }));
  EXPECT_EQ(answer, "REJECTED EXTERNAL\r\n");
  peer.send("BEGIN\r\n");
  EXPECT_TRUE(peer.isCutOff());
  expectHonestClientIsServed(server);
}

/// What comes next, up to a line end.
std::string nextLine(const RawPeer& peer) {
  std::string line;
  EXPECT_TRUE(eventually([&] {
    char byte = 0;
    while (::recv(peer.fd(), &byte, 1, MSG_DONTWAIT) == 1) {
      line += byte;
      if (byte == '\n') return true;
    }
    return false;
  })) << line;
  return line;
}

TEST(HostilePeer, WhoWasRejectedOrHasCancelledHasToBeginAnew) {
  TestServer server;
  for (const std::string_view ends_it : {"DATA 34323934393637323934\r\n"sv, "CANCEL\r\n"sv}) {
    RawPeer peer(server.path());
    ASSERT_TRUE(peer.send("\0AUTH EXTERNAL\r\n"sv));
    EXPECT_EQ(nextLine(peer), "DATA\r\n");
    ASSERT_TRUE(peer.send(ends_it));
    EXPECT_EQ(nextLine(peer), "REJECTED EXTERNAL\r\n");
    ASSERT_TRUE(peer.send("DATA\r\n"sv));
    EXPECT_EQ(nextLine(peer), "ERROR\r\n") << ends_it;
    ASSERT_TRUE(peer.send("AUTH EXTERNAL\r\nDATA\r\n"sv));
    EXPECT_EQ(nextLine(peer), "DATA\r\n");
    EXPECT_EQ(nextLine(peer).substr(0, 3), "OK ");
  }
}

TEST(HostilePeer, HalfAnAuthenticationIsCutOffInTime) {
  spacekeep::test::LogCapture log;
  ServerOptions short_limit = options();
  short_limit.limits.authentication_ns = 1000'000'000;
  TestServer server(short_limit);
  RawPeer silent(server.path());
  RawPeer half(server.path());
  half.send("\0AUTH EXTERNAL\r\n"sv);
  EXPECT_TRUE(silent.isCutOff());
  EXPECT_TRUE(half.isCutOff());
  EXPECT_EQ(log.count(kLogProblem, "it did not authenticate in time"), 2U);
  EXPECT_TRUE(eventually([&] { return server.server().connections() == 0; }));
  expectHonestClientIsServed(server);
}

TEST(HonestPeer, WhoNamesHimselfByManyDigitsIsBelieved) {
  ASSERT_EQ(::geteuid(), 0U) << "this test is another user for a moment and has to run as root";
  TestServer server;
  ASSERT_EQ(::chmod(server.directory.path().c_str(), 0755), 0);
  ASSERT_EQ(::chmod(server.path().c_str(), 0666), 0);
  // Of this thread only.
  ASSERT_EQ(::syscall(SYS_setresuid, -1, 1234567890, -1), 0);
  RawPeer peer(server.path());
  ASSERT_EQ(::syscall(SYS_setresuid, -1, 0, -1), 0);
  ASSERT_TRUE(peer.send("\0AUTH EXTERNAL 31323334353637383930\r\n"sv));
  std::array<char, 64> answer{};
  ASSERT_TRUE(eventually(
      [&] { return ::recv(peer.fd(), answer.data(), answer.size(), MSG_DONTWAIT) > 0; }));
  EXPECT_TRUE(std::string_view(answer.data()).starts_with("OK ")) << answer.data();
}

TEST(HostilePeer, AnAuthenticationByteForByteIsHonest) {
  TestServer server;
  RawPeer peer(server.path());
  for (const char byte : "\0AUTH EXTERNAL\r\nDATA\r\nNEGOTIATE_UNIX_FD\r\nBEGIN\r\n"sv) {
    ASSERT_TRUE(peer.send(std::string_view(&byte, 1)));
    server.loop.runAndWait([] {});
  }
  EXPECT_TRUE(eventually([&] { return server.server().connections() == 1; }));
  rt::sleepNs(10'000'000);  // a refusal would follow at once
  EXPECT_EQ(server.server().connections(), 1U);
}

TEST(HostilePeer, AMessageBeyondTheLimitIsRefusedBeforeItIsRead) {
  spacekeep::test::LogCapture log;
  TestServer server;
  for (const std::string& large :
       {header(100U << 20U, 64), header(64, 60U << 20U), header(0xFFFFFFFFU, 0xFFFFFFFFU)}) {
    RawPeer peer(server.path());
    peer.authenticate();
    peer.send(large);
    EXPECT_TRUE(peer.isCutOff());
    expectHonestClientIsServed(server);
  }
  EXPECT_EQ(log.count(kLogProblem, "more than 1048576"), 3U);
}

TEST(HostilePeer, ALargeMessageSentTogetherWithTheAuthenticationIsRefusedAsWell) {
  TestServer server;
  RawPeer peer(server.path());
  peer.send(std::string("\0AUTH EXTERNAL\r\nDATA\r\nNEGOTIATE_UNIX_FD\r\nBEGIN\r\n"sv) +
            header(100U << 20U, 64) + std::string(5000, 'x'));
  EXPECT_TRUE(peer.isCutOff());
  expectHonestClientIsServed(server);
}

TEST(HostilePeer, BytesThatAreNoMessageAreCutOff) {
  TestServer server;
  RawPeer peer(server.path());
  peer.authenticate();
  peer.send("this is not D-Bus at all");
  EXPECT_TRUE(peer.isCutOff());
  expectHonestClientIsServed(server);
}

TEST(HostilePeer, AMessageOfATypeThatDBusDoesNotHaveIsCutOff) {
  spacekeep::test::LogCapture log;
  TestServer server;
  RawPeer peer(server.path());
  peer.authenticate();
  std::string bytes = header(0, 0);
  bytes[1] = 5;
  peer.send(bytes);
  EXPECT_TRUE(peer.isCutOff());
  EXPECT_EQ(log.count(kLogProblem, "it sent something that is no D-Bus message"), 1U);
  expectHonestClientIsServed(server);
}

TEST(HostilePeer, ABrokenMessageBeforeALargeOneDoesNotHideIt) {
  spacekeep::test::LogCapture log;
  TestServer server;
  RawPeer peer(server.path());
  peer.authenticate();
  // 16 bytes of header fields that make no sense: sd-bus drops such a message and reads on.
  peer.send(header(0, 16) + std::string(16, '\xEE') + header(100U << 20U, 64));
  EXPECT_TRUE(peer.isCutOff());
  EXPECT_GE(log.count(kLogProblem, "broken message") + log.count(kLogProblem, "cannot be read"),
            1U);
  expectHonestClientIsServed(server);
}

TEST(HostilePeer, HalfAHeaderCostsNoProcessorTime) {
  TestServer server;
  RawPeer peer(server.path());
  peer.authenticate();
  peer.send(header(0, 0).substr(0, 7));
  expectHonestClientIsServed(server);
  // What the honest client left to do may still come for a while.
  EXPECT_TRUE(eventually([&] { return wakeUpsInNs(server.loop, 300'000'000) <= 1; }));
  peer.send(header(100U << 20U, 0).substr(7));
  EXPECT_TRUE(peer.isCutOff());
}

TEST(HostilePeer, LeavingWithHalfAHeaderFreesItsPlace) {
  TestServer server;
  {
    RawPeer peer(server.path());
    peer.authenticate();
    peer.send(header(0, 0).substr(0, 7));
    ASSERT_TRUE(eventually([&] { return server.server().connections() == 1; }));
    rt::sleepNs(20'000'000);  // time for the half to be read; less of it shows less, not nothing
  }
  EXPECT_TRUE(eventually([&] { return server.server().connections() == 0; }));
}

TEST(HostilePeer, ThatNeverReadsIsCutOff) {
  spacekeep::test::LogCapture log;
  TestServer server;
  BareClient peer(server.path());
  const std::string large(100'000, 'x');
  // Each call is answered by about as much; nothing is ever read.
  for (int i = 0; i < 500; ++i) {
    sd_bus_message* call = peer.newCall("echo");
    ASSERT_GE(sd_bus_message_append(call, "isa{sv}aa{sv}avas", 1, large.c_str(), 0, 0, 0, 0), 0);
    std::uint64_t serial = 0;
    const int sent = sd_bus_send(peer.bus(), call, &serial);
    sd_bus_message_unref(call);
    if (sent < 0 || sd_bus_flush(peer.bus()) < 0) break;
  }
  EXPECT_TRUE(eventually([&] { return log.count(kLogProblem, "unread") == 1; }));
  EXPECT_TRUE(eventually([&] { return server.server().connections() == 0; }));
  expectHonestClientIsServed(server);
}

TEST(HostilePeer, AForgedSenderChangesNothing) {
  TestServer server;
  BareClient peer(server.path());
  sd_bus_message* call = peer.newCall("number");
  ASSERT_GE(sd_bus_message_set_sender(call, "org.freedesktop.DBus"), 0);
  ASSERT_GE(sd_bus_message_append(call, "i", 3), 0);
  EXPECT_EQ(peer.errorOf(call), "");
  expectHonestClientIsServed(server);
}

TEST(HostilePeer, ThousandConnectionsOfOneUserLeaveRoomForTheRest) {
  spacekeep::test::LogCapture log;
  ServerOptions many = options();
  many.limits.connections = 1024;
  many.limits.connections_per_uid = 64;
  TestServer server(many);
  std::vector<SharedDescriptor> flood;
  std::string why;
  for (int i = 0; i < 1000; ++i) {
    auto connected = connectSocket(server.path(), why);
    if (connected != nullptr) flood.push_back(std::move(connected));
    if (i % 32 == 0) server.loop.runAndWait([] {});
  }
  EXPECT_TRUE(eventually([&] { return server.server().connections() == 64; }));
  // The flood does not fill the log.
  EXPECT_TRUE(eventually([&] { return log.count(kLogProblem, "of this user are open") > 0; }));
  EXPECT_LE(log.count(kLogProblem, "of this user are open"), 20U);
  flood.clear();
  EXPECT_TRUE(eventually([&] { return server.server().connections() == 0; }));
  expectHonestClientIsServed(server);
}

TEST(HostilePeer, ConnectionsBeyondTheTotalAreRefused) {
  ServerOptions few = options();
  few.limits.connections = 2;
  TestServer server(few);
  BareClient first(server.path());
  const auto second = server.connect();
  EXPECT_TRUE(callAndWait(second, "number", {std::int32_t{1}}).reply);
  ASSERT_TRUE(eventually([&] { return server.server().connections() == 2; }));
  RawPeer third(server.path());
  EXPECT_TRUE(third.isCutOff());
  EXPECT_TRUE(callAndWait(second, "number", {std::int32_t{2}}).reply);
}

TEST(HostilePeer, ThatIsNotAdmittedIsClosedAndLogged) {
  spacekeep::test::LogCapture log;
  std::atomic<bool> admit = false;
  ServerOptions door = options();
  door.admit = [&admit](PeerConnection& peer, std::string& why) {
    EXPECT_EQ(peer.identity().uid(), ::geteuid());
    why = admit ? "" : "it does not hold \"KEY\"";
    return admit.load();
  };
  TestServer server(door);
  RawPeer peer(server.path());
  EXPECT_TRUE(peer.isCutOff());
  EXPECT_EQ(log.count(kLogProblem, "it does not hold \"KEY\""), 1U);
  admit = true;
  expectHonestClientIsServed(server);
}

}  // namespace
}  // namespace spacekeep::ipc::test
