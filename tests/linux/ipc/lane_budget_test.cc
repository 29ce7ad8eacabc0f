// What the calls of one user may hold that wait in lanes, whatever becomes of their connections.
#include <gtest/gtest.h>

#include "support/ipc/linux/lane_budget.h"
#include "tests/linux/ipc/ipc_world.h"

namespace spacekeep::ipc::test {
namespace {

constexpr uid_t kUser = 7;

TEST(LaneBudget, HoldsSoManyCallsOfAUserAndNoMore) {
  const auto budget = std::make_shared<LaneBudget>(UserTurnLimits{2, 1000});
  std::string why;
  const auto first = budget->take(kUser, 10, why);
  auto second = budget->take(kUser, 10, why);
  EXPECT_NE(first, nullptr);
  EXPECT_NE(second, nullptr);
  EXPECT_EQ(budget->take(kUser, 10, why), nullptr);
  EXPECT_EQ(why, "2 calls of this user with 20 bytes wait or are served; wait for answers");
  EXPECT_NE(budget->take(kUser + 1, 10, why), nullptr);
  second = nullptr;
  EXPECT_NE(budget->take(kUser, 10, why), nullptr);
}

TEST(LaneBudget, HoldsExactlySoManyBytes) {
  const auto budget = std::make_shared<LaneBudget>(UserTurnLimits{10, 100});
  std::string why;
  const auto first = budget->take(kUser, 60, why);
  EXPECT_EQ(budget->take(kUser, 41, why), nullptr);
  EXPECT_NE(budget->take(kUser, 40, why), nullptr);
  EXPECT_EQ(budget->take(kUser, 101, why), nullptr);
}

TEST(LaneBudget, LivesAsLongAsARoomOfIt) {
  auto budget = std::make_shared<LaneBudget>(UserTurnLimits{1, 100});
  const std::weak_ptr<LaneBudget> watched = budget;
  std::string why;
  auto room = budget->take(kUser, 60, why);
  budget = nullptr;
  EXPECT_FALSE(watched.expired());
  room = nullptr;
  EXPECT_TRUE(watched.expired());
}

TEST(CallsInALane, OfAUserWhoComesAndGoesAreBounded) {
  ServerOptions options = TestServer::defaultOptions();
  options.limits.lanes.waiting_calls = 5;
  TestServer server(options);
  std::vector<PendingCall> calls;
  for (int i = 0; i < 5; ++i) {
    const auto connection = server.connect();
    calls.emplace_back(connection, "block", Arguments{});
    // In order behind it on the same connection: so it was taken.
    ASSERT_TRUE(callAndWait(connection, "number", {std::int32_t{i}}).reply);
    connection->invalidate();
  }
  const auto connection = server.connect();
  const Outcome refused = callAndWait(connection, "block", {});
  ASSERT_TRUE(refused.error);
  EXPECT_EQ(refused.error->name, "org.freedesktop.DBus.Error.LimitsExceeded");
  EXPECT_TRUE(callAndWait(connection, "number", {std::int32_t{9}}).reply);
  server.releaseBlocked(5);
  EXPECT_TRUE(eventually([&] { return server.blocked() == 0; }));
  server.releaseBlocked(1);
  EXPECT_TRUE(eventually([&] { return callAndWait(connection, "block", {}).reply.has_value(); }));
}

TEST(CallsInALane, OfAUserAreBoundedByTheirBytes) {
  ServerOptions options = TestServer::defaultOptions();
  options.limits.lanes.waiting_bytes = 16;  // less than any message has
  TestServer server(options);
  const Outcome refused = callAndWait(server.connect(), "block", {});
  ASSERT_TRUE(refused.error);
  EXPECT_EQ(refused.error->name, "org.freedesktop.DBus.Error.LimitsExceeded");
  EXPECT_EQ(server.blocked(), 0U);
}

class CallsThatBringADescriptor : public ::testing::Test {
 protected:
  static constexpr std::size_t kMost = 5;

  /// Room for kMost of them, by their descriptors alone.
  static ServerOptions options() {
    ServerOptions options = TestServer::defaultOptions();
    options.limits.lanes.waiting_bytes = (kMost + 1) * 16 * 1024 - 1;
    return options;
  }
  /// One that is not answered, over a connection that is gone when it waits.
  void leaveOne() {
    const std::size_t before = server.held();
    const auto connection = server.connect();
    calls.emplace_back(connection, "holdDescriptor", Arguments{makeSocketPair().first});
    ASSERT_TRUE(eventually([&] { return server.held() == before + 1; }));
    connection->invalidate();
  }
  std::string errorOfOneMore() {
    const auto outcome =
        callAndWait(server.connect(), "holdDescriptor", Arguments{makeSocketPair().first});
    return outcome.error ? outcome.error->name : "";
  }

  TestServer server{options()};
  std::vector<PendingCall> calls;
};

TEST_F(CallsThatBringADescriptor, OfAUserWhoComesAndGoesAreBounded) {
  for (std::size_t i = 0; i < kMost; ++i) leaveOne();
  EXPECT_EQ(errorOfOneMore(), "org.freedesktop.DBus.Error.LimitsExceeded");
  EXPECT_EQ(server.held(), kMost);
  EXPECT_TRUE(callAndWait(server.connect(), "number", {std::int32_t{9}}).reply);
}

TEST_F(CallsThatBringADescriptor, MakeRoomForOthersWhenTheyAreAnsweredOrDropped) {
  for (std::size_t i = 0; i < kMost; ++i) leaveOne();
  static_cast<void>(server.takeHeld());
  leaveOne();
  server.takeHeld().reply({});
  leaveOne();
  EXPECT_EQ(errorOfOneMore(), "org.freedesktop.DBus.Error.LimitsExceeded");
}

}  // namespace
}  // namespace spacekeep::ipc::test
