// The helper that runs tests in many schedules must itself fail when it should.
#include <gtest/gtest-spi.h>
#include <gtest/gtest.h>

#include <stdexcept>

#include "support/queues/waiting.h"
#include "support/runtime/runtime.h"
#include "tests/helpers/schedules.h"

namespace spacekeep {
namespace {

void waitForever() { CountingSemaphore(0).wait(); }

TEST(InEverySchedule, FailsOnADeadlockAndNamesTheFiber) {
  EXPECT_NONFATAL_FAILURE(inEverySchedule(1, waitForever), "main#0: waits for a notification");
}

TEST(InEverySchedule, FailsWhenAThreadIsLeftBehind) {
  EXPECT_NONFATAL_FAILURE(inEverySchedule(1, [] { rt::Thread("forgotten", waitForever).detach(); }),
                          "left: forgotten#1: waits for a notification");
}

TEST(InEverySchedule, FailsOnAnException) {
  EXPECT_NONFATAL_FAILURE(inEverySchedule(1, [] { throw std::runtime_error("plums"); }),
                          "an exception left the schedule: plums");
}

TEST(InEverySchedule, RunsTheBodyOncePerSeed) {
  unsigned runs = 0;
  inEverySchedule(7, [&runs] { ++runs; });
  EXPECT_EQ(runs, 7U);
}

}  // namespace
}  // namespace spacekeep
