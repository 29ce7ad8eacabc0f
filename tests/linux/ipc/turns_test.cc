// What comes all at once while the IPC thread is busy: each arrival is told once only, so nothing of
// it may be left lying.
#include <gtest/gtest.h>
#include <sys/socket.h>

#include <algorithm>
#include <memory>
#include <vector>

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

TEST(Turns, AConnectionWithMuchToSayLetsOthersInAfterAFewMessages) {
  constexpr int kCalls = 60;
  constexpr int kOther = 1000;
  TestServer server;
  BareClient much(server.path());
  BareClient little(server.path());
  callNumber(much, -1);
  callNumber(little, -1);
  BusyLoop busy(server.loop);
  for (int i = 0; i < kCalls; ++i) sendNumber(much, i, "numberBriefly");
  sendNumber(little, kOther, "numberBriefly");
  busy.letGo();
  ASSERT_TRUE(eventually([&] { return server.numbers().size() == kCalls + 3; }));
  const std::vector<std::int32_t> numbers = server.numbers();
  EXPECT_LE(std::ranges::find(numbers, kOther) - numbers.begin(), 2 + 16);
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
