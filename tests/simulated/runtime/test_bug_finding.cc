// Bugs that were planted to be found: a strategy that misses them is worth nothing.
#include <gtest/gtest.h>

#include <atomic>
#include <mutex>
#include <vector>

#include "support/runtime/runtime.h"
#include "support/runtime/simulation.h"

namespace spacekeep {
namespace {

class Threads {
 public:
  void start(const char* name, std::function<void()> body) {
    threads_.emplace_back(name, std::move(body));
  }
  void join() {
    for (rt::Thread& thread : threads_) thread.join();
  }

 private:
  std::vector<rt::Thread> threads_;
};

/// A point at which the schedule may go another way.
void step() {
  rt::Mutex mutex;
  const std::scoped_lock lock(mutex);
}

unsigned schedulesThatEnd(rt::ScheduleEnd end, rt::Strategy strategy, unsigned seeds,
                          const std::function<void()>& body) {
  unsigned found = 0;
  for (std::uint64_t seed = 1; seed <= seeds; ++seed) {
    rt::ScheduleOptions options;
    options.seed = seed;
    options.strategy = strategy;
    options.pct_expected_steps = 100;
    if (rt::runSchedule(options, body).end == end) ++found;
  }
  return found;
}

// Wrong: the waiter looks at the flag, and starts to wait without having kept the lock in between.
void lostWakeUp() {
  rt::Mutex mutex;
  rt::CondVar condition;
  std::atomic<bool> ready = false;
  Threads threads;
  threads.start("waiter", [&] {
    while (!ready) {
      const std::scoped_lock lock(mutex);
      condition.wait(mutex);
    }
  });
  threads.start("notifier", [&] {
    ready = true;
    condition.notifyOne();
  });
  threads.join();
}

TEST(BugFinding, RandomFindsALostWakeUp) {
  const unsigned found =
      schedulesThatEnd(rt::ScheduleEnd::kDeadlock, rt::Strategy::kRandom, 100, lostWakeUp);
  EXPECT_GT(found, 0U);
  EXPECT_LT(found, 100U);
}

TEST(BugFinding, PctFindsALostWakeUp) {
  EXPECT_GT(schedulesThatEnd(rt::ScheduleEnd::kDeadlock, rt::Strategy::kPct, 200, lostWakeUp), 0U);
}

// Wrong only when the first thread is interrupted inside its window, the second one is interrupted
// inside its own, and the first one goes on: two changes of priority, which is depth three.
struct DepthThreeBug {
  bool first_is_inside = false;
  bool second_is_inside = false;
  bool hit = false;

  void first() {
    for (int warm_up = 0; warm_up < 5; ++warm_up) step();
    first_is_inside = true;
    step();
    step();
    if (second_is_inside) hit = true;
    first_is_inside = false;
  }
  void second() {
    if (!first_is_inside) return;
    second_is_inside = true;
    step();
    step();
    second_is_inside = false;
  }
};

unsigned schedulesThatHit(unsigned pct_depth, unsigned seeds) {
  unsigned hits = 0;
  for (std::uint64_t seed = 1; seed <= seeds; ++seed) {
    rt::ScheduleOptions options;
    options.seed = seed;
    options.strategy = rt::Strategy::kPct;
    options.pct_depth = pct_depth;
    options.pct_expected_steps = 30;
    DepthThreeBug bug;
    rt::runSchedule(options, [&bug] {
      Threads threads;
      threads.start("first", [&bug] { bug.first(); });
      threads.start("second", [&bug] { bug.second(); });
      threads.join();
    });
    if (bug.hit) ++hits;
  }
  return hits;
}

TEST(BugFinding, PctOfDepthThreeFindsABugOfDepthThree) {
  EXPECT_GT(schedulesThatHit(3, 3'000), 0U);
  // Fewer changes of priority cannot reach it: the depth means what it says.
  EXPECT_EQ(schedulesThatHit(2, 3'000), 0U);
}

// Two threads that take two locks in opposite order.
TEST(BugFinding, BothStrategiesFindLocksTakenInOppositeOrder) {
  const auto body = [] {
    rt::Mutex left;
    rt::Mutex right;
    Threads threads;
    threads.start("left first", [&] {
      const std::scoped_lock first(left);
      const std::scoped_lock second(right);
    });
    threads.start("right first", [&] {
      const std::scoped_lock first(right);
      const std::scoped_lock second(left);
    });
    threads.join();
  };
  EXPECT_GT(schedulesThatEnd(rt::ScheduleEnd::kDeadlock, rt::Strategy::kRandom, 100, body), 0U);
  EXPECT_GT(schedulesThatEnd(rt::ScheduleEnd::kDeadlock, rt::Strategy::kPct, 200, body), 0U);
}

TEST(BugFinding, AnUnprotectedCounterLosesIncrements) {
  unsigned lost = 0;
  for (std::uint64_t seed = 1; seed <= 100; ++seed) {
    rt::ScheduleOptions options;
    options.seed = seed;
    int counter = 0;
    rt::runSchedule(options, [&counter] {
      Threads threads;
      for (const char* name : {"one", "two"}) {
        threads.start(name, [&counter] {
          const int seen = counter;
          step();
          counter = seen + 1;
        });
      }
      threads.join();
    });
    if (counter == 1) ++lost;
  }
  EXPECT_GT(lost, 10U);
  EXPECT_LT(lost, 100U);
}

// A wait without a loop over its condition is a bug that real threads show once in a blue moon.
TEST(BugFinding, WaitsEndEarlyNowAndThen) {
  unsigned early = 0;
  for (std::uint64_t seed = 1; seed <= 200; ++seed) {
    rt::ScheduleOptions options;
    options.seed = seed;
    rt::runSchedule(options, [&early] {
      rt::Mutex mutex;
      rt::CondVar condition;
      const std::scoped_lock lock(mutex);
      if (condition.waitUntil(mutex, 1'000)) ++early;
      EXPECT_TRUE(rt::ticks() == 0 || rt::ticks() == 1'000);
    });
  }
  EXPECT_GT(early, 0U);
  EXPECT_LT(early, 50U);
}

}  // namespace
}  // namespace spacekeep
