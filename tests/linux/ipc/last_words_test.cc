// What a peer says and then leaves: it is served, also when what is written to it at that moment fails.
#include <gtest/gtest.h>
#include <sys/socket.h>

#include <cstdint>
#include <memory>
#include <string>
#include <vector>

#include "tests/helpers/log_capture.h"
#include "tests/linux/ipc/bus_world.h"
#include "tests/linux/ipc/busy_loop.h"
#include "tests/linux/ipc/ipc_world.h"

namespace spacekeep::ipc::test {
namespace {

void send(BareClient& client, sd_bus_message* call) {
  std::uint64_t serial = 0;  // without it no answer is asked for
  ASSERT_GE(sd_bus_send(client.bus(), call, &serial), 0);
  sd_bus_message_unref(call);
  ASSERT_GE(sd_bus_flush(client.bus()), 0);
}

void sendNumber(BareClient& client, int number) {
  sd_bus_message* call = client.newCall("number");
  ASSERT_GE(sd_bus_message_append(call, "i", number), 0);
  send(client, call);
}

/// A client whose call "hold" is not answered yet.
class LastWords : public ::testing::Test {
 protected:
  void SetUp() override {
    send(*client, client->newCall("hold"));
    ASSERT_TRUE(eventually([this] { return server.held() == 1; }));
  }
  /// Of which the client reads nothing, so that most of it stays with the server.
  void answerMuch() {
    server.takeHeld().reply({std::string(900'000, 'x')});
    server.loop.runAndWait([] {});
  }
  void sendBytes(const std::string& bytes) {
    ASSERT_EQ(::send(sd_bus_get_fd(client->bus()), bytes.data(), bytes.size(), MSG_NOSIGNAL),
              static_cast<ssize_t>(bytes.size()));
  }
  [[nodiscard]] bool hasEnded() {
    return eventually([this] { return server.server().connections() == 0; });
  }

  const spacekeep::test::LogCapture log;
  TestServer server;
  std::unique_ptr<BareClient> client = std::make_unique<BareClient>(server.path());
};

TEST_F(LastWords, OfAClientThatLeavesAnAnswerUnreadAreServedToTheLast) {
  constexpr int kCalls = 20;  // more than one turn takes
  answerMuch();
  BusyLoop busy(server.loop);
  for (int i = 0; i < kCalls; ++i) sendNumber(*client, i);
  client.reset();
  busy.letGo();
  EXPECT_TRUE(hasEnded());
  EXPECT_TRUE(eventually([this] { return server.numbers().size() == kCalls; }));
}

TEST_F(LastWords, OfAClientThatIsAnsweredInTheMomentItLeavesAreServed) {
  BusyLoop before(server.loop);
  BusyLoop busy(server.loop, &before, [this] { server.takeHeld().reply({std::string("late")}); });
  sendNumber(*client, 1);
  client.reset();
  busy.letGo();
  EXPECT_TRUE(hasEnded());
  EXPECT_TRUE(eventually([this] { return server.numbers() == std::vector<std::int32_t>{1}; }));
}

TEST_F(LastWords, WithADescriptorAreServed) {
  answerMuch();
  const SocketPair pair = makeSocketPair();
  sd_bus_message* passing = client->newCall("takeDescriptor");
  ASSERT_GE(sd_bus_message_append(passing, "hs", pair.first->fd(), "text"), 0);
  BusyLoop busy(server.loop);
  send(*client, passing);
  client.reset();
  busy.letGo();
  EXPECT_TRUE(hasEnded());
  EXPECT_TRUE(eventually([this] { return server.descriptor() != nullptr; }));
}

TEST_F(LastWords, BeyondTheSizeLimitAreRefused) {
  answerMuch();
  BusyLoop busy(server.loop);
  sendBytes(header(100U << 20U, 64));
  client.reset();
  busy.letGo();
  EXPECT_TRUE(hasEnded());
  EXPECT_EQ(log.count(kLogProblem, "more than 1048576"), 1U);
}

TEST_F(LastWords, ThatAreOnlyTheBeginningOfACallEndTheConnection) {
  answerMuch();
  BusyLoop busy(server.loop);
  sendBytes(header(1000, 64) + std::string(100, 'x'));
  client.reset();
  busy.letGo();
  EXPECT_TRUE(hasEnded());
}

TEST_F(LastWords, WhoseBeginningWasTakenBeforeAreLostAndNobodyIsBlamed) {
  answerMuch();
  const std::string call = RawMessage().callOf("number").text(8, 'g', "i").bytes(1, 7, "1234");
  sendBytes(call.substr(0, 40));
  server.loop.runAndWait([] {});
  BusyLoop busy(server.loop);
  sendBytes(call.substr(40));
  client.reset();
  busy.letGo();
  EXPECT_TRUE(hasEnded());
  EXPECT_EQ(server.numbers().size(), 0U);
  EXPECT_EQ(log.count(kLogProblem, ""), 0U);
}

TEST_F(LastWords, OfAClientThatStaysButReadsNothingMoreEndTheConnection) {
  ::shutdown(sd_bus_get_fd(client->bus()), SHUT_RD);
  server.takeHeld().reply({std::string("unwanted")});
  EXPECT_TRUE(hasEnded());
}

/// A connection to a service that owes an answer, and a loop of its own.
class LastAnswer : public ::testing::Test {
 protected:
  void SetUp() override {
    std::string why;
    connection = connectToPath(loop, global, service.path(), why);
    ASSERT_NE(connection, nullptr) << why;
    connection->setRemoteInterface(testInterface());
    connection->resume();
    owed = std::make_unique<PendingCall>(connection, "hold", Arguments{});
    ASSERT_TRUE(eventually([this] { return service.held() == 1; }));
  }
  void callThreeTimes() {
    for (std::int32_t i = 0; i < 3; ++i) later.emplace_back(connection, "number", Arguments{i});
  }
  void answerAndLeave() {
    service.takeHeld().reply({std::string("freed")});
    service.loop.runAndWait([] {});
    service.stop();
  }
  /// Once what was submitted so far has run.
  void waitForGlobal() {
    CountingSemaphore reached(0);
    global.async([&reached] { reached.signal(); });
    reached.wait();
  }

  TestServer service;
  ConcurrentQueue global{{.parallelism = 1}};
  IpcLoop loop;
  std::shared_ptr<Connection> connection;
  std::unique_ptr<PendingCall> owed;
  std::vector<PendingCall> later;
};

TEST_F(LastAnswer, OfAServiceThatIsCalledAgainInTheMomentItLeavesIsTaken) {
  BusyLoop before(loop);
  BusyLoop busy(loop, &before, [this] { callThreeTimes(); });
  answerAndLeave();
  busy.letGo();
  const Outcome outcome = owed->wait();
  ASSERT_TRUE(outcome.reply);
  EXPECT_EQ(std::get<std::string>(outcome.reply->at(0)), "freed");
  for (PendingCall& call : later) {
    EXPECT_EQ(call.wait().error.value().name, "org.freedesktop.DBus.Error.Disconnected");
    EXPECT_EQ(call.ends(), 1U);
  }
}

// Who hears of a failed call may connect again at once, and must not be given this connection.
TEST_F(LastAnswer, IsTakenBeforeTheCallsThatCameTooLateFail) {
  CountingSemaphore sent(0);
  CountingSemaphore released(0);
  BusyLoop before(loop);
  BusyLoop busy(loop, &before, [&] {
    callThreeTimes();
    loop.post([&] {
      sent.signal();
      released.wait();
    });
  });
  answerAndLeave();
  busy.letGo();
  sent.wait();
  waitForGlobal();
  for (const PendingCall& call : later) EXPECT_EQ(call.ends(), 0U);
  EXPECT_FALSE(connection->ended());
  released.signal();
  for (PendingCall& call : later) EXPECT_TRUE(call.wait().error);
  EXPECT_TRUE(connection->ended());
  EXPECT_TRUE(owed->wait().reply);
}

}  // namespace
}  // namespace spacekeep::ipc::test
