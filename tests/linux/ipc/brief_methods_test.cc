// Methods that the IPC thread serves itself.
#include <gtest/gtest.h>

#include <vector>

#include "tests/linux/ipc/ipc_world.h"

namespace spacekeep::ipc::test {
namespace {

TEST(BriefMethods, ThatHaveToWaitAfterAllHoldUpNobody) {
  TestServer server;
  const auto waiting = server.connect();
  // Two in a lane of two: each waits until it is released, and each gives the duty on.
  PendingCall first(waiting, "blockBriefly", {});
  PendingCall second(waiting, "blockBriefly", {});
  ASSERT_TRUE(eventually([&] { return server.blocked() == 2; }));
  expectHonestClientIsServed(server);
  server.releaseBlocked(2);
  EXPECT_TRUE(first.wait().reply);
  EXPECT_TRUE(second.wait().reply);
}

TEST(BriefMethods, KeepTheOrderOfTheirConnectionWithThoseThatAreNot) {
  TestServer server;
  const auto connection = server.connect();
  std::vector<PendingCall> calls;
  std::vector<std::int32_t> expected;
  for (std::int32_t i = 0; i < 60; ++i) {
    calls.emplace_back(connection, i % 3 == 0 ? "number" : "numberBriefly", Arguments{i});
    expected.push_back(i);
  }
  for (PendingCall& call : calls) ASSERT_TRUE(call.wait().reply);
  EXPECT_EQ(server.numbers(), expected);
}

}  // namespace
}  // namespace spacekeep::ipc::test
