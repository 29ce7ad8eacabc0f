// The server on a message bus: what callers get, and who they are to it.
#include <gtest/gtest.h>
#include <unistd.h>

#include <string>
#include <vector>

#include "support/access/peer_identity.h"
#include "tests/linux/ipc/bus_world.h"

namespace spacekeep::ipc::test {
namespace {

class BusFrontTest : public ::testing::Test {
 protected:
  void SetUp() override { bus.start(); }

  PrivateBus bus;
};

TEST_F(BusFrontTest, ServesCallsUnderItsName) {
  const auto server = serverOn(bus);
  BusClient client(bus);
  ASSERT_TRUE(client.isServed());
  EXPECT_EQ(client.number(42), "");
  EXPECT_EQ(server->server().connections(), 0U);
}

TEST_F(BusFrontTest, TheSocketServesBesideTheBus) {
  const auto server = serverOn(bus);
  BusClient client(bus);
  ASSERT_TRUE(client.isServed());
  expectHonestClientIsServed(*server);
}

TEST_F(BusFrontTest, CallsOfOneCallerAreServedInTheirOrder) {
  const auto server = serverOn(bus);
  BusClient client(bus);
  ASSERT_TRUE(client.isServed());
  std::vector<std::int32_t> sent = server->numbers();
  for (std::int32_t i = 0; i < 50; ++i) {
    const OwnedMessage call = client.newCall("number");
    ASSERT_GE(sd_bus_message_append(call.get(), "i", i), 0);
    ASSERT_GE(sd_bus_send(client.bus(), call.get(), nullptr), 0);
    sent.push_back(i);
  }
  ASSERT_EQ(client.number(50), "");
  sent.push_back(50);
  EXPECT_EQ(server->numbers(), sent);
}

TEST_F(BusFrontTest, ACallerIsTheUserThatTheBusHasFromTheKernel) {
  const auto server = serverOn(bus);
  ASSERT_TRUE(BusClient(bus).isServed());
  const auto games = busctlAs(kGamesAccount, bus, {"whoAmI"});
  EXPECT_EQ(games.text, "av 1 t 5\n");
  EXPECT_EQ(busctlAs(0, bus, {"whoAmI"}).text, "av 1 t 0\n");
}

TEST_F(BusFrontTest, WhoIsNotAdmittedIsToldSoAndServedNothing) {
  ServerOptions options = TestServer::defaultOptions();
  options.admit = [](PeerConnection& peer, std::string& why) {
    why = "it does not hold \"HELD\"";
    return peer.identity().uid() == 0;
  };
  const auto server = serverOn(bus, options);
  ASSERT_TRUE(BusClient(bus).isServed());
  const std::size_t served = server->served();
  const auto games = dbusSendAs(kGamesAccount, bus, "whoAmI");
  EXPECT_NE(games.status, 0);
  EXPECT_EQ(games.text,
            "Error org.freedesktop.DBus.Error.AccessDenied: The caller is refused: it does not "
            "hold \"HELD\"\n");
  EXPECT_EQ(server->served(), served);
}

TEST_F(BusFrontTest, RightsHangOnTheGroupsThatTheCallerReallyHas) {
  ServerOptions options = TestServer::defaultOptions();
  options.admit = [](PeerConnection& peer, std::string&) {
    return peer.identity().uid() == 0 || peer.identity().isMemberOf(33);
  };
  const auto server = serverOn(bus, options);
  ASSERT_TRUE(BusClient(bus).isServed());
  EXPECT_EQ(busctlAs(kGamesAccount, bus, {"number", "i", "7"}, "33,50").text, "i 7\n");
  EXPECT_NE(busctlAs(kGamesAccount, bus, {"number", "i", "7"}, "50").status, 0);
}

TEST_F(BusFrontTest, WhatTheBusDoesNotTellIsUnclear) {
  access::UnclearFacts unclear;
  bool is_in_group = true;
  ServerOptions options = TestServer::defaultOptions();
  options.admit = [&](PeerConnection& peer, std::string&) {
    unclear = peer.identity().unclear();
    is_in_group = peer.identity().isMemberOf(0);
    return true;
  };
  const auto server = serverOn(bus, options);
  ASSERT_TRUE(BusClient(bus).isServed());
  server->stop();
  EXPECT_FALSE(unclear.groups);
  EXPECT_TRUE(unclear.unit);  // dbus-daemon 1.14 passes no process on
  EXPECT_TRUE(is_in_group);
}

TEST_F(BusFrontTest, WrongCallsAreToldWhatIsWrong) {
  const auto server = serverOn(bus);
  BusClient client(bus);
  ASSERT_TRUE(client.isServed());
  BusAnswer answer = client.call(client.newCall("number"));
  EXPECT_EQ(answer.error, "org.freedesktop.DBus.Error.InvalidArgs");
  EXPECT_EQ(answer.text, "number: argument 1 (number) should be a 32-bit integer (i), not absent");
  EXPECT_EQ(client.call(client.newCall("nothing")).error,
            "org.freedesktop.DBus.Error.UnknownMethod");
  EXPECT_EQ(client.call(client.newCall("number", "com.quorvel.IpcTest", "/")).error,
            "org.freedesktop.DBus.Error.UnknownObject");
  EXPECT_EQ(client.number(3), "");
}

TEST_F(BusFrontTest, TheObjectCanBeIntrospected) {
  const auto server = serverOn(bus);
  BusClient client(bus);
  ASSERT_TRUE(client.isServed());
  const BusAnswer answer =
      client.call(client.newCall("Introspect", "org.freedesktop.DBus.Introspectable"));
  const char* document = nullptr;
  ASSERT_GT(sd_bus_message_read(answer.message.get(), "s", &document), 0);
  EXPECT_EQ(document, introspectionXml(testInterface()));
}

TEST_F(BusFrontTest, WhatThePolicyDoesNotLetThroughDoesNotArrive) {
  const auto server = serverOn(bus);
  BusClient client(bus);
  ASSERT_TRUE(client.isServed());
  const BusAnswer answer = client.call(client.newCall("GetAll", "org.freedesktop.DBus.Properties"));
  EXPECT_EQ(answer.error, "org.freedesktop.DBus.Error.AccessDenied");
  EXPECT_NE(answer.text.find("Rejected send message"), std::string::npos) << answer.text;
}

TEST_F(BusFrontTest, ACallWithADescriptorIsSentToTheSocket) {
  const auto server = serverOn(bus);
  BusClient client(bus);
  ASSERT_TRUE(client.isServed());
  OwnedMessage call = client.newCall("takeDescriptor");
  ASSERT_GE(sd_bus_message_append(call.get(), "hs", STDIN_FILENO, "text"), 0);
  const BusAnswer answer = client.call(std::move(call));
  EXPECT_EQ(answer.error, "org.freedesktop.DBus.Error.NotSupported");
  EXPECT_EQ(answer.text,
            "Descriptors are not taken over the bus; connect to the daemon's socket instead, " +
                server->path());
  EXPECT_EQ(server->descriptor(), nullptr);
}

TEST_F(BusFrontTest, ACallThatShouldHaveADescriptorAndHasNoneIsSentToTheSocketAsWell) {
  const auto server = serverOn(bus);
  BusClient client(bus);
  ASSERT_TRUE(client.isServed());
  OwnedMessage call = client.newCall("takeDescriptor");
  ASSERT_GE(sd_bus_message_append(call.get(), "s", "text"), 0);
  EXPECT_EQ(client.call(std::move(call)).error, "org.freedesktop.DBus.Error.NotSupported");
}

TEST_F(BusFrontTest, ACallThatWantsNoAnswerGetsNone) {
  const auto server = serverOn(bus);
  BusClient client(bus);
  ASSERT_TRUE(client.isServed());
  const std::size_t served = server->served();
  const OwnedMessage call = client.newCall("number");
  ASSERT_GE(sd_bus_message_append(call.get(), "i", 9), 0);
  ASSERT_GE(sd_bus_message_set_expect_reply(call.get(), 0), 0);
  ASSERT_GE(sd_bus_send(client.bus(), call.get(), nullptr), 0);
  ASSERT_EQ(client.number(10), "");
  EXPECT_EQ(server->served(), served + 2);
}

}  // namespace
}  // namespace spacekeep::ipc::test
