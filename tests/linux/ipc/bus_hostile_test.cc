// Callers of the bus who send what nobody should send, or more than anybody should.
#include <gtest/gtest.h>
#include <sys/resource.h>
#include <unistd.h>

#include <algorithm>
#include <filesystem>
#include <iterator>
#include <string>
#include <utility>
#include <vector>

#include "tests/helpers/log_capture.h"
#include "tests/linux/ipc/bus_world.h"

namespace spacekeep::ipc::test {
namespace {

using namespace std::string_view_literals;

constexpr const char* kLimitsExceeded = "org.freedesktop.DBus.Error.LimitsExceeded";

std::size_t openDescriptors() {
  const std::filesystem::directory_iterator entries("/proc/self/fd");
  return static_cast<std::size_t>(std::distance(begin(entries), end(entries)));
}

class HostileBusCaller : public ::testing::Test {
 protected:
  void SetUp() override {
    bus.start();
    ServerOptions options = TestServer::defaultOptions();
    options.limits.message_bytes = 64 * 1024;
    start(options);
  }
  void start(const ServerOptions& options) {
    server = serverOn(bus, options);
    client = std::make_unique<BusClient>(bus);
    ASSERT_TRUE(client->isServed());
  }
  OwnedMessage callWith(const char* member, const std::string& text) {
    OwnedMessage call = client->newCall(member);
    EXPECT_GE(sd_bus_message_append(call.get(), "s", text.c_str()), 0);
    return call;
  }

  spacekeep::test::LogCapture log;  // tells how often it came to the bus
  PrivateBus bus;
  std::unique_ptr<TestServer> server;
  std::unique_ptr<BusClient> client;
};

TEST_F(HostileBusCaller, AMessageBeyondTheLimitIsLeftOutAndToldSo) {
  for (const std::size_t bytes : {100'000U, 5'000'000U}) {
    const BusAnswer answer = client->call(callWith("number", std::string(bytes, 'x')));
    EXPECT_EQ(answer.error, kLimitsExceeded);
    EXPECT_NE(answer.text.find(", more than 65536"), std::string::npos) << answer.text;
    EXPECT_EQ(client->number(1), "");
  }
  EXPECT_EQ(log.count(kLogProblem, "number of a caller of the bus refused: The message has "), 2U);
}

TEST_F(HostileBusCaller, ACallWithADescriptorIsRefusedUnderItsOwnNameInTheLog) {
  OwnedMessage call = client->newCall("takeDescriptor");
  ASSERT_GE(sd_bus_message_append(call.get(), "hs", STDIN_FILENO, "text"), 0);
  EXPECT_EQ(client->call(std::move(call)).error, "org.freedesktop.DBus.Error.NotSupported");
  EXPECT_EQ(
      log.count(kLogProblem,
                "takeDescriptor of a caller of the bus refused: Descriptors are not taken over "),
      1U);
}

TEST_F(HostileBusCaller, DescriptorsAreNotLeftOpen) {
  const std::size_t before = openDescriptors();
  for (int i = 0; i < 20; ++i) {
    const OwnedMessage call = client->newCall("takeDescriptor");
    for (int k = 0; k < 10; ++k) {
      ASSERT_GE(sd_bus_message_append(call.get(), "h", STDIN_FILENO), 0);
    }
    ASSERT_GE(sd_bus_send(client->bus(), call.get(), nullptr), 0);
  }
  EXPECT_EQ(client->number(1), "");
  EXPECT_LE(openDescriptors(), before);
}

TEST_F(HostileBusCaller, ASignalWithADescriptorIsLeftOut) {
  const std::size_t before = openDescriptors();
  sd_bus_message* signal = nullptr;
  ASSERT_GE(
      sd_bus_message_new_signal(client->bus(), &signal, kObjectPath, "com.quorvel.IpcTest", "odd"),
      0);
  ASSERT_GE(sd_bus_message_append(signal, "h", STDIN_FILENO), 0);
  ASSERT_GE(sd_bus_message_set_destination(signal, kTestBusName), 0);
  ASSERT_GE(sd_bus_send(client->bus(), signal, nullptr), 0);
  sd_bus_message_unref(signal);
  EXPECT_EQ(client->number(1), "");
  EXPECT_LE(openDescriptors(), before);
}

/// After it, an honest call is served, and over the same connection to the bus.
struct OddMessage {
  const char* name;
  std::string bytes;
};

class OddBusMessages : public HostileBusCaller, public ::testing::WithParamInterface<OddMessage> {};

TEST_P(OddBusMessages, CostNobodyTheBus) {
  RawBusPeer peer(bus);
  for (int i = 0; i < 3; ++i) ASSERT_TRUE(peer.send(GetParam().bytes));
  ASSERT_TRUE(peer.brokerHasReadAll());
  EXPECT_EQ(client->number(1), "");
  EXPECT_EQ(client->number(2), "");
  EXPECT_EQ(log.count(kLogTrace, "SpacekeepBus serves as"), 1U);
}

std::string longPath() { return "/" + std::string(20'000, 'a'); }

INSTANTIATE_TEST_SUITE_P(
    Messages, OddBusMessages,
    ::testing::Values(
        OddMessage{"NoDescriptorsAnnounced", RawMessage().callOf("number").number(9, 0).bytes()},
        OddMessage{"TypeThatNobodyKnows", RawMessage().callOf("number").bytes(9)},
        OddMessage{"SignalToTheName", RawMessage().callOf("number").bytes(4)},
        OddMessage{"AnswerToNothing",
                   RawMessage().number(5, 2).text(6, 's', kTestBusName).bytes(2)},
        OddMessage{
            "ErrorToNothing",
            RawMessage().number(5, 2).text(4, 's', "a.b").text(6, 's', kTestBusName).bytes(3)},
        OddMessage{"FieldThatNobodyKnows",
                   RawMessage().callOf("number").text(77, 's', "what").bytes()},
        OddMessage{"VeryLongPath", RawMessage()
                                       .text(1, 'o', longPath())
                                       .text(2, 's', "com.quorvel.IpcTest")
                                       .text(3, 's', "number")
                                       .text(6, 's', kTestBusName)
                                       .bytes()},
        OddMessage{"NoInterface", RawMessage()
                                      .text(1, 'o', kObjectPath)
                                      .text(3, 's', "number")
                                      .text(6, 's', kTestBusName)
                                      .bytes()},
        OddMessage{"ForgedSender",
                   RawMessage().callOf("number").text(7, 's', "org.freedesktop.DBus").bytes()}),
    [](const auto& tried) { return std::string(tried.param.name); });

TEST_F(HostileBusCaller, ACallThatAnnouncesNoDescriptorsIsServedLikeAnyOther) {
  RawBusPeer peer(bus);
  const std::string call =
      RawMessage().callOf("number").text(8, 'g', "i").number(9, 0).bytes(1, 7, "M\0\0\0"sv);
  ASSERT_TRUE(peer.send(call));
  ASSERT_TRUE(peer.brokerHasReadAll());
  EXPECT_TRUE(eventually([&] { return std::ranges::count(server->numbers(), 'M') == 1; }));
}

TEST_F(HostileBusCaller, WhoVanishesWhileACallIsAtWorkHarmsNobody) {
  {
    BusClient other(bus);
    ASSERT_GE(sd_bus_send(other.bus(), other.newCall("hold").get(), nullptr), 0);
    ASSERT_GE(sd_bus_flush(other.bus()), 0);
    ASSERT_TRUE(eventually([&] { return server->held() == 1; }));
  }
  server->takeHeld().reply({std::string("for nobody")});
  EXPECT_EQ(client->number(1), "");
  EXPECT_EQ(log.count(kLogTrace, "SpacekeepBus serves as"), 1U);
}

TEST_F(HostileBusCaller, CallsBeyondTheUnansweredAreRefused) {
  const std::size_t limit = ServerLimits().unanswered_calls;
  for (std::size_t i = 0; i < limit; ++i) {
    ASSERT_GE(sd_bus_send(client->bus(), client->newCall("hold").get(), nullptr), 0);
  }
  ASSERT_TRUE(eventually([&] {
    sd_bus_process(client->bus(), nullptr);
    return server->held() == limit;
  }));
  const BusAnswer answer = client->call(client->newCall("hold"));
  EXPECT_EQ(answer.error, kLimitsExceeded);
  EXPECT_EQ(BusClient(bus).number(1), "");
}

TEST_F(HostileBusCaller, WhoNeverReadsAnswersHarmsNobody) {
  // 60,000 bytes each way, and not one is read.
  BusClient deaf(bus);
  for (int i = 0; i < 2'000; ++i) {
    const OwnedMessage call = deaf.newCall("echo");
    ASSERT_GE(sd_bus_message_append(call.get(), "isa{sv}aa{sv}avas", 1,
                                    std::string(60'000, 'x').c_str(), 0, 0, 0, 0),
              0);
    if (sd_bus_send(deaf.bus(), call.get(), nullptr) < 0) break;
    if (i % 100 == 0) {
      EXPECT_EQ(client->number(i), "");
    }
  }
  EXPECT_EQ(client->number(1), "");
  expectHonestClientIsServed(*server);
}

TEST_F(HostileBusCaller, MoreCallersThanAreRememberedAreAllServed) {
  ServerOptions options = TestServer::defaultOptions();
  options.limits.connections = 8;
  options.limits.connections_per_uid = 4;
  server.reset();
  start(options);
  for (int i = 0; i < 40; ++i) EXPECT_EQ(BusClient(bus).number(i), "") << i;
  EXPECT_EQ(client->number(1), "");
}

TEST_F(HostileBusCaller, CallersOfOneUserThatAreAllAtWorkAreRefusedWhenThereAreTooMany) {
  ServerOptions options = TestServer::defaultOptions();
  options.limits.connections_per_uid = 3;
  server.reset();
  start(options);
  std::vector<std::unique_ptr<BusClient>> busy;
  for (std::size_t i = 0; i < 3; ++i) {
    busy.push_back(std::make_unique<BusClient>(bus));
    ASSERT_GE(sd_bus_send(busy[i]->bus(), busy[i]->newCall("hold").get(), nullptr), 0);
    ASSERT_GE(sd_bus_flush(busy[i]->bus()), 0);
    ASSERT_TRUE(eventually([&] { return server->held() == i + 1; }));
  }
  BusClient one_more(bus);
  EXPECT_EQ(one_more.number(1), kLimitsExceeded);
  server->takeHeld().reply({std::string("done")});
  EXPECT_TRUE(one_more.isServed());
  EXPECT_EQ(busctlAs(kGamesAccount, bus, {"number", "i", "7"}).text, "i 7\n");
}

}  // namespace
}  // namespace spacekeep::ipc::test
