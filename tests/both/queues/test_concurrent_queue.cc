#include <gtest/gtest.h>

#include <algorithm>
#include <atomic>
#include <functional>
#include <memory>
#include <mutex>
#include <stdexcept>
#include <vector>

#include "support/queues/concurrent_queue.h"
#include "support/queues/waiting.h"
#include "tests/helpers/schedules.h"

namespace spacekeep {
namespace {

constexpr std::uint64_t kMillisecondNs = 1'000'000;
constexpr std::uint64_t kSecondNs = 1'000'000'000;

ConcurrentQueue::Options withParallelism(std::size_t parallelism) {
  return {.name = "global", .parallelism = parallelism, .idle_worker_ns = 10 * kSecondNs};
}

void waitForThreads(const ConcurrentQueue& queue, std::size_t threads) {
  while (queue.counts().threads != threads) rt::sleepNs(100 * kMillisecondNs);
}

TEST(ConcurrentQueue, RunsEveryTaskOnce) {
  inEverySchedule(200, [] {
    std::vector<std::atomic<int>> runs(50);
    {
      ConcurrentQueue queue(withParallelism(4));
      for (auto& count : runs) {
        queue.async([&count] { ++count; });
      }
    }
    for (const auto& count : runs) EXPECT_EQ(count, 1);
  });
}

TEST(ConcurrentQueue, OneWorkerStartsTasksInTheOrderOfSubmission) {
  inEverySchedule(200, [] {
    std::vector<int> order;
    {
      ConcurrentQueue queue(withParallelism(1));
      for (int number = 0; number < 20; ++number) {
        queue.async([&order, number] { order.push_back(number); });
      }
    }
    std::vector<int> expected(20);
    for (int number = 0; number < 20; ++number) expected[static_cast<std::size_t>(number)] = number;
    EXPECT_EQ(order, expected);
  });
}

TEST(ConcurrentQueue, NeverRunsMoreTasksSideBySideThanItsParallelism) {
  inEverySchedule(200, [] {
    std::atomic<int> running = 0;
    std::atomic<int> most = 0;
    rt::Mutex mutex;
    {
      ConcurrentQueue queue(withParallelism(3));
      for (int number = 0; number < 30; ++number) {
        queue.async([&] {
          const int now = ++running;
          {
            const std::scoped_lock lock(mutex);
            most = std::max(most.load(), now);
          }
          --running;
        });
      }
    }
    EXPECT_LE(most, 3);
    EXPECT_GE(most, 1);
  });
}

TEST(ConcurrentQueue, DestructorWaitsForTasksThatTasksSubmit) {
  inEverySchedule(200, [] {
    std::atomic<int> depth_reached = 0;
    std::function<void(int)> descend;
    {
      ConcurrentQueue queue(withParallelism(2));
      descend = [&](int depth) {
        depth_reached = depth;
        if (depth < 10) queue.async([&descend, depth] { descend(depth + 1); });
      };
      queue.async([&descend] { descend(1); });
    }
    EXPECT_EQ(depth_reached, 10);
  });
}

TEST(ConcurrentQueue, TasksThatAllWaitForALaterOneEnd) {
  inEverySchedule(100, [] {
    std::atomic<int> ended = 0;
    CountingSemaphore go(0);
    {
      ConcurrentQueue queue(withParallelism(4));
      for (int number = 0; number < 20; ++number) {
        queue.async([&] {
          go.wait();
          ++ended;
        });
      }
      queue.async([&go] {
        for (int number = 0; number < 20; ++number) go.signal();
      });
    }
    EXPECT_EQ(ended, 20);
  });
}

TEST(ConcurrentQueue, AThousandBlockedTasksNeverStarveALaterOne) {
  inEverySchedule(4, [] {
    CountingSemaphore go(0);
    CountingSemaphore later_ran(0);
    ConcurrentQueue queue(withParallelism(2));
    for (int number = 0; number < 1'000; ++number) {
      queue.async([&go] { go.wait(); });
    }
    queue.async([&later_ran] { later_ran.signal(); });
    later_ran.wait();
    EXPECT_EQ(queue.counts().pending, 0U);
    EXPECT_GE(queue.counts().peak_threads, 1'000U);
    for (int number = 0; number < 1'000; ++number) go.signal();
  });
}

TEST(ConcurrentQueue, AWorkerInNestedRegionsCountsAsBlockedOnce) {
  inEverySchedule(50, [] {
    ConcurrentQueue queue(withParallelism(1));
    CountingSemaphore checked(0);
    queue.async([&] {
      const BlockingRegion outer;
      {
        const BlockingRegion inner;
        EXPECT_EQ(queue.counts().blocked, 1U);
      }
      EXPECT_EQ(queue.counts().blocked, 1U);
      checked.signal();
    });
    checked.wait();
  });
}

TEST(ConcurrentQueue, ARegionOutsideOfAWorkerDoesNothing) {
  inEverySchedule(4, [] {
    ConcurrentQueue queue(withParallelism(1));
    const BlockingRegion region;
    EXPECT_EQ(queue.counts().blocked, 0U);
  });
}

TEST(ConcurrentQueue, IdleWorkersEndAndNoThreadIsLeft) {
  inEverySchedule(50, [] {
    ConcurrentQueue queue(withParallelism(4));
    TaskGroup group;
    for (int number = 0; number < 8; ++number) {
      group.async(queue, [] { rt::sleepNs(kSecondNs); });
    }
    group.wait();
    EXPECT_GE(queue.counts().peak_threads, 1U);
    EXPECT_LE(queue.counts().peak_threads, 4U);
    waitForThreads(queue, 0);
    // An idle queue starts again when there is work.
    CountingSemaphore ran(0);
    queue.async([&ran] { ran.signal(); });
    ran.wait();
  });
}

TEST(ConcurrentQueue, AnIdleWorkerIsUsedAgainWithinItsIdleTime) {
  inEverySchedule(50, [] {
    ConcurrentQueue queue({.name = "global", .parallelism = 4, .idle_worker_ns = rt::kNever - 1});
    for (int number = 0; number < 10; ++number) {
      CountingSemaphore ran(0);
      queue.async([&ran] { ran.signal(); });
      ran.wait();
      // The worker is idle again only after its task object is gone.
      rt::sleepNs(kSecondNs);
    }
    EXPECT_LE(queue.counts().threads, 4U);
    if (!onRealThreads()) {
      EXPECT_EQ(queue.counts().peak_threads, 1U);
    }
  });
}

TEST(ConcurrentQueue, ATaskThatComesJustAsTheWorkerEndsStillRuns) {
  inEverySchedule(400, [] {
    ConcurrentQueue queue({.name = "global", .parallelism = 2, .idle_worker_ns = kSecondNs});
    for (int number = 0; number < 5; ++number) {
      CountingSemaphore ran(0);
      queue.async([&ran] { ran.signal(); });
      ran.wait();
      rt::sleepNs(kSecondNs);
    }
  });
}

/// Has that many workers wait at once, for a moment.
void blockWorkers(ConcurrentQueue& queue, int workers) {
  CountingSemaphore release(0);
  CountingSemaphore ended(0);
  for (int i = 0; i < workers; ++i) {
    queue.async([&release, &ended] {
      release.wait();
      ended.signal();
    });
  }
  while (queue.counts().blocked != static_cast<std::size_t>(workers)) rt::sleepNs(kMillisecondNs);
  for (int i = 0; i < workers; ++i) release.signal();
  for (int i = 0; i < workers; ++i) ended.wait();
}

TEST(ConcurrentQueue, WorkersThatTheSteadyLoadAfterABurstDoesNotNeedEnd) {
  constexpr std::uint64_t kIdleNs = kSecondNs / 5;
  inEverySchedule(20, [] {
    ConcurrentQueue queue({.name = "global", .parallelism = 4, .idle_worker_ns = kIdleNs});
    blockWorkers(queue, 20);
    EXPECT_GE(queue.counts().peak_threads, 20U);
    // Each of the twenty would have a task in less than its idle time.
    for (std::uint64_t passed_ns = 0; passed_ns < 5 * kIdleNs; passed_ns += kIdleNs / 100) {
      queue.async([] {});
      rt::sleepNs(kIdleNs / 100);
    }
    if (onRealThreads()) {
      EXPECT_LT(queue.counts().threads, 20U);  // a slow machine may need some more
    } else {
      EXPECT_LE(queue.counts().threads, 5U);
    }
  });
}

TEST(ConcurrentQueue, WorkersThatEachBurstNeedsStayBetweenTheBursts) {
  constexpr std::uint64_t kIdleNs = kSecondNs / 2;
  inEverySchedule(20, [] {
    ConcurrentQueue queue({.name = "global", .parallelism = 4, .idle_worker_ns = kIdleNs});
    for (int burst = 0; burst < 10; ++burst) {
      blockWorkers(queue, 20);
      rt::sleepNs(kIdleNs / 5);
    }
    // On real threads the machine may take longer between the bursts than a worker may be idle.
    if (!onRealThreads()) {
      EXPECT_EQ(queue.counts().peak_threads, queue.counts().threads);
    }
    EXPECT_GE(queue.counts().peak_threads, 20U);
  });
}

std::atomic<int> given_back{0};

TEST(ConcurrentQueue, WorkersThatEndForWantOfWorkGiveBackOnceInTheirIdleTime) {
  inEverySchedule(20, [] {
    given_back = 0;
    ConcurrentQueue queue(
        {.name = "global", .parallelism = 4, .idle_worker_ns = kSecondNs / 5, .on_less_to_do = [] {
           ++given_back;
         }});
    for (int times = 1; times <= 2; ++times) {
      blockWorkers(queue, 10);
      waitForThreads(queue, 0);
      // The worker no longer counts when it gives back. Real workers may end further apart.
      while (given_back < times) rt::sleepNs(kMillisecondNs);
      if (!onRealThreads()) {
        EXPECT_EQ(given_back, times);
      }
    }
  });
}

TEST(ConcurrentQueue, AQueueThatEndsGivesNothingBack) {
  inEverySchedule(20, [] {
    given_back = 0;
    {
      ConcurrentQueue queue({.on_less_to_do = [] { ++given_back; }});
      queue.async([] {});
    }
    EXPECT_EQ(given_back, 0);
  });
}

TEST(ConcurrentQueue, WhatATaskCapturedIsGoneBeforeTheQueueIs) {
  inEverySchedule(50, [] {
    std::weak_ptr<int> watched;
    {
      ConcurrentQueue queue(withParallelism(2));
      auto owned = std::make_shared<int>(7);
      watched = owned;
      queue.async([owned] { EXPECT_EQ(*owned, 7); });
    }
    EXPECT_TRUE(watched.expired());
  });
}

TEST(ConcurrentQueue, ZeroParallelismStillRunsTasks) {
  inEverySchedule(4, [] {
    std::atomic<bool> ran = false;
    {
      ConcurrentQueue queue(withParallelism(0));
      queue.async([&ran] { ran = true; });
    }
    EXPECT_TRUE(ran);
  });
}

TEST(ConcurrentQueueDeathTest, ATaskThatThrowsNamesTheQueue) {
  GTEST_FLAG_SET(death_test_style, "threadsafe");
  EXPECT_DEATH(inEverySchedule(1,
                               [] {
                                 ConcurrentQueue queue({.name = "porridge"});
                                 queue.async([] { throw std::runtime_error("too hot"); });
                               }),
               "a task of queue porridge threw: too hot");
}

}  // namespace
}  // namespace spacekeep
