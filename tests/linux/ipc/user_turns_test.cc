// Turns of users: one call of each at a time, in order, and never one user behind another's backlog.
#include "support/ipc/linux/user_turns.h"

#include <gtest/gtest.h>

#include <memory>
#include <mutex>
#include <string>
#include <utility>
#include <vector>

#include "tests/linux/ipc/ipc_world.h"

namespace spacekeep::ipc::test {
namespace {

constexpr uid_t kOne = 1001;
constexpr uid_t kOther = 1002;

class Recorder {
 public:
  UserTurns::Call call(std::string name, bool needs_turn = true, std::size_t bytes = 1) {
    return {needs_turn, bytes, [this, name = std::move(name)] { started_.push_back(name); }};
  }
  [[nodiscard]] const std::vector<std::string>& started() const { return started_; }

 private:
  std::vector<std::string> started_;
};

using Names = std::vector<std::string>;

TEST(UserTurns, OneCallOfAUserIsServedUntilItIsAnswered) {
  Recorder recorder;
  UserTurns turns({});
  turns.add(kOne, recorder.call("first"));
  turns.add(kOne, recorder.call("second"));
  EXPECT_EQ(recorder.started(), Names{"first"});
  EXPECT_EQ(turns.waiting(kOne), 1U);
  turns.end(kOne);
  EXPECT_EQ(recorder.started(), (Names{"first", "second"}));
  turns.end(kOne);
  EXPECT_EQ(turns.waiting(kOne), 0U);
}

TEST(UserTurns, ABacklogOfOneUserDoesNotHoldUpAnother) {
  Recorder recorder;
  UserTurns turns({});
  for (int i = 0; i < 1000; ++i) turns.add(kOne, recorder.call("backlog"));
  turns.add(kOther, recorder.call("small"));
  EXPECT_EQ(recorder.started(), (Names{"backlog", "small"}));
}

TEST(UserTurns, ACallThatNeedsNoTurnKeepsItsPlaceBehindTheEarlierOnesOfItsUser) {
  Recorder recorder;
  UserTurns turns({});
  turns.add(kOne, recorder.call("set"));
  turns.add(kOne, recorder.call("check in", false));
  turns.add(kOne, recorder.call("get"));
  EXPECT_EQ(recorder.started(), Names{"set"});
  turns.end(kOne);
  EXPECT_EQ(recorder.started(), (Names{"set", "check in", "get"}));
}

TEST(UserTurns, WithoutAnEarlierCallNoTurnIsWaitedFor) {
  Recorder recorder;
  UserTurns turns({});
  turns.add(kOne, recorder.call("check in", false));
  turns.add(kOne, recorder.call("check in again", false));
  EXPECT_EQ(recorder.started(), (Names{"check in", "check in again"}));
}

TEST(UserTurns, TooManyWaitingCallsOfAUserAreRefusedAndNobodyElses) {
  Recorder recorder;
  UserTurns turns({.waiting_calls = 2, .waiting_bytes = 1000});
  turns.add(kOne, recorder.call("served"));
  for (int i = 0; i < 2; ++i) {
    EXPECT_EQ(turns.refusal(kOne, 1), "");
    turns.add(kOne, recorder.call("waits"));
  }
  EXPECT_EQ(turns.refusal(kOne, 1),
            "2 calls of this user with 2 bytes wait for their turn; wait for answers");
  EXPECT_EQ(turns.refusal(kOther, 1), "");
  turns.end(kOne);
  EXPECT_EQ(turns.refusal(kOne, 1), "");
}

TEST(UserTurns, TooManyWaitingBytesOfAUserAreRefused) {
  Recorder recorder;
  UserTurns turns({.waiting_calls = 100, .waiting_bytes = 1000});
  turns.add(kOne, recorder.call("served", true, 900));
  turns.add(kOne, recorder.call("waits", true, 900));
  EXPECT_EQ(turns.refusal(kOne, 100), "");
  EXPECT_NE(turns.refusal(kOne, 101), "");
}

const InterfaceDescription& interfaceWithTurns() {
  static const InterfaceDescription interface {
    "com.quorvel.TurnsTest", {
      {
        "hold", {}, {}
      }
    }
  };
  return interface;
}

/// Keeps what it is asked until it is told to answer the oldest.
class HoldingServer {
 public:
  /// `token` lives as long as the server's handlers.
  explicit HoldingServer(UserTurnLimits limits = {}, std::shared_ptr<int> token = nullptr) {
    ServerOptions options;
    options.limits.turns = limits;
    server_ = std::make_unique<BusServer>(loop, global, interface(std::move(token)), options);
    std::string why;
    server_->serveListening(bindListeningSocket(path(), 0600, why));
  }
  [[nodiscard]] std::string path() const { return directory_ / "server.sock"; }
  [[nodiscard]] std::size_t held() const {
    const std::scoped_lock lock(mutex_);
    return held_.size();
  }
  /// Answers the oldest, or drops it without an answer.
  void letGo(bool with_answer) {
    Responder oldest;
    {
      const std::scoped_lock lock(mutex_);
      oldest = std::move(held_.front());
      held_.erase(held_.begin());
    }
    if (with_answer) oldest.reply({});
  }

 private:
  ServedInterface interface(std::shared_ptr<int> token) {
    ServedMethod hold;
    hold.name = "hold";
    hold.turn_per_user = true;
    hold.serve = [this, token = std::move(token)](const Arguments&, Responder responder) {
      const std::scoped_lock lock(mutex_);
      held_.push_back(std::move(responder));
    };
    return {.description = &interfaceWithTurns(), .methods = {hold}};
  }

  spacekeep::test::TemporaryDirectory directory_;
  ConcurrentQueue global{{}};
  IpcLoop loop;
  mutable rt::Mutex mutex_;
  std::vector<Responder> held_;  // protected by mutex_
  std::unique_ptr<BusServer> server_;
};

void sendHold(BareClient& client) {
  sd_bus_message* call = client.newCall("hold", "com.quorvel.TurnsTest");
  ASSERT_GE(sd_bus_send(client.bus(), call, nullptr), 0);
  sd_bus_message_unref(call);
  ASSERT_GE(sd_bus_flush(client.bus()), 0);
}

TEST(UserTurns, CallsOfOneUserOnTwoConnectionsAreServedOneAfterTheOther) {
  HoldingServer server;
  BareClient one(server.path());
  BareClient other(server.path());
  sendHold(one);
  ASSERT_TRUE(eventually([&] { return server.held() == 1; }));
  sendHold(other);
  sendHold(one);
  // An error for a call that needs no turn shows that the earlier ones have been read.
  EXPECT_NE(one.errorOf(one.newCall("nothing", "com.quorvel.TurnsTest")), "");
  EXPECT_NE(other.errorOf(other.newCall("nothing", "com.quorvel.TurnsTest")), "");
  EXPECT_EQ(server.held(), 1U);
  server.letGo(true);
  EXPECT_TRUE(eventually([&] { return server.held() == 1; }));
  server.letGo(false);
  EXPECT_TRUE(eventually([&] { return server.held() == 1; }));
}

TEST(UserTurns, CallsThatWaitAreGoneWithTheServer) {
  auto token = std::make_shared<int>(0);
  const std::weak_ptr<int> kept = token;
  {
    HoldingServer server({}, std::exchange(token, nullptr));
    BareClient client(server.path());
    sendHold(client);
    sendHold(client);
    EXPECT_NE(client.errorOf(client.newCall("nothing", "com.quorvel.TurnsTest")), "");
    EXPECT_TRUE(eventually([&] { return server.held() == 1; }));
  }
  EXPECT_TRUE(kept.expired());
}

TEST(UserTurns, ACallBeyondWhatAUserMayHaveWaitingIsAnsweredWithAnError) {
  HoldingServer server({.waiting_calls = 1, .waiting_bytes = 1'000'000});
  BareClient client(server.path());
  sendHold(client);
  sendHold(client);
  std::string text;
  EXPECT_EQ(client.errorOf(client.newCall("hold", "com.quorvel.TurnsTest"), &text),
            "org.freedesktop.DBus.Error.LimitsExceeded");
  EXPECT_NE(text.find("calls of this user"), std::string::npos) << text;
}

}  // namespace
}  // namespace spacekeep::ipc::test
