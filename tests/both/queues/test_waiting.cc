#include <gtest/gtest.h>

#include <atomic>
#include <memory>

#include "support/queues/waiting.h"
#include "tests/helpers/schedules.h"

namespace spacekeep {
namespace {

constexpr std::uint64_t kSecondNs = 1'000'000'000;

TEST(CountingSemaphore, EachSignalLetsOneWaiterThrough) {
  inEverySchedule(200, [] {
    ConcurrentQueue queue({});
    CountingSemaphore semaphore(2);
    std::atomic<int> through = 0;
    TaskGroup group;
    for (int number = 0; number < 10; ++number) {
      group.async(queue, [&] {
        semaphore.wait();
        ++through;
      });
    }
    for (int number = 0; number < 8; ++number) semaphore.signal();
    group.wait();
    EXPECT_EQ(through, 10);
    EXPECT_EQ(semaphore.waitForNs(0), WaitResult::kTimedOut);
  });
}

TEST(CountingSemaphore, ASignalThatIsThereWinsOverAnExpiredDeadline) {
  inEverySchedule(20, [] {
    CountingSemaphore semaphore(0);
    EXPECT_EQ(semaphore.waitForNs(0), WaitResult::kTimedOut);
    semaphore.signal();
    EXPECT_EQ(semaphore.waitForNs(0), WaitResult::kSignalled);
    EXPECT_EQ(semaphore.waitForNs(0), WaitResult::kTimedOut);
  });
}

TEST(CountingSemaphore, ADeadlineIsNeverReportedBeforeItHasPassed) {
  inEverySchedule(20, [] {
    CountingSemaphore semaphore(0);
    const std::uint64_t start = rt::ticks();
    EXPECT_EQ(semaphore.waitForNs(2 * kSecondNs), WaitResult::kTimedOut);
    EXPECT_GE(rt::ticks() - start, 2 * kSecondNs);
    if (!onRealThreads()) {
      EXPECT_EQ(rt::ticks() - start, 2 * kSecondNs);
    }
  });
}

TEST(CountingSemaphore, AWaitLongerThanTheClockNeverTimesOut) {
  inEverySchedule(20, [] {
    ConcurrentQueue queue({});
    CountingSemaphore semaphore(0);
    queue.async([&semaphore] {
      rt::sleepNs(kSecondNs);
      semaphore.signal();
    });
    EXPECT_EQ(semaphore.waitForNs(UINT64_MAX), WaitResult::kSignalled);
  });
}

TEST(CountingSemaphore, MayBeDestroyedByTheWaiterThatWoke) {
  inEverySchedule(300, [] {
    ConcurrentQueue queue({});
    for (int number = 0; number < 5; ++number) {
      auto semaphore = std::make_unique<CountingSemaphore>(0);
      queue.async([raw = semaphore.get()] { raw->signal(); });
      semaphore->wait();
    }
  });
}

TEST(TaskGroup, WaitReturnsWhenAllTasksHaveEnded) {
  inEverySchedule(200, [] {
    ConcurrentQueue queue({});
    TaskGroup group;
    std::atomic<int> ended = 0;
    for (int number = 0; number < 10; ++number) {
      group.async(queue, [&ended] { ++ended; });
    }
    group.wait();
    EXPECT_EQ(ended, 10);
  });
}

TEST(TaskGroup, AnEmptyGroupNeverWaits) {
  inEverySchedule(4, [] {
    TaskGroup group;
    group.wait();
    EXPECT_EQ(group.waitForNs(0), WaitResult::kSignalled);
  });
}

TEST(TaskGroup, WaitTimesOutWhileATaskRunsAndSucceedsAfterwards) {
  inEverySchedule(50, [] {
    ConcurrentQueue queue({});
    TaskGroup group;
    CountingSemaphore go_on(0);
    group.async(queue, [&go_on] { go_on.wait(); });
    const std::uint64_t start = rt::ticks();
    EXPECT_EQ(group.waitForNs(kSecondNs), WaitResult::kTimedOut);
    EXPECT_GE(rt::ticks() - start, kSecondNs);
    go_on.signal();
    EXPECT_EQ(group.waitForNs(rt::kNever), WaitResult::kSignalled);
  });
}

TEST(TaskGroup, LivesUntilItsLastTaskHasLeftAlsoWhenNobodyWaitsForItAnyMore) {
  inEverySchedule(100, [] {
    ConcurrentQueue queue({});
    auto group = std::make_shared<TaskGroup>();
    CountingSemaphore go_on(0);
    CountingSemaphore captured_gone(0);
    std::atomic<bool> group_was_there = false;
    // Ends with the task, right before the group is left.
    const auto tell = [&, weak = std::weak_ptr<TaskGroup>(group)](int*) {
      group_was_there = !weak.expired();
      captured_gone.signal();
    };
    static int marker = 0;
    asyncInGroup(group, queue,
                 [&go_on, captured = std::shared_ptr<int>(&marker, tell)] { go_on.wait(); });
    EXPECT_EQ(group->waitForNs(kSecondNs), WaitResult::kTimedOut);
    group.reset();
    go_on.signal();
    captured_gone.wait();
    EXPECT_TRUE(group_was_there);
  });
}

TEST(TaskGroup, ManyThreadsMayWait) {
  inEverySchedule(100, [] {
    ConcurrentQueue queue({});
    TaskGroup work;
    TaskGroup waiters;
    std::atomic<bool> done = false;
    work.enter();
    for (int number = 0; number < 8; ++number) {
      waiters.async(queue, [&] {
        work.wait();
        EXPECT_TRUE(done);
      });
    }
    done = true;
    work.leave();
    waiters.wait();
  });
}

TEST(TaskGroup, MayBeDestroyedByTheWaiterThatWoke) {
  inEverySchedule(300, [] {
    ConcurrentQueue queue({});
    for (int number = 0; number < 5; ++number) {
      auto group = std::make_unique<TaskGroup>();
      group->async(queue, [] {});
      group->async(queue, [] {});
      group->wait();
    }
  });
}

TEST(TaskGroup, WhatATaskCapturedIsGoneWhenTheWaitReturns) {
  inEverySchedule(100, [] {
    ConcurrentQueue queue({});
    auto owned = std::make_shared<int>(1);
    TaskGroup group;
    group.async(queue, [owned] { EXPECT_EQ(*owned, 1); });
    group.wait();
    EXPECT_EQ(owned.use_count(), 1);
  });
}

TEST(TaskGroupDeathTest, LeaveWithoutEnterIsABrokenProgram) {
  GTEST_FLAG_SET(death_test_style, "threadsafe");
  EXPECT_DEATH(inEverySchedule(1,
                               [] {
                                 TaskGroup group;
                                 group.leave();
                               }),
               "TaskGroup::leave without enter");
}

}  // namespace
}  // namespace spacekeep
