// What comes all at once while the IPC thread is busy: each arrival is told once only, so nothing of
// it may be left lying.
#include <gtest/gtest.h>
#include <linux/sockios.h>
#include <sys/ioctl.h>
#include <sys/socket.h>

#include <algorithm>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "support/ipc/linux/refusal_log.h"
#include "support/logging/log.h"
#include "tests/helpers/log_capture.h"
#include "tests/linux/ipc/bus_world.h"
#include "tests/linux/ipc/busy_loop.h"
#include "tests/linux/ipc/ipc_world.h"

namespace spacekeep::ipc::test {
namespace {

void sendNumber(BareClient& client, int number, const char* member = "number") {
  sd_bus_message* call = client.newCall(member);
  ASSERT_GE(sd_bus_message_append(call, "i", number), 0);
  ASSERT_GE(sd_bus_send(client.bus(), call, nullptr), 0);
  sd_bus_message_unref(call);
  ASSERT_GE(sd_bus_flush(client.bus()), 0);
}

// Makes sure that the connection is up and known before the loop is busy.
void callNumber(BareClient& client, int number) {
  sd_bus_message* call = client.newCall("number");
  ASSERT_GE(sd_bus_message_append(call, "i", number), 0);
  ASSERT_EQ(client.errorOf(call), "");
}

TEST(Turns, ABurstOfMoreCallsThanOneTurnTakesIsServedToTheLast) {
  constexpr int kCalls = 60;  // a connection may have 64 without an answer
  TestServer server;
  BareClient client(server.path());
  callNumber(client, -1);
  BusyLoop busy(server.loop);
  for (int i = 0; i < kCalls; ++i) sendNumber(client, i);
  busy.letGo();
  ASSERT_TRUE(eventually([&] { return server.numbers().size() == kCalls + 1; }));
  for (int i = 0; i < kCalls; ++i) {
    ASSERT_EQ(server.numbers()[static_cast<std::size_t>(i) + 1], i);
  }
}

/// The bytes of a call of "number".
std::string numberCall(char number, std::string_view unused = "") {
  RawMessage call = RawMessage().callOf("number").text(8, 'g', "i");
  if (!unused.empty()) call.text(77, 's', unused);
  return call.bytes(1, 7, std::string{number, 0, 0, 0});
}

/// Once the server has taken all that was sent, and does something else.
bool hasBeenRead(TestServer& server, const RawPeer& peer) {
  const bool is_taken = eventually([&peer] {
    int unread = -1;
    return ::ioctl(peer.fd(), SIOCOUTQ, &unread) == 0 && unread == 0;
  });
  server.loop.runAndWait([] {});
  return is_taken;
}

// What then arrives at once is as long as the first call.
TEST(Turns, ACallOfTheSizeOfTheFirstPieceOfTheOneBeforeItIsServedWithTheSecondPiece) {
  TestServer server;
  RawPeer peer(server.path());
  peer.authenticate();
  const std::string second = numberCall(2);
  const std::string first = numberCall(1, std::string(200, 'x'));
  ASSERT_TRUE(peer.send(std::string_view(first).substr(0, second.size())));
  ASSERT_TRUE(hasBeenRead(server, peer));
  ASSERT_TRUE(peer.send(first.substr(second.size()) + second));
  EXPECT_TRUE(eventually([&] { return server.numbers().size() == 2; }));
  EXPECT_EQ(server.numbers(), (std::vector<std::int32_t>{1, 2}));
}

TEST(Turns, ACallSentJustBeforeClosingIsServedAndTheEndIsNoticed) {
  TestServer server;
  {
    BareClient client(server.path());
    callNumber(client, 1);
    BusyLoop busy(server.loop);
    sendNumber(client, 2, "numberBriefly");
    ::shutdown(sd_bus_get_fd(client.bus()), SHUT_RDWR);
    busy.letGo();
    EXPECT_TRUE(eventually([&] { return server.server().connections() == 0; }));
  }
  EXPECT_EQ(server.numbers(), (std::vector<std::int32_t>{1, 2}));
}

TEST(Turns, AWritingEndClosedAfterACallIsNoticedAsTheEnd) {
  TestServer server;
  BareClient client(server.path());
  callNumber(client, 1);
  BusyLoop busy(server.loop);
  sendNumber(client, 2);
  ::shutdown(sd_bus_get_fd(client.bus()), SHUT_WR);
  busy.letGo();
  EXPECT_TRUE(eventually([&] { return server.server().connections() == 0; }));
}

// By what is refused, since a refusal is written by the thread that reads: calls that are served end
// in any order.
TEST(Turns, AConnectionWithMuchToSayLetsOthersInAfterAFewMessages) {
  const spacekeep::test::LogCapture log;
  TestServer server;
  BareClient much(server.path());
  BareClient little(server.path());
  callNumber(much, 1);
  callNumber(little, 1);
  BusyLoop busy(server.loop);
  for (int i = 0; i < 60; ++i) sendNumber(much, i, "unknownToAll");
  sendNumber(little, 1, "unknownAsWell");
  busy.letGo();
  ASSERT_TRUE(eventually([&] { return log.contains(kLogProblem, "unknownAsWell"); }));
  EXPECT_LE(log.count(kLogProblem, "unknownToAll"), RefusalLog::kLinesPerWindow - 1)
      << "its own line is one of the few that go out";
  const std::vector<std::string> lines = log.texts(kLogProblem);
  const auto is_the_others = [](const std::string& line) {
    return line.find("unknownAsWell") != std::string::npos;
  };
  EXPECT_LE(std::ranges::find_if(lines, is_the_others) - lines.begin(), 16);
}

// The answer goes out in several parts while nothing comes; what comes then is judged as ever.
TEST(Turns, AClientThatTakesALargeAnswerLateMayPassADescriptorAfterwards) {
  TestServer server;
  BareClient client(server.path());
  callNumber(client, 1);
  sd_bus_message* call = client.newCall("hold");
  std::uint64_t serial = 0;
  ASSERT_GE(sd_bus_send(client.bus(), call, &serial), 0);
  sd_bus_message_unref(call);
  ASSERT_GE(sd_bus_flush(client.bus()), 0);
  ASSERT_TRUE(eventually([&] { return server.held() == 1; }));
  server.takeHeld().reply({std::string(900'000, 'x')});
  server.loop.runAndWait([] {});
  callNumber(client, 2);  // reads everything that is before its answer
  const SocketPair pair = makeSocketPair();
  sd_bus_message* passing = client.newCall("takeDescriptor");
  ASSERT_GE(sd_bus_message_append(passing, "hs", pair.first->fd(), "text"), 0);
  EXPECT_EQ(client.errorOf(passing), "");
  ASSERT_NE(server.descriptor(), nullptr);
  EXPECT_EQ(server.descriptor()->problem(), "");
}

TEST(Turns, ManyConnectionsWithWorkAtOnceAreAllServed) {
  constexpr int kClients = 60;
  TestServer server;
  std::vector<std::unique_ptr<BareClient>> clients;
  for (int i = 0; i < kClients; ++i) {
    clients.push_back(std::make_unique<BareClient>(server.path()));
    callNumber(*clients.back(), i);
  }
  BusyLoop busy(server.loop);
  for (int round = 0; round < 40; ++round) {
    for (auto& client : clients) sendNumber(*client, round);
  }
  busy.letGo();
  EXPECT_TRUE(eventually([&] { return server.numbers().size() == 41 * kClients; }));
}

}  // namespace
}  // namespace spacekeep::ipc::test
