// What a connection promises about its calls: order, one end for each, lanes, limits.
#include <gtest/gtest.h>

#include <vector>

#include "tests/helpers/log_capture.h"
#include "tests/linux/ipc/ipc_world.h"

namespace spacekeep::ipc::test {
namespace {

TEST(Calls, OfOneConnectionAreServedAndAnsweredInOrder) {
  TestServer server;
  const auto connection = server.connect();
  std::vector<PendingCall> calls;
  for (std::int32_t i = 0; i < 50; ++i) calls.emplace_back(connection, "number", Arguments{i});
  for (std::int32_t i = 0; i < 50; ++i) {
    const Outcome outcome = calls[static_cast<std::size_t>(i)].wait();
    ASSERT_TRUE(outcome.reply);
    EXPECT_EQ(std::get<std::int32_t>(outcome.reply->at(0)), i);
  }
  std::vector<std::int32_t> expected(50);
  for (std::int32_t i = 0; i < 50; ++i) expected[static_cast<std::size_t>(i)] = i;
  EXPECT_EQ(server.numbers(), expected);
}

TEST(Calls, MadeBeforeResumeAreHeldAndThenGoOutFirst) {
  TestServer server;
  std::string why;
  const auto connection = connectToPath(server.loop, server.global, server.path(), why);
  connection->setRemoteInterface(testInterface());
  PendingCall early(connection, "number", {std::int32_t{1}});
  EXPECT_EQ(server.served(), 0U);
  connection->resume();
  PendingCall late(connection, "number", {std::int32_t{2}});
  EXPECT_TRUE(early.wait().reply);
  EXPECT_TRUE(late.wait().reply);
  EXPECT_EQ(server.numbers(), (std::vector<std::int32_t>{1, 2}));
}

TEST(Calls, ReachTheInterfaceBesideOnTheSameConnection) {
  TestServer server;
  const auto connection = server.connect();
  const Outcome outcome = callAndWait(connection, "aside", {});
  ASSERT_TRUE(outcome.reply);
  EXPECT_EQ(std::get<std::string>(outcome.reply->at(0)), "from beside");
  EXPECT_TRUE(callAndWait(connection, "number", {std::int32_t{1}}).reply);
}

TEST(Calls, AnswersMayComeInAnyOrder) {
  TestServer server;
  const auto connection = server.connect();
  PendingCall first(connection, "hold", {});
  ASSERT_TRUE(eventually([&] { return server.held() == 1; }));
  PendingCall second(connection, "hold", {});
  ASSERT_TRUE(eventually([&] { return server.held() == 2; }));
  const Responder to_first = server.takeHeld();
  const Responder to_second = server.takeHeld();
  to_second.reply({std::string("second")});
  EXPECT_EQ(std::get<std::string>(second.wait().reply.value().at(0)), "second");
  EXPECT_EQ(first.ends(), 0U);
  to_first.reply({std::string("first")});
  EXPECT_EQ(std::get<std::string>(first.wait().reply.value().at(0)), "first");
}

TEST(Calls, OnlyTheFirstAnswerCounts) {
  TestServer server;
  const auto connection = server.connect();
  PendingCall call(connection, "hold", {});
  ASSERT_TRUE(eventually([&] { return server.held() == 1; }));
  const Responder responder = server.takeHeld();
  responder.reply({std::string("first")});
  responder.reply({std::string("second")});
  responder.fail({"org.example.Error", "third"});
  EXPECT_EQ(std::get<std::string>(call.wait().reply.value().at(0)), "first");
  expectHonestClientIsServed(server);
  EXPECT_EQ(call.ends(), 1U);
}

TEST(Calls, AnErrorReachesTheErrorHandlerWithNameAndText) {
  TestServer server;
  const auto connection = server.connect();
  PendingCall call(connection, "hold", {});
  ASSERT_TRUE(eventually([&] { return server.held() == 1; }));
  server.takeHeld().fail({"org.example.Error", "words"});
  const Outcome outcome = call.wait();
  ASSERT_TRUE(outcome.error);
  EXPECT_EQ(outcome.error->name, "org.example.Error");
  EXPECT_EQ(outcome.error->text, "words");
}

TEST(Calls, ACallWhoseResponderIsDroppedGetsNoAnswerAndMakesRoomForAnother) {
  ServerOptions options = TestServer::defaultOptions();
  options.limits.unanswered_calls = 4;
  TestServer server(options);
  const auto connection = server.connect();
  std::vector<PendingCall> forgotten;
  for (std::size_t i = 1; i <= 20; ++i) {
    forgotten.emplace_back(connection, "forget", Arguments{});
    ASSERT_TRUE(eventually([&] { return server.served() == i; }));
  }
  EXPECT_TRUE(callAndWait(connection, "number", {std::int32_t{1}}).reply);
  for (const PendingCall& call : forgotten) EXPECT_EQ(call.ends(), 0U);
}

TEST(Calls, WithoutAWishForAnAnswerAreServedAndNotAnswered) {
  TestServer server;
  BareClient client(server.path());
  sd_bus_message* call = client.newCall("number");
  ASSERT_GE(sd_bus_message_append(call, "i", 5), 0);
  ASSERT_GE(sd_bus_message_set_expect_reply(call, 0), 0);
  ASSERT_GE(sd_bus_send(client.bus(), call, nullptr), 0);
  sd_bus_message_unref(call);
  ASSERT_GE(sd_bus_flush(client.bus()), 0);
  ASSERT_TRUE(eventually([&] { return server.served() == 1; }));
  // The next message that arrives is the answer to the next call.
  std::uint64_t serial_of_next = 0;
  sd_bus_message* next = client.newCall("number");
  ASSERT_GE(sd_bus_message_append(next, "i", 6), 0);
  ASSERT_GE(sd_bus_send(client.bus(), next, &serial_of_next), 0);
  sd_bus_message_unref(next);
  sd_bus_message* answer = nullptr;
  ASSERT_TRUE(eventually([&] { return sd_bus_process(client.bus(), &answer) < 0 || answer; }));
  std::uint64_t serial = 0;
  ASSERT_GE(sd_bus_message_get_reply_cookie(answer, &serial), 0);
  EXPECT_EQ(serial, serial_of_next);
  sd_bus_message_unref(answer);
}

TEST(Calls, OfOneLaneRunSideBySideUpToItsWidth) {
  TestServer server;
  std::vector<std::shared_ptr<Connection>> connections;
  std::vector<PendingCall> calls;
  for (int i = 0; i < 5; ++i) {
    connections.push_back(server.connect());
    for (int k = 0; k < 10; ++k) calls.emplace_back(connections.back(), "block", Arguments{});
  }
  ASSERT_TRUE(eventually([&] { return server.blocked() == 2; }));
  // Calls that only enqueue are served while the lane is full.
  expectHonestClientIsServed(server);
  EXPECT_LT(server.global.counts().threads, 10U);
  server.releaseBlocked(50);
  for (PendingCall& call : calls) EXPECT_TRUE(call.wait().reply);
  EXPECT_EQ(server.mostBlocked(), 2U);
}

TEST(Calls, BeyondTheUnansweredLimitAreRefusedByNameAndLogged) {
  spacekeep::test::LogCapture log;
  ServerOptions options = TestServer::defaultOptions();
  options.limits.unanswered_calls = 3;
  TestServer server(options);
  const auto connection = server.connect();
  std::vector<PendingCall> held;
  for (int i = 0; i < 3; ++i) held.emplace_back(connection, "hold", Arguments{});
  ASSERT_TRUE(eventually([&] { return server.held() == 3; }));
  const Outcome refused = callAndWait(connection, "number", {std::int32_t{1}});
  ASSERT_TRUE(refused.error);
  EXPECT_EQ(refused.error->name, "org.freedesktop.DBus.Error.LimitsExceeded");
  EXPECT_EQ(log.count(kLogProblem, "SpacekeepListener number of "), 1U);
  EXPECT_EQ(
      log.count(kLogProblem, " refused: 3 calls of this connection are unanswered; wait for them"),
      1U);
  expectHonestClientIsServed(server);
  server.takeHeld().reply({std::string()});
  EXPECT_TRUE(held[0].wait().reply);
  EXPECT_TRUE(callAndWait(connection, "number", {std::int32_t{2}}).reply);
}

TEST(Calls, BeyondTheCallersOwnLimitEndTheConnection) {
  spacekeep::test::LogCapture log;
  TestServer server;
  ConnectionLimits limits;
  limits.pending_calls = 3;
  const auto connection = server.connect(limits);
  std::vector<PendingCall> calls;
  for (int i = 0; i < 4; ++i) calls.emplace_back(connection, "forget", Arguments{});
  for (PendingCall& call : calls) EXPECT_TRUE(call.wait().error);
  EXPECT_EQ(log.count(kLogProblem, "3 calls are unanswered"), 1U);
}

TEST(Calls, UnlessToldOtherwiseTwoHundredAndFiftySixMayWaitForOnePeer) {
  ServerOptions options = TestServer::defaultOptions();
  options.limits.unanswered_calls = 1000;
  TestServer server(options);
  const auto connection = server.connect();
  std::vector<PendingCall> calls;
  for (int i = 0; i < 256; ++i) calls.emplace_back(connection, "hold", Arguments{});
  ASSERT_TRUE(eventually([&] { return server.held() == 256; }));
  calls.emplace_back(connection, "hold", Arguments{});
  for (PendingCall& call : calls) EXPECT_TRUE(call.wait().error);
}

TEST(Calls, TheLoopSleepsWhileNothingHappens) {
  TestServer server;
  const auto connection = server.connect();
  ASSERT_TRUE(callAndWait(connection, "number", {std::int32_t{1}}).reply);
  server.loop.runAndWait([] {});
  // What the call left to do may still come for a while.
  EXPECT_TRUE(eventually([&] { return wakeUpsInNs(server.loop, 1'000'000'000) == 0; }));
}

}  // namespace
}  // namespace spacekeep::ipc::test
