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
      for (unsigned i = 0; i < count; ++i) refusals.writeCall("uid 7", "clientPurge", "no room");
    });
  }
  void close(RefusalLog& refusals) {
    loop.runAndWait([&] { refusals.close(); });
  }

  spacekeep::test::LogCapture log;
  IpcLoop loop;
};

TEST_F(Refusals, OfCallsAndConnectionsAreToldWithWhoAndWhy) {
  RefusalLog refusals(loop, kHourNs);
  loop.runAndWait([&] {
    refusals.write("uid 7", "too many");
    refusals.writeCall("uid 8", "clientPurge", "no room");
  });
  EXPECT_EQ(
      log.texts(kLogProblem),
      (std::vector<std::string>{"SpacekeepListener Connection of uid 7 refused or ended: too many",
                                "SpacekeepListener clientPurge of uid 8 refused: no room"}));
  close(refusals);
}

TEST_F(Refusals, BeyondTwentyInAWindowAreCountedAndToldAtItsEndThoughNoneFollows) {
  RefusalLog refusals(loop, 50'000'000);
  refuse(refusals, 25);
  EXPECT_TRUE(eventually([&] {
    return log.contains(kLogProblem, "SpacekeepListener 5 more calls or connections were refused");
  }));
  EXPECT_EQ(log.count(kLogProblem, "clientPurge of uid 7"), 20U);
  refuse(refusals, 1);
  EXPECT_EQ(log.count(kLogProblem, "clientPurge of uid 7"), 21U);
  close(refusals);
}

TEST_F(Refusals, ExactlyTwentyAreToldWithoutACount) {
  RefusalLog refusals(loop, kHourNs);
  refuse(refusals, 20);
  close(refusals);
  EXPECT_EQ(log.count(kLogProblem, "clientPurge of uid 7"), 20U);
  EXPECT_EQ(log.count(kLogProblem, "more calls or connections"), 0U);
}

TEST_F(Refusals, LeftOutWhenTheServerClosesAreToldThen) {
  RefusalLog refusals(loop, kHourNs);
  refuse(refusals, 21);
  close(refusals);
  EXPECT_EQ(log.count(kLogProblem, "1 more calls or connections were refused"), 1U);
}

}  // namespace
}  // namespace spacekeep::ipc::test
