#include "support/events/linux/event_loop.h"

#include <gtest/gtest.h>
#include <sys/epoll.h>
#include <sys/timex.h>
#include <unistd.h>

#include <array>
#include <ctime>
#include <memory>
#include <optional>

#include "support/queues/waiting.h"

namespace spacekeep {
namespace {

constexpr std::uint64_t kMs = 1'000'000;

TEST(EventLoop, PostedCallbacksRunInOrder) {
  EventLoop loop;
  CountingSemaphore done(0);
  std::vector<int> order;
  for (int i = 0; i < 100; ++i) loop.post([&order, i] { order.push_back(i); });
  loop.post([&] { done.signal(); });
  done.wait();
  ASSERT_EQ(order.size(), 100U);
  EXPECT_TRUE(std::is_sorted(order.begin(), order.end()));
}

TEST(EventLoop, WhatADelayedCallbackHoldsIsLetGoWhenItStops) {
  EventLoop loop;
  auto held = std::make_shared<int>(1);
  CountingSemaphore done(0);
  loop.postAfter(3600'000 * kMs, [held] {});
  loop.post([&] { done.signal(); });
  done.wait();
  EXPECT_EQ(held.use_count(), 2);
  loop.stop();
  EXPECT_EQ(held.use_count(), 1);
}

TEST(EventLoop, ADescriptorThatBecomesReadableIsNoticed) {
  std::array<int, 2> ends{};
  ASSERT_EQ(::pipe(ends.data()), 0);
  EventLoop loop;
  CountingSemaphore seen(0);
  loop.post([&] {
    EXPECT_TRUE(loop.watch(ends[0], EPOLLIN, [&] {
      char byte = 0;
      EXPECT_EQ(::read(ends[0], &byte, 1), 1);
      seen.signal();
    }));
  });
  for (int i = 0; i < 3; ++i) {
    ASSERT_EQ(::write(ends[1], "x", 1), 1);
    seen.wait();
  }
  loop.stop();
  ::close(ends[0]);
  ::close(ends[1]);
}

TEST(EventLoop, AFileCannotBeWatched) {
  EventLoop loop;
  CountingSemaphore done(0);
  loop.post([&] {
    EXPECT_FALSE(loop.watch(-1, EPOLLIN, [] {}));
    done.signal();
  });
  done.wait();
}

TEST(EventLoop, DelayedCallbacksRunInTheOrderOfTheirTimesAndNotEarlier) {
  EventLoop loop;
  CountingSemaphore done(0);
  std::vector<int> order;
  const std::uint64_t began = rt::ticks();
  std::uint64_t last_ran = 0;
  loop.postAfter(60 * kMs, [&] {
    order.push_back(2);
    last_ran = rt::ticks();
    done.signal();
  });
  loop.postAfter(20 * kMs, [&] { order.push_back(1); });
  done.wait();
  EXPECT_EQ(order, (std::vector<int>{1, 2}));
  EXPECT_GE(last_ran - began, 60 * kMs);
}

TEST(EventLoop, AfterItsStopNothingRuns) {
  EventLoop loop;
  bool ran = false;
  loop.postAfter(3600'000 * kMs, [&] { ran = true; });
  loop.stop();
  loop.post([&] { ran = true; });
  loop.stop();
  EXPECT_FALSE(ran);
}

TEST(BootTimer, FiresOnceAtItsTimeAndNotWhenCancelled) {
  EventLoop loop;
  CountingSemaphore fired(0);
  std::optional<BootTimer> timer;
  std::optional<BootTimer> cancelled;
  bool cancelled_fired = false;
  const std::uint64_t due = bootClockNs() + 30 * kMs;
  loop.post([&] {
    timer.emplace(loop, [&] { fired.signal(); });
    cancelled.emplace(loop, [&] { cancelled_fired = true; });
    timer->setFor(due);
    cancelled->setFor(due);
    cancelled->cancel();
  });
  fired.wait();
  EXPECT_GE(bootClockNs(), due);
  loop.post([&] { timer->setFor(0); });  // long past: at once
  fired.wait();
  loop.stop();
  EXPECT_FALSE(cancelled_fired);
}

/// By a billionth of a second, which nobody else notices.
bool moveWallClock(long ns) {
  timex change{};
  change.modes = ADJ_SETOFFSET | ADJ_NANO;
  change.time.tv_sec = ns < 0 ? -1 : 0;
  change.time.tv_usec = ns < 0 ? 1'000'000'000 + ns : ns;
  return ::clock_adjtime(CLOCK_REALTIME, &change) >= 0;
}

TEST(WallClockWatch, TellsEachTimeThatTheClockIsSet) {
  EventLoop loop;
  CountingSemaphore watched(0);
  CountingSemaphore set(0);
  std::optional<WallClockWatch> watch;
  loop.post([&] {
    watch.emplace(loop, [&] { set.signal(); });
    watched.signal();
  });
  watched.wait();
  for (const long ns : {1L, -1L}) {
    if (!moveWallClock(ns)) {
      loop.stop();
      GTEST_SKIP() << "may not set the clock here";
    }
    set.wait();
  }
  EXPECT_EQ(set.waitForNs(50 * kMs), WaitResult::kTimedOut);
  loop.stop();
}

}  // namespace
}  // namespace spacekeep
