#include <gtest/gtest.h>

#include <exception>
#include <functional>
#include <memory>
#include <mutex>
#include <stdexcept>
#include <vector>

#include "support/runtime/runtime.h"
#include "support/runtime/simulation.h"
#include "tests/helpers/schedules.h"
#include "tests/helpers/simulated/one_schedule.h"

namespace spacekeep {
namespace {

TEST(Fibers, HandleTheirOwnExceptionsWhileOthersDoTheSame) {
  inEverySchedule(100, [] {
    std::vector<rt::Thread> threads;
    for (int number = 0; number < 4; ++number) {
      threads.emplace_back("thrower", [number] {
        try {
          throw std::runtime_error(std::to_string(number));
        } catch (const std::runtime_error& error) {
          // Others throw and catch while this one is inside its handler.
          rt::sleepNs(static_cast<std::uint64_t>(4 - number));
          EXPECT_EQ(error.what(), std::to_string(number));
          EXPECT_EQ(std::uncaught_exceptions(), 0);
          EXPECT_NE(std::current_exception(), nullptr);
        }
        EXPECT_EQ(std::current_exception(), nullptr);
      });
    }
    for (rt::Thread& thread : threads) thread.join();
  });
}

TEST(Fibers, MaySwitchInADestructorThatAnExceptionCalls) {
  struct SleepsWhenDestroyed {
    ~SleepsWhenDestroyed() {
      EXPECT_EQ(std::uncaught_exceptions(), 1);
      rt::sleepNs(5);
      EXPECT_EQ(std::uncaught_exceptions(), 1);
    }
  };
  inEverySchedule(50, [] {
    std::vector<rt::Thread> threads;
    for (int number = 0; number < 3; ++number) {
      threads.emplace_back("thrower", [] {
        try {
          const SleepsWhenDestroyed sleeps;
          throw std::runtime_error("away");
        } catch (const std::runtime_error&) {
        }
      });
    }
    EXPECT_EQ(std::uncaught_exceptions(), 0);
    for (rt::Thread& thread : threads) thread.join();
  });
}

TEST(Fibers, StartFibersThatStartFibers) {
  inEverySchedule(50, [] {
    int leaves = 0;
    rt::Mutex mutex;
    std::function<void(int)> grow = [&](int depth) {
      if (depth == 0) {
        const std::scoped_lock lock(mutex);
        ++leaves;
        return;
      }
      rt::Thread left("left", [&grow, depth] { grow(depth - 1); });
      rt::Thread right("right", [&grow, depth] { grow(depth - 1); });
      left.join();
      right.join();
    };
    grow(5);
    EXPECT_EQ(leaves, 32);
  });
}

TEST(Fibers, HaveSlotsOfTheirOwnThatStartNull) {
  inEverySchedule(20, [] {
    int mine = 0;
    rt::threadSlot(rt::ThreadSlot::kPoolWorker) = &mine;
    rt::Thread thread("other", [] {
      EXPECT_EQ(rt::threadSlot(rt::ThreadSlot::kPoolWorker), nullptr);
      int other = 0;
      rt::threadSlot(rt::ThreadSlot::kPoolWorker) = &other;
      rt::sleepNs(1);
      EXPECT_EQ(rt::threadSlot(rt::ThreadSlot::kPoolWorker), &other);
    });
    thread.join();
    EXPECT_EQ(rt::threadSlot(rt::ThreadSlot::kPoolWorker), &mine);
  });
}

TEST(Fibers, JoinOfAThreadThatHasEndedReturnsAtOnce) {
  inEverySchedule(20, [] {
    rt::Thread thread("short", [] {});
    rt::sleepNs(1'000);
    EXPECT_TRUE(thread.joinable());
    thread.join();
    EXPECT_FALSE(thread.joinable());
    EXPECT_EQ(rt::ticks(), 1'000U);
  });
}

TEST(Fibers, AThreadMayBeMovedAndJoinedElsewhere) {
  inEverySchedule(20, [] {
    bool ran = false;
    rt::Thread first("moved", [&ran] { ran = true; });
    rt::Thread second(std::move(first));
    rt::Thread third;
    third = std::move(second);
    third.join();
    EXPECT_TRUE(ran);
  });
}

TEST(Fibers, ANotificationWithoutWaitersIsForgotten) {
  inEverySchedule(20, [] {
    rt::Mutex mutex;
    rt::CondVar condition;
    condition.notifyOne();
    condition.notifyAll();
    const std::scoped_lock lock(mutex);
    while (condition.waitUntil(mutex, 10)) {
    }
    EXPECT_EQ(rt::ticks(), 10U);
  });
}

TEST(Fibers, ThousandsMayWaitAtOnce) {
  runOneSchedule({}, [] {
    rt::Mutex mutex;
    rt::CondVar condition;
    bool open = false;
    std::vector<rt::Thread> threads;
    for (int number = 0; number < 3'000; ++number) {
      threads.emplace_back("waiter", [&] {
        const std::scoped_lock lock(mutex);
        while (!open) condition.wait(mutex);
      });
    }
    rt::sleepNs(1);
    {
      const std::scoped_lock lock(mutex);
      open = true;
      condition.notifyAll();
    }
    for (rt::Thread& thread : threads) thread.join();
  });
}

TEST(Fibers, CapturesOfAThreadGoBeforeItsJoinReturns) {
  inEverySchedule(20, [] {
    auto owned = std::make_shared<int>(1);
    rt::Thread thread("owner", [owned] { rt::sleepNs(1); });
    thread.join();
    EXPECT_EQ(owned.use_count(), 1);
  });
}

class BrokenPrograms : public ::testing::Test {
 protected:
  static void dies(const std::function<void()>& body, const char* why) {
    EXPECT_DEATH(rt::runSchedule({}, body), why);
  }
};

TEST_F(BrokenPrograms, TakingALockTwiceIsAPanicThatSaysHowToReplay) {
  dies(
      [] {
        rt::Mutex mutex;
        mutex.lock();
        mutex.lock();
      },
      "a lock was taken twice by the same thread .seed 1, random, step [0-9]+, at 0 ns, main#0.");
}

TEST_F(BrokenPrograms, GivingBackALockOfAnotherThread) {
  dies(
      [] {
        rt::Mutex mutex;
        mutex.unlock();
      },
      "given back by a thread that does not hold it");
}

TEST_F(BrokenPrograms, AnExceptionThatLeavesAThread) {
  dies([] { rt::Thread("bad", [] { throw std::runtime_error("oops"); }).join(); },
       "ended by an exception: oops .*bad#1");
}

TEST_F(BrokenPrograms, AThreadThatIsNeitherJoinedNorDetached) {
  dies([] { const rt::Thread thread("forgotten", [] {}); },
       "destroyed before it was joined or detached");
}

TEST_F(BrokenPrograms, AConditionDestroyedUnderItsWaiter) {
  dies(
      [] {
        rt::Mutex mutex;
        auto condition = std::make_unique<rt::CondVar>();
        rt::Thread thread("waiter", [&] {
          const std::scoped_lock lock(mutex);
          for (;;) condition->wait(mutex);
        });
        rt::sleepNs(1);
        condition.reset();
      },
      "a condition was destroyed while somebody waits for it");
}

TEST_F(BrokenPrograms, AnOverflowOfAStackHitsTheGuardPage) {
  dies(
      [] {
        std::function<int(int)> sink = [&sink](int depth) {
          volatile char frame[4096] = {};
          frame[0] = static_cast<char>(depth);
          return sink(depth + 1) + frame[0];
        };
        sink(0);
      },
      "");
}

TEST_F(BrokenPrograms, AScheduleInsideASchedule) {
  dies([] { rt::runSchedule({}, [] {}); }, "runSchedule inside a schedule");
}

}  // namespace
}  // namespace spacekeep
