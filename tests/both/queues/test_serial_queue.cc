#include <gtest/gtest.h>

#include <atomic>
#include <memory>
#include <numeric>
#include <stdexcept>
#include <vector>

#include "support/queues/serial_queue.h"
#include "support/queues/waiting.h"
#include "tests/helpers/schedules.h"

namespace spacekeep {
namespace {

constexpr std::uint64_t kSecondNs = 1'000'000'000;

std::vector<int> upTo(int count) {
  std::vector<int> numbers(static_cast<std::size_t>(count));
  std::iota(numbers.begin(), numbers.end(), 0);
  return numbers;
}

TEST(SerialQueue, AsyncTasksRunInTheOrderOfSubmission) {
  inEverySchedule(200, [] {
    ConcurrentQueue global({});
    const auto queue = SerialQueue::create("serial", global);
    std::vector<int> order;
    for (int number = 0; number < 20; ++number) {
      queue->async([&order, number] { order.push_back(number); });
    }
    queue->sync([] {});
    EXPECT_EQ(order, upTo(20));
  });
}

TEST(SerialQueue, TasksNeverOverlap) {
  inEverySchedule(200, [] {
    ConcurrentQueue global({});
    const auto queue = SerialQueue::create("serial", global);
    // Neither is atomic: an overlap is a data race, which the thread sanitizer sees too.
    int inside = 0;
    int total = 0;
    const auto task = [&] {
      EXPECT_EQ(++inside, 1);
      rt::sleepNs(1);
      --inside;
      ++total;
    };
    TaskGroup group;
    for (int caller = 0; caller < 5; ++caller) {
      group.async(global, [&] {
        for (int number = 0; number < 4; ++number) {
          queue->async(task);
          queue->sync(task);
        }
      });
    }
    group.wait();
    queue->sync([] {});
    EXPECT_EQ(total, 40);
  });
}

TEST(SerialQueue, SyncRunsAfterEverythingSubmittedBefore) {
  inEverySchedule(200, [] {
    ConcurrentQueue global({});
    const auto queue = SerialQueue::create("serial", global);
    std::vector<int> order;
    for (int number = 0; number < 10; number += 2) {
      queue->async([&order, number] { order.push_back(number); });
      queue->sync([&order, number] { order.push_back(number + 1); });
    }
    EXPECT_EQ(order, upTo(10));
  });
}

TEST(SerialQueue, SyncRunsOnTheCallingThread) {
  inEverySchedule(100, [] {
    ConcurrentQueue global({});
    const auto queue = SerialQueue::create("serial", global);
    int marker = 0;
    rt::threadSlot(rt::ThreadSlot::kCurrentConnection) = &marker;
    queue->async([] { rt::sleepNs(kSecondNs); });
    void* seen = nullptr;
    queue->sync([&seen] { seen = rt::threadSlot(rt::ThreadSlot::kCurrentConnection); });
    rt::threadSlot(rt::ThreadSlot::kCurrentConnection) = nullptr;
    EXPECT_EQ(seen, &marker);
  });
}

TEST(SerialQueue, AsyncFromItsOwnTaskRunsLater) {
  inEverySchedule(100, [] {
    ConcurrentQueue global({});
    const auto queue = SerialQueue::create("serial", global);
    std::vector<int> order;
    queue->sync([&] {
      queue->async([&order] { order.push_back(1); });
      order.push_back(0);
    });
    queue->sync([] {});
    EXPECT_EQ(order, upTo(2));
  });
}

TEST(SerialQueue, NothingStartsWhileSuspendedAndSuspensionsNest) {
  inEverySchedule(100, [] {
    ConcurrentQueue global({});
    const auto queue = SerialQueue::create("serial", global);
    std::atomic<int> ran = 0;
    queue->suspend();
    queue->suspend();
    for (int number = 0; number < 3; ++number) {
      queue->async([&ran] { ++ran; });
    }
    rt::sleepNs(kSecondNs);
    EXPECT_EQ(ran, 0);
    EXPECT_EQ(queue->depth(), 3U);
    queue->resume();
    rt::sleepNs(kSecondNs);
    EXPECT_EQ(ran, 0);
    queue->resume();
    queue->sync([] {});
    EXPECT_EQ(ran, 3);
    EXPECT_EQ(queue->depth(), 0U);
  });
}

TEST(SerialQueue, ARunningTaskIsNotInterruptedBySuspend) {
  inEverySchedule(100, [] {
    ConcurrentQueue global({});
    const auto queue = SerialQueue::create("serial", global);
    CountingSemaphore started(0);
    CountingSemaphore go_on(0);
    CountingSemaphore ended(0);
    std::atomic<bool> second_ran = false;
    queue->async([&] {
      started.signal();
      go_on.wait();
      ended.signal();
    });
    queue->async([&second_ran] { second_ran = true; });
    started.wait();
    queue->suspend();
    go_on.signal();
    ended.wait();
    rt::sleepNs(kSecondNs);
    EXPECT_FALSE(second_ran);
    queue->resume();
    queue->sync([] {});
    EXPECT_TRUE(second_ran);
  });
}

TEST(SerialQueue, SyncOnASuspendedQueueWaitsForResume) {
  inEverySchedule(100, [] {
    ConcurrentQueue global({});
    const auto queue = SerialQueue::create("serial", global);
    queue->suspend();
    std::atomic<bool> resumed = false;
    TaskGroup group;
    group.async(global, [&] { queue->sync([&] { EXPECT_TRUE(resumed); }); });
    rt::sleepNs(kSecondNs);
    resumed = true;
    queue->resume();
    group.wait();
  });
}

TEST(SerialQueue, ATaskMaySuspendItsOwnQueue) {
  inEverySchedule(100, [] {
    ConcurrentQueue global({});
    const auto queue = SerialQueue::create("serial", global);
    std::atomic<bool> second_ran = false;
    CountingSemaphore suspended(0);
    queue->async([&] {
      queue->suspend();
      suspended.signal();
    });
    queue->async([&second_ran] { second_ran = true; });
    suspended.wait();
    rt::sleepNs(kSecondNs);
    EXPECT_FALSE(second_ran);
    queue->resume();
    queue->sync([] {});
    EXPECT_TRUE(second_ran);
  });
}

TEST(SerialQueue, IsCurrentHoldsForEveryQueueOfANestedSync) {
  inEverySchedule(50, [] {
    ConcurrentQueue global({});
    const auto outer = SerialQueue::create("outer", global);
    const auto middle = SerialQueue::create("middle", global);
    const auto inner = SerialQueue::create("inner", global);
    TaskGroup group;
    group.enter();
    outer->async([&] {
      middle->sync([&] {
        EXPECT_TRUE(outer->isCurrent());
        EXPECT_FALSE(inner->isCurrent());
        inner->sync([&] {
          EXPECT_TRUE(outer->isCurrent());
          EXPECT_TRUE(middle->isCurrent());
          EXPECT_TRUE(inner->isCurrent());
          outer->assertCurrent("test");
        });
        EXPECT_FALSE(inner->isCurrent());
      });
      EXPECT_FALSE(middle->isCurrent());
      EXPECT_TRUE(outer->isCurrent());
      group.leave();
    });
    group.wait();
    EXPECT_FALSE(outer->isCurrent());
  });
}

TEST(SerialQueue, TheCurrentQueueIsTheInnermostOne) {
  inEverySchedule(50, [] {
    ConcurrentQueue global({});
    const auto outer = SerialQueue::create("outer", global);
    const auto inner = SerialQueue::create("inner", global);
    EXPECT_EQ(SerialQueue::current(), nullptr);
    TaskGroup group;
    group.enter();
    outer->async([&] {
      EXPECT_EQ(SerialQueue::current(), outer.get());
      inner->sync([&] { EXPECT_EQ(SerialQueue::current(), inner.get()); });
      EXPECT_EQ(SerialQueue::current(), outer.get());
      group.leave();
    });
    group.wait();
    EXPECT_EQ(SerialQueue::current(), nullptr);
  });
}

TEST(SerialQueue, ATaskOfAnotherQueueIsNotCurrent) {
  inEverySchedule(50, [] {
    ConcurrentQueue global({});
    const auto one = SerialQueue::create("one", global);
    const auto other = SerialQueue::create("other", global);
    CountingSemaphore checked(0);
    one->sync([&] {
      other->async([&] {
        EXPECT_FALSE(one->isCurrent());
        checked.signal();
      });
    });
    checked.wait();
  });
}

TEST(SerialQueue, QueuedTasksKeepTheQueueAlive) {
  inEverySchedule(100, [] {
    ConcurrentQueue global({});
    std::atomic<int> ran = 0;
    std::weak_ptr<SerialQueue> watched;
    TaskGroup group;
    {
      const auto queue = SerialQueue::create("serial", global);
      watched = queue;
      for (int number = 0; number < 5; ++number) {
        group.enter();
        queue->async([&] {
          ++ran;
          group.leave();
        });
      }
    }
    group.wait();
    EXPECT_EQ(ran, 5);
    while (!watched.expired()) rt::sleepNs(1'000'000);
  });
}

TEST(SerialQueue, ASuspendedQueueThatNobodyRefersToDropsItsTasks) {
  inEverySchedule(10, [] {
    ConcurrentQueue global({});
    const auto captured = std::make_shared<int>(1);
    auto queue = SerialQueue::create("serial", global);
    queue->suspend();
    queue->async([captured] { ADD_FAILURE() << "must not run"; });
    EXPECT_EQ(captured.use_count(), 2);
    queue.reset();
    EXPECT_EQ(captured.use_count(), 1);
  });
}

TEST(SerialQueue, TheTaskOfASyncMayDropTheLastReference) {
  inEverySchedule(50, [] {
    ConcurrentQueue global({});
    auto queue = SerialQueue::create("serial", global);
    const std::weak_ptr<SerialQueue> watched = queue;
    queue->sync([&queue] { queue.reset(); });
    EXPECT_TRUE(watched.expired());
  });
}

TEST(SerialQueue, CallersInSyncDoNotStarveTheTaskTheyWaitFor) {
  inEverySchedule(50, [] {
    ConcurrentQueue global({.name = "global", .parallelism = 2});
    const auto queue = SerialQueue::create("serial", global);
    CountingSemaphore go_on(0);
    queue->async([&go_on] { go_on.wait(); });
    TaskGroup group;
    for (int number = 0; number < 20; ++number) {
      group.async(global, [&queue] { queue->sync([] {}); });
    }
    group.async(global, [&go_on] { go_on.signal(); });
    group.wait();
  });
}

class SerialQueueDeathTest : public ::testing::Test {
 protected:
  void SetUp() override { GTEST_FLAG_SET(death_test_style, "threadsafe"); }
};

TEST_F(SerialQueueDeathTest, SyncFromATaskOfTheSameQueueNamesTheQueue) {
  EXPECT_DEATH(inEverySchedule(1,
                               [] {
                                 ConcurrentQueue global({});
                                 const auto queue = SerialQueue::create("com.marmalade", global);
                                 queue->sync([&] { queue->sync([] {}); });
                               }),
               "sync on queue com.marmalade from a task of its own");
}

TEST_F(SerialQueueDeathTest, SyncBackThroughAnotherQueueIsNoticedToo) {
  EXPECT_DEATH(inEverySchedule(1,
                               [] {
                                 ConcurrentQueue global({});
                                 const auto one = SerialQueue::create("one", global);
                                 const auto two = SerialQueue::create("two", global);
                                 one->sync([&] { two->sync([&] { one->sync([] {}); }); });
                               }),
               "sync on queue one from a task of its own");
}

TEST_F(SerialQueueDeathTest, AssertCurrentNamesThePlaceAndTheQueue) {
  EXPECT_DEATH(inEverySchedule(1,
                               [] {
                                 ConcurrentQueue global({});
                                 SerialQueue::create("registry", global)->assertCurrent("lookup");
                               }),
               "lookup must run on queue registry");
}

TEST_F(SerialQueueDeathTest, ResumeWithoutSuspendNamesTheQueue) {
  EXPECT_DEATH(inEverySchedule(1,
                               [] {
                                 ConcurrentQueue global({});
                                 SerialQueue::create("registry", global)->resume();
                               }),
               "resume of queue registry without suspend");
}

TEST_F(SerialQueueDeathTest, ATaskThatThrowsNamesTheQueue) {
  EXPECT_DEATH(inEverySchedule(1,
                               [] {
                                 ConcurrentQueue global({});
                                 const auto queue = SerialQueue::create("registry", global);
                                 queue->sync([] { throw std::runtime_error("broken"); });
                               }),
               "a task of queue registry threw: broken");
}

}  // namespace
}  // namespace spacekeep
