// Regression: a task that came while an idle worker was on its way out was counted on that worker
// and started only with the next task.
#include <gtest/gtest.h>

#include "support/queues/waiting.h"
#include "tests/helpers/schedules.h"

namespace spacekeep {
namespace {

TEST(ConcurrentQueue, ATaskThatComesAsAnIdleWorkerEndsIsStartedAtOnce) {
  inEverySchedule(500, [] {
    CountingSemaphore ran(0U);
    ConcurrentQueue queue({.name = "queue", .parallelism = 4, .idle_worker_ns = 1000});
    queue.async([&ran] { ran.signal(); });
    ran.wait();
    rt::sleepNs(1000);
    queue.async([&ran] { ran.signal(); });
    EXPECT_EQ(ran.waitForNs(1'000'000'000), WaitResult::kSignalled);
  });
}

}  // namespace
}  // namespace spacekeep
