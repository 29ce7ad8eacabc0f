#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <spacekeep/client.h>

#include <atomic>
#include <memory>
#include <optional>
#include <string>
#include <utility>

#include "tests/linux/sdk/fake_daemon.h"

namespace spacekeep::sdk {
namespace {

using std::chrono::milliseconds;
using testing::HasSubstr;

class ClientTest : public testing::Test {
 protected:
  Client connect(std::function<void()> on_disconnect = {}) {
    auto client = Client::connect({directory_.daemonSocket(), std::move(on_disconnect)});
    EXPECT_TRUE(client) << client.error().text;
    return std::move(*client);
  }

  SocketDirectory directory_;
  FakeDaemon daemon_{directory_.daemonSocket()};
};

TEST_F(ClientTest, WithoutADaemonTheSocketIsUnreachableAndTheTextNamesIt) {
  const auto client = Client::connect({directory_.daemonSocket(), {}});
  ASSERT_FALSE(client);
  EXPECT_EQ(client.error().kind, ErrorKind::kUnreachable);
  EXPECT_THAT(client.error().text, HasSubstr(directory_.daemonSocket()));
}

TEST_F(ClientTest, APurgeRequestArrivesUnderTheDaemonsKeysAndItsOutcomeComesBack) {
  rt::Guarded<Dictionary> seen;
  daemon_.on("clientPurge", [&](const ipc::Arguments& in, const ipc::Responder& responder) {
    seen.set(std::get<Dictionary>(in.at(0)));
    responder.reply(outcome({{"SPACEKEEP_AMOUNT", 77}}));
  });
  const auto running = daemon_.run();
  Client client = connect();
  PurgeRequest request;
  request.volume = "/data";
  request.amount = UINT64_MAX;
  request.urgency = 4;
  request.timeout_seconds = 5;
  request.token = Value("mine");
  request.finish_early = true;
  const Reply reply = client.purge(request);
  ASSERT_TRUE(reply.outcome) << reply.error->text;
  EXPECT_EQ(*reply.outcome, (Dictionary{{"SPACEKEEP_AMOUNT", 77}}));
  EXPECT_FALSE(reply.refused());
  EXPECT_EQ(seen.get(), (Dictionary{{"SPACEKEEP_VOLUME", "/data"},
                                    {"SPACEKEEP_AMOUNT", UINT64_MAX},
                                    {"SPACEKEEP_URGENCY", 4},
                                    {"SPACEKEEP_PURGE_TIMEOUT", 5},
                                    {"SPACEKEEP_TOKEN", "mine"},
                                    {"SPACEKEEP_FINISH_EARLY", true}}));
}

TEST_F(ClientTest, WhatIsLeftEmptyInAPurgeRequestIsNotSent) {
  PurgeRequest request;
  request.volume = "/";
  request.amount = 1;
  EXPECT_EQ(request.info(), (Dictionary{{"SPACEKEEP_VOLUME", "/"}, {"SPACEKEEP_AMOUNT", 1}}));
}

TEST_F(ClientTest, NoDictionaryIsARefusalAndAnEmptyOneIsNot) {
  std::atomic<int> calls = 0;
  daemon_.on("clientPurge", [&](const ipc::Arguments&, const ipc::Responder& responder) {
    responder.reply(calls++ == 0 ? noDictionary() : outcome({}));
  });
  const auto running = daemon_.run();
  Client client = connect();
  EXPECT_TRUE(client.purge({}).refused());
  const Reply second = client.purge({});
  EXPECT_FALSE(second.refused());
  EXPECT_EQ(second.outcome, Dictionary());
}

TEST_F(ClientTest, AnOperationThatTheDaemonDoesNotOfferIsNotSupported) {
  const auto running = daemon_.run();
  Client client = connect();
  const Dictionary info{{"SPACEKEEP_VOLUME", "/"}};
  for (const Reply& reply : {client.purgeableSpace(info), client.itemizedPurgeableSpace(info),
                             client.call(Operation::kPurgeableSpace, info)}) {
    ASSERT_TRUE(reply.error);
    EXPECT_EQ(reply.error->kind, ErrorKind::kNotSupported);
    EXPECT_FALSE(reply.refused());
  }
  EXPECT_EQ(client.setState("key", Value(1)).error->kind, ErrorKind::kNotSupported);
  const StateReply state = client.state("key");
  EXPECT_EQ(state.error->kind, ErrorKind::kNotSupported);
  EXPECT_THAT(state.error->text, HasSubstr("clientGetState"));
}

TEST_F(ClientTest, EachOperationCallsItsOwnMember) {
  for (const auto* member :
       {"clientPurge", "clientPurgeableSpace", "clientItemizedPurgeableSpace"}) {
    daemon_.on(member, [member](const ipc::Arguments&, const ipc::Responder& responder) {
      responder.reply(outcome({{"member", member}}));
    });
  }
  const auto running = daemon_.run();
  Client client = connect();
  const auto member = [](const Reply& reply) { return *stringAt(*reply.outcome, "member"); };
  EXPECT_EQ(member(client.call(Operation::kPurge, {})), "clientPurge");
  EXPECT_EQ(member(client.call(Operation::kPurgeableSpace, {})), "clientPurgeableSpace");
  EXPECT_EQ(member(client.call(Operation::kItemizedPurgeableSpace, {})),
            "clientItemizedPurgeableSpace");
}

TEST_F(ClientTest, AHistoryRequestArrivesUnderTheDaemonsKeysAndItsPageComesBack) {
  rt::Guarded<std::vector<Dictionary>> seen;
  const Dictionary page{{"SPACEKEEP_ENTRIES", Array{Dictionary{{"SPACEKEEP_ENTRY", 7}}}},
                        {"SPACEKEEP_NEXT", 7}};
  daemon_.on("clientHistory", [&](const ipc::Arguments& in, const ipc::Responder& responder) {
    seen.update([&](auto& list) { list.push_back(std::get<Dictionary>(in.at(0))); });
    responder.reply(outcome(page));
  });
  const auto running = daemon_.run();
  Client client = connect();
  EXPECT_EQ(client.history().outcome, page);
  HistoryRequest request;
  request.before = 8;
  request.limit = 1;
  request.volume = "/data";
  EXPECT_EQ(client.history(request).outcome, page);
  EXPECT_EQ(
      seen.get(),
      (std::vector<Dictionary>{
          {}, {{"SPACEKEEP_BEFORE", 8}, {"SPACEKEEP_LIMIT", 1}, {"SPACEKEEP_VOLUME", "/data"}}}));
}

TEST_F(ClientTest, AHistoryThatTheDaemonDoesNotHaveIsNotSupported) {
  const auto running = daemon_.run();
  Client client = connect();
  const Reply reply = client.history();
  ASSERT_TRUE(reply.error);
  EXPECT_EQ(reply.error->kind, ErrorKind::kNotSupported);
  EXPECT_THAT(reply.error->text, HasSubstr("clientHistory"));
}

TEST_F(ClientTest, ACancelRequestCarriesTheTokenAndIsAnswered) {
  rt::Guarded<Dictionary> seen;
  daemon_.on("clientCancelPurge", [&](const ipc::Arguments& in, const ipc::Responder& responder) {
    seen.set(std::get<Dictionary>(in.at(0)));
    responder.reply({});
  });
  const auto running = daemon_.run();
  Client client = connect();
  EXPECT_TRUE(client.cancel(Value("token")).ok());
  EXPECT_EQ(seen.get(), (Dictionary{{"SPACEKEEP_TOKEN", "token"}}));
}

TEST_F(ClientTest, ClientStateIsWrittenReadAndRemoved) {
  rt::Guarded<std::map<std::string, Value>> kept;
  daemon_.on("clientSetState", [&](const ipc::Arguments& in, const ipc::Responder& responder) {
    const auto& key = std::get<std::string>(in.at(1));
    kept.update([&](auto& state) {
      state.erase(key);
      const auto& value = std::get<ipc::OptionalValue>(in.at(0));
      if (value) state.insert({key, *value});
    });
    responder.reply({});
  });
  daemon_.on("clientGetState", [&](const ipc::Arguments& in, const ipc::Responder& responder) {
    const auto state = kept.get();
    const auto found = state.find(std::get<std::string>(in.at(0)));
    responder.reply({found == state.end() ? ipc::OptionalValue() : found->second});
  });
  const auto running = daemon_.run();
  Client client = connect();
  EXPECT_TRUE(client.setState("key", Value(Array{1, "two"})).ok());
  EXPECT_EQ(client.state("key").value, Value(Array{1, "two"}));
  EXPECT_TRUE(client.setState("key", std::nullopt).ok());
  const StateReply gone = client.state("key");
  EXPECT_FALSE(gone.value);
  EXPECT_FALSE(gone.error);
}

TEST_F(ClientTest, ADeadlineEndsTheWaitingAndTheConnectionGoesOn) {
  rt::Guarded<std::vector<ipc::Responder>> held;
  daemon_.on("clientPurge", [&](const ipc::Arguments&, const ipc::Responder& responder) {
    held.update([&](auto& list) { list.push_back(responder); });
  });
  daemon_.on("clientCancelPurge",
             [](const ipc::Arguments&, const ipc::Responder& responder) { responder.reply({}); });
  const auto running = daemon_.run();
  Client client = connect();
  const Reply reply = client.purge({}, milliseconds(30));
  ASSERT_TRUE(reply.error);
  EXPECT_EQ(reply.error->kind, ErrorKind::kTimedOut);
  EXPECT_EQ(client.purge({}, milliseconds(0)).error->kind, ErrorKind::kTimedOut);
  // The late answer of the first purge is dropped and disturbs nobody.
  ASSERT_TRUE(eventually([&] { return held.get().size() == 2; }));
  for (const auto& responder : held.get()) responder.reply(outcome({{"late", true}}));
  EXPECT_TRUE(client.cancel(Value("t")).ok());
  EXPECT_TRUE(client.connected());
}

TEST_F(ClientTest, AnAnswerBeforeTheDeadlineTakesTheTimerBack) {
  daemon_.on("clientPurge", [](const ipc::Arguments&, const ipc::Responder& responder) {
    responder.reply(outcome({}));
  });
  const auto running = daemon_.run();
  Client client = connect();
  for (int i = 0; i < 200; ++i) {
    const Reply reply = client.purge({}, milliseconds(20'000));
    ASSERT_TRUE(reply.outcome) << reply.error->text;
  }
}

TEST_F(ClientTest, AHandlerRunsOnceAndMayCallTheClientAgain) {
  daemon_.on("clientPurge", [](const ipc::Arguments&, const ipc::Responder& responder) {
    responder.reply(outcome({{"SPACEKEEP_AMOUNT", 5}}));
  });
  const auto running = daemon_.run();
  Client client = connect();
  std::atomic<int> runs = 0;
  rt::Guarded<std::optional<Reply>> inner;
  CountingSemaphore done(0);
  client.purgeAsync({}, [&](const Reply&) {
    ++runs;
    inner.set(client.purge({}));  // a blocking call from a handler
    done.signal();
  });
  done.wait();
  EXPECT_TRUE(inner.get()->outcome);
  EXPECT_EQ(runs, 1);
}

TEST_F(ClientTest, RequestsOfOneClientRunSideBySideAndFindTheirOwnAnswers) {
  rt::Guarded<std::vector<std::pair<std::uint64_t, ipc::Responder>>> held;
  daemon_.on("clientPurge", [&](const ipc::Arguments& in, const ipc::Responder& responder) {
    const auto amount = unsignedAt(std::get<Dictionary>(in.at(0)), "SPACEKEEP_AMOUNT").value();
    held.update([&](auto& list) { list.emplace_back(amount, responder); });
  });
  const auto running = daemon_.run();
  Client client = connect();
  rt::Guarded<std::map<std::uint64_t, std::uint64_t>> answers;
  for (std::uint64_t amount = 0; amount < 20; ++amount) {
    PurgeRequest request;
    request.amount = amount;
    client.purgeAsync(request, [&answers, amount](const Reply& reply) {
      const auto value = unsignedAt(*reply.outcome, "SPACEKEEP_AMOUNT").value();
      answers.update([&](auto& map) { map[amount] = value; });
    });
  }
  ASSERT_TRUE(eventually([&] { return held.get().size() == 20; }));
  auto responders = held.get();
  for (auto it = responders.rbegin(); it != responders.rend(); ++it) {
    it->second.reply(outcome({{"SPACEKEEP_AMOUNT", it->first * 10}}));
  }
  ASSERT_TRUE(eventually([&] { return answers.get().size() == 20; }));
  for (const auto& [asked, answered] : answers.get()) EXPECT_EQ(answered, asked * 10);
}

TEST_F(ClientTest, WhenTheDaemonGoesAwayPendingCallsFailAndTheClientIsTold) {
  std::atomic<bool> arrived = false;
  rt::Guarded<ipc::Responder> held;
  daemon_.on("clientPurge", [&](const ipc::Arguments&, const ipc::Responder& responder) {
    held.set(responder);
    arrived = true;
  });
  daemon_.on("clientCancelPurge",
             [](const ipc::Arguments&, const ipc::Responder& responder) { responder.reply({}); });
  const auto running = daemon_.run();
  std::atomic<int> disconnects = 0;
  Client client = connect([&] { ++disconnects; });
  ASSERT_TRUE(client.cancel(Value("t")).ok());  // the daemon has answered this connection
  rt::Guarded<std::optional<Reply>> pending;
  client.purgeAsync({}, [&](const Reply& reply) { pending.set(reply); });
  ASSERT_TRUE(eventually([&] { return arrived.load(); }));
  daemon_.stop();
  ASSERT_TRUE(eventually([&] { return pending.get().has_value(); }));
  ASSERT_TRUE(pending.get()->error);
  EXPECT_EQ(pending.get()->error->kind, ErrorKind::kDisconnected) << pending.get()->error->text;
  EXPECT_TRUE(eventually([&] { return disconnects == 1; }));
  EXPECT_FALSE(client.connected());
  EXPECT_EQ(client.purge({}).error->kind, ErrorKind::kDisconnected);
}

TEST_F(ClientTest, ADaemonThatTurnsThePeerAwayIsToldFromOneThatIsGone) {
  daemon_.turnEverybodyAway();
  const auto running = daemon_.run();
  Client client = connect();
  const Reply reply = client.purge({});
  ASSERT_TRUE(reply.error);
  EXPECT_EQ(reply.error->kind, ErrorKind::kNotAllowed) << reply.error->text;
  EXPECT_THAT(reply.error->text, HasSubstr("\"CLIENT_ENTITLEMENT\""));
}

TEST_F(ClientTest, ARequestThatCannotBeSentFailsAtOnceAndTheConnectionGoesOn) {
  daemon_.on("clientSetState",
             [](const ipc::Arguments&, const ipc::Responder& responder) { responder.reply({}); });
  const auto running = daemon_.run();
  Client client = connect();
  Value deep = 1;
  for (int level = 0; level < 40; ++level) deep = Array{deep};
  const Value large = std::string(2 * 1024 * 1024, 'x');
  // Before anything was answered, and afterwards.
  for (int i = 0; i < 2; ++i) {
    for (const Value& value : {large, deep}) {
      const Status status = client.setState("key", value, milliseconds(20'000));
      ASSERT_TRUE(status.error);
      EXPECT_EQ(status.error->kind, ErrorKind::kInvalidArgument) << status.error->text;
    }
    EXPECT_TRUE(client.setState("key", Value(1)).ok());
  }
  EXPECT_TRUE(client.connected());
}

TEST_F(ClientTest, AnErrorOfTheDaemonsThatIsCalledLikeADisconnectIsToldAtOnce) {
  daemon_.on("clientPurge", [](const ipc::Arguments&, const ipc::Responder& responder) {
    responder.fail({"org.freedesktop.DBus.Error.NoReply", "in words"});
  });
  const auto running = daemon_.run();
  Client client = connect();
  const Reply reply = client.purge({}, milliseconds(20'000));
  ASSERT_TRUE(reply.error);
  EXPECT_THAT(reply.error->text, HasSubstr("in words"));
  EXPECT_TRUE(client.connected());
}

TEST_F(ClientTest, DestroyingAClientEndsItsPendingCallsAndDoesNotReportADisconnect) {
  std::atomic<bool> arrived = false;
  rt::Guarded<ipc::Responder> held;
  daemon_.on("clientPurge", [&](const ipc::Arguments&, const ipc::Responder& responder) {
    held.set(responder);
    arrived = true;
  });
  const auto running = daemon_.run();
  std::atomic<int> disconnects = 0;
  std::optional<ErrorKind> kind;
  {
    Client client = connect([&] { ++disconnects; });
    client.purgeAsync({}, [&](const Reply& reply) { kind = reply.error->kind; });
    ASSERT_TRUE(eventually([&] { return arrived.load(); }));
  }
  EXPECT_EQ(kind, ErrorKind::kDisconnected);
  EXPECT_EQ(disconnects, 0);
}

TEST_F(ClientTest, AClientCanBeMovedWhileACallIsPending) {
  rt::Guarded<std::optional<ipc::Responder>> held;
  daemon_.on("clientPurge",
             [&](const ipc::Arguments&, const ipc::Responder& responder) { held.set(responder); });
  const auto running = daemon_.run();
  Client first = connect();
  std::atomic<bool> answered = false;
  first.purgeAsync({}, [&](const Reply& reply) { answered = reply.outcome.has_value(); });
  Client second = std::move(first);
  ASSERT_TRUE(eventually([&] { return held.get().has_value(); }));
  held.get()->reply(outcome({}));
  EXPECT_TRUE(eventually([&] { return answered.load(); }));
}

}  // namespace
}  // namespace spacekeep::sdk
