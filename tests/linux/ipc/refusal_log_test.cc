// Lines about refusals: so many in a while, and how many more there were.
#include <gtest/gtest.h>

#include "support/ipc/linux/refusal_log.h"
#include "tests/helpers/log_capture.h"
#include "tests/linux/ipc/ipc_world.h"

namespace spacekeep::ipc::test {
namespace {

constexpr std::uint64_t kHourNs = 3600'000'000'000;

class Refusals : public ::testing::Test {
 protected:
  /// That many refusals of a call within one window.
  void refuse(RefusalLog& refusals, unsigned count) {
    loop.runAndWait([&] {
      for (unsigned i = 0; i < count; ++i) refusals.write("uid 7", "no room", "clientPurge");
    });
  }
  void close(RefusalLog& refusals) {
    loop.runAndWait([&] { refusals.close(); });
  }

  spacekeep::test::LogCapture log;
  IpcLoop loop;
};

TEST_F(Refusals, OfCallsAndConnectionsAreToldWithWhoAndWhy) {
  RefusalLog connections(loop, RefusalLog::Of::kConnections, kHourNs);
  RefusalLog calls(loop, RefusalLog::Of::kCalls, kHourNs);
  loop.runAndWait([&] {
    for (int i = 0; i < 21; ++i) connections.write("uid 7", "too many");
    calls.write("uid 8", "no room", "clientPurge");
    connections.close();
    calls.close();
  });
  EXPECT_EQ(log.countExact(kLogProblem,
                           "SpacekeepListener Connection of uid 7 refused or ended: too many"),
            20U);
  EXPECT_EQ(log.countExact(kLogProblem, "SpacekeepListener clientPurge of uid 8 refused: no room"),
            1U);
  EXPECT_EQ(
      log.countExact(kLogProblem, "SpacekeepListener 1 more connections were refused or ended"),
      1U);
}

TEST_F(Refusals, BeyondTwentyInAWindowAreCountedAndToldAtItsEndThoughNoneFollows) {
  RefusalLog refusals(loop, RefusalLog::Of::kCalls, 50'000'000);
  refuse(refusals, 25);
  EXPECT_TRUE(eventually(
      [&] { return log.contains(kLogProblem, "SpacekeepListener 5 more calls were refused"); }));
  EXPECT_EQ(log.count(kLogProblem, "clientPurge of uid 7"), 20U);
  refuse(refusals, 1);
  EXPECT_EQ(log.count(kLogProblem, "clientPurge of uid 7"), 21U);
  close(refusals);
}

TEST_F(Refusals, ExactlyTwentyAreToldWithoutACount) {
  RefusalLog refusals(loop, RefusalLog::Of::kCalls, kHourNs);
  refuse(refusals, 20);
  close(refusals);
  EXPECT_EQ(log.count(kLogProblem, "clientPurge of uid 7"), 20U);
  EXPECT_EQ(log.count(kLogProblem, "more calls were"), 0U);
}

TEST_F(Refusals, LeftOutWhenTheServerClosesAreToldThen) {
  RefusalLog refusals(loop, RefusalLog::Of::kCalls, kHourNs);
  refuse(refusals, 21);
  close(refusals);
  EXPECT_EQ(log.count(kLogProblem, "1 more calls were refused"), 1U);
}

}  // namespace
}  // namespace spacekeep::ipc::test
