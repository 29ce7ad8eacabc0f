// A user who has used up a share of the IPC thread waits until it has come back: with messages that
// are there already, with new connections, and without holding up anybody else.
#include "support/ipc/linux/user_pace.h"

#include <gtest/gtest.h>
#include <sys/socket.h>

#include <atomic>
#include <memory>
#include <vector>

#include "tests/linux/ipc/ipc_world.h"

namespace spacekeep::ipc::test {
namespace {

constexpr std::uint64_t kSecondNs = 1'000'000'000;
constexpr uid_t kOne = 60'001;  // neither root nor whoever runs the tests
constexpr uid_t kOther = 60'002;

UserShareLimits smallShares() {
  UserShareLimits limits;
  limits.percent = 10;
  limits.saved_ns = kSecondNs / 100;
  limits.look_again_ns = kSecondNs / 1000;
  limits.limits_privileged_users = true;
  return limits;
}

ServerOptions optionsWith(const UserShareLimits& shares) {
  ServerOptions options = TestServer::defaultOptions();
  options.limits.shares = shares;
  return options;
}

double secondsSince(std::uint64_t start_ticks) {
  const auto base = rt::timebase();
  return static_cast<double>(rt::ticks() - start_ticks) * base->numerator / base->denominator / 1e9;
}

void callNumber(BareClient& client, int number) {
  sd_bus_message* call = client.newCall("number");
  ASSERT_GE(sd_bus_message_append(call, "i", number), 0);
  ASSERT_EQ(client.errorOf(call), "");
}

TEST(UserPace, RootAndTheServersOwnUserAreNotHeldUp) {
  IpcLoop loop;
  loop.runAndWait([&loop] {
    UserPace pace(loop, {});
    for (int i = 0; i < 1000; ++i) {
      pace.spendOnCall(0, true);
      pace.spendOnCall(::geteuid(), true);
      pace.spendOnCall(kOne, true);
    }
    EXPECT_TRUE(pace.mayGoOn(0));
    EXPECT_TRUE(pace.mayGoOn(::geteuid()));
    EXPECT_FALSE(pace.mayGoOn(kOne));
    EXPECT_TRUE(pace.mayGoOn(kOther));
  });
}

TEST(UserPace, EachKindOfWorkHasItsCost) {
  UserShareLimits limits = smallShares();
  limits.percent = 1;  // next to nothing comes back while this looks
  limits.saved_ns = 100'000'000;
  IpcLoop loop;
  const auto timesUntilHeldUp = [&loop, &limits](const auto& spend) {
    int times = 0;
    loop.runAndWait([&] {
      UserPace pace(loop, limits);
      for (; pace.mayGoOn(kOne) && times < 100'000; ++times) spend(pace);
    });
    return times;
  };
  EXPECT_NEAR(timesUntilHeldUp([](UserPace& pace) { pace.spendOnMessage(kOne, 0); }), 3334, 100);
  EXPECT_NEAR(timesUntilHeldUp([](UserPace& pace) { pace.spendOnMessage(kOne, 970'000); }), 101, 5);
  EXPECT_NEAR(timesUntilHeldUp([](UserPace& pace) { pace.spendOnCall(kOne, false); }), 3334, 100);
  EXPECT_NEAR(timesUntilHeldUp([](UserPace& pace) { pace.spendOnCall(kOne, true); }), 101, 5);
  EXPECT_NEAR(timesUntilHeldUp([](UserPace& pace) { pace.spendOnConnection(kOne); }), 501, 15);
}

TEST(UserPace, WhatWaitsGoesOnInItsOrderAndAFewAtATime) {
  IpcLoop loop;
  UserShareLimits limits = smallShares();
  limits.resumed_at_once = 3;
  UserPace pace(loop, limits);
  std::vector<int> resumed;  // IPC thread
  std::atomic<std::size_t> count{0};
  loop.runAndWait([&] {
    for (int i = 0; i < 8; ++i) {
      pace.wait(kOne, [&resumed, &count, i] {
        resumed.push_back(i);
        ++count;
      });
    }
    EXPECT_EQ(pace.waiting(kOne), 8U);
    EXPECT_EQ(pace.waiting(), 8U);
    EXPECT_EQ(pace.waiting(kOther), 0U);
  });
  ASSERT_TRUE(eventually([&count] { return count == 8; }));
  loop.runAndWait([&] {
    EXPECT_EQ(resumed, (std::vector<int>{0, 1, 2, 3, 4, 5, 6, 7}));
    EXPECT_EQ(pace.waiting(), 0U);
    pace.close();
  });
}

TEST(UserPace, WhatWaitsWhenItClosesIsDroppedAndNothingWaitsAfterwards) {
  IpcLoop loop;
  UserPace pace(loop, smallShares());
  const auto token = std::make_shared<int>(0);
  std::atomic<bool> ran{false};
  loop.runAndWait([&] {
    pace.wait(kOne, [token, &ran] { ran = true; });
    pace.close();
    pace.wait(kOne, [token, &ran] { ran = true; });
    EXPECT_EQ(pace.waiting(), 0U);
  });
  EXPECT_EQ(token.use_count(), 1);
  EXPECT_FALSE(ran);
}

TEST(UserPace, AFloodIsServedToTheLastButNoFasterThanItsShare) {
  constexpr int kCalls = 1000;
  UserShareLimits shares = smallShares();
  shares.message_ns = 50'000;
  shares.call_ns = 50'000;
  shares.byte_ns = 0;
  TestServer server(optionsWith(shares));
  BareClient client(server.path());
  const std::uint64_t start_ticks = rt::ticks();
  for (int i = 0; i < kCalls; ++i) callNumber(client, i);
  // 1,000 calls of 0.1 ms are 0.1 s of work, of which 10 ms were saved; a tenth of the time comes
  // back. The last turn may go beyond what there was.
  EXPECT_GE(secondsSince(start_ticks), 0.85);
  EXPECT_EQ(server.numbers().size(), static_cast<std::size_t>(kCalls));
}

TEST(UserPace, ANewConnectionWaitsAsWellAndIsServedThen) {
  UserShareLimits shares = smallShares();
  shares.connection_ns = kSecondNs / 50;  // twice of what is saved
  TestServer server(optionsWith(shares));
  const std::uint64_t start_ticks = rt::ticks();
  BareClient first(server.path());
  callNumber(first, 1);
  BareClient second(server.path());
  callNumber(second, 2);
  EXPECT_GE(secondsSince(start_ticks), 0.2);
  EXPECT_EQ(server.numbers(), (std::vector<std::int32_t>{1, 2}));
}

TEST(UserPace, NoMoreConnectionsWaitThanAUserMayHave) {
  UserShareLimits shares = smallShares();
  shares.connection_ns = 1000 * kSecondNs;
  ServerOptions options = optionsWith(shares);
  options.limits.connections_per_uid = 3;
  TestServer server(options);
  std::vector<std::unique_ptr<RawPeer>> peers;
  for (int i = 0; i < 5; ++i) peers.push_back(std::make_unique<RawPeer>(server.path()));
  // The first one is served and three wait.
  EXPECT_TRUE(peers[4]->isCutOff());
  EXPECT_EQ(server.server().connections(), 1U);
}

TEST(UserPace, APeerThatLeavesWhileItWaitsIsForgottenInTime) {
  UserShareLimits shares = smallShares();
  shares.call_ns = kSecondNs / 50;
  TestServer server(optionsWith(shares));
  {
    BareClient client(server.path());
    callNumber(client, 1);
    sd_bus_message* call = client.newCall("number");
    ASSERT_GE(sd_bus_message_append(call, "i", 2), 0);
    ASSERT_GE(sd_bus_send(client.bus(), call, nullptr), 0);
    sd_bus_message_unref(call);
    ASSERT_GE(sd_bus_flush(client.bus()), 0);
  }
  EXPECT_TRUE(eventually([&server] { return server.server().connections() == 0; }));
  // The call came before the end; a worker of the server's serves it.
  const std::vector<std::int32_t> both = {1, 2};
  EXPECT_TRUE(eventually([&] { return server.numbers() == both; }));
}

TEST(UserPace, AServerThatStopsWhileConnectionsWaitLeavesNothingBehind) {
  UserShareLimits shares = smallShares();
  shares.connection_ns = 1000 * kSecondNs;
  TestServer server(optionsWith(shares));
  RawPeer served(server.path());
  RawPeer waiting(server.path());
  ASSERT_TRUE(eventually([&server] { return server.server().connections() == 1; }));
  server.stop();
  EXPECT_TRUE(served.isCutOff());
  EXPECT_TRUE(waiting.isCutOff());
}

TEST(UserPace, WithoutAnybodyWhoWaitsThereIsNoTimer) {
  TestServer server(optionsWith(smallShares()));
  BareClient client(server.path());
  callNumber(client, 1);
  EXPECT_LE(wakeUpsInNs(server.loop, kSecondNs / 5), 1U);
}

}  // namespace
}  // namespace spacekeep::ipc::test
