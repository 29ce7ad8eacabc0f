#include <gtest/gtest.h>

#include "support/queues/concurrent_queue.h"
#include "support/queues/waiting.h"
#include "support/runtime/runtime.h"
#include "tests/helpers/schedules.h"

namespace spacekeep {
namespace {

constexpr std::uint64_t kSecondNs = 1'000'000'000;

// A worker that had decided to end, and had not yet said so, was once counted on for a task.
TEST(ConcurrentQueue, ATaskSubmittedWhileTheLastIdleWorkerEndsIsRun) {
  inEverySchedule(20000, [] {
    ConcurrentQueue queue({.name = "global", .parallelism = 1, .idle_worker_ns = kSecondNs});
    for (int round = 0; round < 4; ++round) {
      CountingSemaphore ran(0);
      queue.async([&ran] { ran.signal(); });
      ASSERT_EQ(ran.waitForNs(1000 * kSecondNs), WaitResult::kSignalled) << "round " << round;
      rt::sleepNs(kSecondNs);  // to the very moment at which the worker has been idle long enough
    }
  });
}

}  // namespace
}  // namespace spacekeep
