#include <gtest/gtest.h>

#include <cstdint>
#include <limits>
#include <mutex>

#include "support/queues/waiting.h"
#include "tests/helpers/schedules.h"
#include "tests/helpers/simulated/one_schedule.h"

namespace spacekeep {
namespace {

constexpr std::uint64_t kSecondNs = 1'000'000'000;

TEST(VirtualTime, StartsAtZeroAndStandsStillWhileSomebodyCanRun) {
  inEverySchedule(20, [] {
    EXPECT_EQ(rt::ticks(), 0U);
    rt::Mutex mutex;
    for (int round = 0; round < 1'000; ++round) {
      const std::scoped_lock lock(mutex);
    }
    EXPECT_EQ(rt::ticks(), 0U);
  });
}

TEST(VirtualTime, ASleepTakesExactlyItsTime) {
  const auto report = runOneSchedule({}, [] {
    rt::sleepNs(12 * kSecondNs + 345);
    EXPECT_EQ(rt::ticks(), 12 * kSecondNs + 345);
    rt::sleepNs(0);
    EXPECT_EQ(rt::ticks(), 12 * kSecondNs + 345);
  });
  EXPECT_EQ(report.virtual_ns, 12 * kSecondNs + 345);
}

TEST(VirtualTime, SleepersWakeInTheOrderOfTheirDeadlines) {
  inEverySchedule(50, [] {
    ConcurrentQueue queue({.name = "global", .parallelism = 10});
    std::vector<std::uint64_t> woken;
    TaskGroup group;
    for (const std::uint64_t seconds : {5U, 1U, 4U, 2U, 3U}) {
      group.async(queue, [&woken, seconds] {
        rt::sleepNs(seconds * kSecondNs);
        EXPECT_EQ(rt::ticks(), seconds * kSecondNs);
        woken.push_back(seconds);
      });
    }
    group.wait();
    EXPECT_EQ(woken, (std::vector<std::uint64_t>{1, 2, 3, 4, 5}));
  });
}

TEST(VirtualTime, ASemaphoreTimesOutAtTheExactTick) {
  inEverySchedule(50, [] {
    CountingSemaphore semaphore(0);
    rt::sleepNs(7);
    EXPECT_EQ(semaphore.waitForNs(20 * kSecondNs), WaitResult::kTimedOut);
    EXPECT_EQ(rt::ticks(), 20 * kSecondNs + 7);
  });
}

TEST(VirtualTime, ASignalOneTickBeforeTheDeadlineIsInTime) {
  inEverySchedule(50, [] {
    ConcurrentQueue queue({});
    CountingSemaphore semaphore(0);
    queue.async([&semaphore] {
      rt::sleepNs(kSecondNs - 1);
      semaphore.signal();
    });
    EXPECT_EQ(semaphore.waitForNs(kSecondNs), WaitResult::kSignalled);
    EXPECT_EQ(rt::ticks(), kSecondNs - 1);
  });
}

TEST(VirtualTime, ASignalAtTheVeryDeadlineMayGoEitherWayAndIsNeverLost) {
  unsigned signalled = 0;
  unsigned timed_out = 0;
  inEverySchedule(200, [&] {
    ConcurrentQueue queue({});
    CountingSemaphore semaphore(0);
    queue.async([&semaphore] {
      rt::sleepNs(kSecondNs);
      semaphore.signal();
    });
    if (semaphore.waitForNs(kSecondNs) == WaitResult::kSignalled) {
      ++signalled;
    } else {
      ++timed_out;
      semaphore.wait();
    }
    EXPECT_EQ(rt::ticks(), kSecondNs);
  });
  EXPECT_GT(signalled, 0U);
  EXPECT_GT(timed_out, 0U);
}

TEST(VirtualTime, AGroupTimesOutAtTheExactTick) {
  inEverySchedule(20, [] {
    TaskGroup group;
    group.enter();
    EXPECT_EQ(group.waitForNs(3 * kSecondNs), WaitResult::kTimedOut);
    EXPECT_EQ(rt::ticks(), 3 * kSecondNs);
    group.leave();
  });
}

TEST(VirtualTime, ADeadlineThatHasPassedTakesNoTime) {
  inEverySchedule(20, [] {
    rt::sleepNs(kSecondNs);
    rt::Mutex mutex;
    rt::CondVar condition;
    const std::scoped_lock lock(mutex);
    EXPECT_FALSE(condition.waitUntil(mutex, kSecondNs));
    EXPECT_FALSE(condition.waitUntil(mutex, 5));
    EXPECT_FALSE(condition.waitUntil(mutex, 0));
    EXPECT_EQ(rt::ticks(), kSecondNs);
  });
}

TEST(VirtualTime, ADeadlineOutOfRangeIsNever) {
  runOneSchedule({}, [] {
    rt::sleepNs(10);
    EXPECT_EQ(rt::deadlineAfterNs(UINT64_MAX), rt::kNever);
    EXPECT_EQ(rt::deadlineAfterNs(UINT64_MAX - 10), rt::kNever);
    EXPECT_EQ(rt::deadlineAfterNs(UINT64_MAX - 11), UINT64_MAX - 1);
    EXPECT_EQ(rt::deadlineAfterNs(5), 15U);
  });
}

TEST(VirtualTime, AnIdleWorkerEndsAfterExactlyItsIdleTime) {
  inEverySchedule(20, [] {
    ConcurrentQueue queue({.name = "global", .parallelism = 1, .idle_worker_ns = 10 * kSecondNs});
    TaskGroup group;
    group.async(queue, [] {});
    group.wait();
    rt::sleepNs(10 * kSecondNs - 1);
    EXPECT_EQ(queue.counts().threads, 1U);
    rt::sleepNs(2);
    EXPECT_EQ(queue.counts().threads, 0U);
  });
}

TEST(WallClock, FollowsVirtualTimeAndJumpsAlone) {
  rt::ScheduleOptions options;
  options.wall_clock_start_ns = 1'000;
  runOneSchedule(options, [] {
    EXPECT_EQ(rt::wallClockNs(), 1'000);
    rt::sleepNs(500);
    EXPECT_EQ(rt::wallClockNs(), 1'500);
    rt::jumpWallClockNs(-1'200);
    EXPECT_EQ(rt::wallClockNs(), 300);
    EXPECT_EQ(rt::ticks(), 500U);
    rt::jumpWallClockNs(3'600'000'000'000);
    EXPECT_EQ(rt::wallClockNs(), 3'600'000'000'300);
  });
}

TEST(OutsideOfASchedule, ASingleThreadWorks) {
  EXPECT_FALSE(rt::insideSchedule());
  const std::uint64_t start = rt::ticks();
  rt::sleepNs(kSecondNs);
  EXPECT_EQ(rt::ticks(), start + kSecondNs);
  rt::Mutex mutex;
  rt::CondVar condition;
  const std::scoped_lock lock(mutex);
  condition.notifyOne();
  condition.notifyAll();
  EXPECT_FALSE(condition.waitUntil(mutex, start + 2 * kSecondNs));
  EXPECT_EQ(rt::ticks(), start + 2 * kSecondNs);
  EXPECT_NE(rt::randomNumber(), rt::randomNumber());
  EXPECT_EQ(rt::threadSlot(rt::ThreadSlot::kCurrentQueue), nullptr);
}

TEST(OutsideOfASchedule, ALockFromBeforeWorksInside) {
  rt::Mutex mutex;
  { const std::scoped_lock lock(mutex); }
  runOneSchedule({}, [&mutex] {
    EXPECT_TRUE(rt::insideSchedule());
    const std::scoped_lock lock(mutex);
  });
  const std::scoped_lock lock(mutex);
}

}  // namespace
}  // namespace spacekeep
