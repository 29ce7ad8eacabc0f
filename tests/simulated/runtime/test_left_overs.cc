#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <memory>
#include <mutex>
#include <stdexcept>
#include <string>

#include "support/queues/serial_queue.h"
#include "support/queues/waiting.h"
#include "support/runtime/runtime.h"
#include "support/runtime/simulation.h"

namespace spacekeep {
namespace {

using ::testing::Contains;
using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::IsEmpty;

constexpr std::uint64_t kSecondNs = 1'000'000'000;

/// Counts itself as long as it lives.
class Witness {
 public:
  explicit Witness(int& alive) : alive_(alive) { ++alive_; }
  ~Witness() { --alive_; }
  Witness(const Witness&) = delete;
  Witness& operator=(const Witness&) = delete;

 private:
  int& alive_;
};

void waitForever() { CountingSemaphore(0).wait(); }

void startDetached(const char* name, std::function<void()> body) {
  rt::Thread(name, std::move(body)).detach();
}

TEST(DeadlockReport, NamesEachFiberAndWhatItWaitsFor) {
  const auto report = rt::runSchedule({}, [] {
    rt::Mutex held;
    const std::scoped_lock lock(held);
    startDetached("locker", [&held] { const std::scoped_lock second(held); });
    rt::Thread listener("listener", [] { waitForever(); });
    rt::sleepNs(kSecondNs);
    listener.join();
  });
  EXPECT_EQ(report.end, rt::ScheduleEnd::kDeadlock);
  EXPECT_EQ(report.virtual_ns, kSecondNs);
  EXPECT_THAT(report.blocked, ElementsAre("main#0: waits for the end of listener#2",
                                          "locker#1: waits for a lock held by main#0",
                                          "listener#2: waits for a notification"));
}

TEST(DeadlockReport, ALockWhoseHolderHasEndedSaysSo) {
  const auto report = rt::runSchedule({}, [] {
    rt::Mutex mutex;
    rt::Thread("careless", [&mutex] { mutex.lock(); }).join();
    mutex.lock();
  });
  EXPECT_EQ(report.end, rt::ScheduleEnd::kDeadlock);
  EXPECT_THAT(report.blocked,
              ElementsAre("main#0: waits for a lock held by a thread that has ended"));
}

TEST(StuckReport, AnEndlessLoopUsesUpTheSteps) {
  rt::ScheduleOptions options;
  options.max_steps = 10'000;
  int alive = 0;
  const auto report = rt::runSchedule(options, [&alive] {
    const Witness witness(alive);
    rt::Mutex mutex;
    for (;;) const std::scoped_lock lock(mutex);
  });
  EXPECT_EQ(report.end, rt::ScheduleEnd::kStuck);
  EXPECT_EQ(report.steps, 10'000U);
  EXPECT_THAT(report.blocked, ElementsAre("main#0: can run"));
  EXPECT_EQ(alive, 0);
}

TEST(StuckReport, AThreadThatSleepsForEverAndADayIsStuckToo) {
  rt::ScheduleOptions options;
  options.max_steps = 1'000;
  const auto report = rt::runSchedule(options, [] {
    startDetached("ticker", [] {
      for (;;) rt::sleepNs(kSecondNs);
    });
  });
  EXPECT_EQ(report.end, rt::ScheduleEnd::kStuck);
  EXPECT_EQ(report.virtual_ns, 0U);
}

TEST(StuckReport, EvenALoopThatSwallowsEveryExceptionIsLeftBehind) {
  rt::ScheduleOptions options;
  options.max_steps = 1'000;
  const auto report = rt::runSchedule(options, [] {
    rt::CondVar condition;
    for (;;) condition.notifyAll();
  });
  EXPECT_EQ(report.end, rt::ScheduleEnd::kStuck);
  EXPECT_THAT(report.blocked, Contains("main#0: could not be unwound"));
}

TEST(StuckReport, ACutAfterAFewStepsLeavesTimeToClearEverythingAway) {
  rt::ScheduleOptions options;
  options.max_steps = 20;
  int alive = 0;
  const auto report = rt::runSchedule(options, [&alive] {
    struct Busy {
      ~Busy() {
        for (int i = 0; i < 1'000; ++i) const std::scoped_lock lock(mutex);
        --alive;
      }
      int& alive;
      rt::Mutex mutex;
    };
    Busy busy{alive, {}};
    ++alive;
    for (;;) const std::scoped_lock lock(busy.mutex);
  });
  EXPECT_EQ(report.end, rt::ScheduleEnd::kStuck);
  EXPECT_THAT(report.blocked, ElementsAre("main#0: can run"));
  EXPECT_EQ(alive, 0);
}

TEST(LeftOvers, AreRunUntilTheyWaitAndThenUnwound) {
  int alive = 0;
  bool slept = false;
  const auto report = rt::runSchedule({}, [&] {
    for (const char* name : {"one", "two", "three"}) {
      startDetached(name, [&alive, &slept] {
        const Witness witness(alive);
        rt::sleepNs(kSecondNs);
        slept = true;
        waitForever();
      });
    }
  });
  EXPECT_EQ(report.end, rt::ScheduleEnd::kFinished);
  EXPECT_EQ(report.virtual_ns, 0U);
  EXPECT_THAT(report.blocked,
              ElementsAre("one#1: waits for a notification", "two#2: waits for a notification",
                          "three#3: waits for a notification"));
  EXPECT_TRUE(slept);
  EXPECT_EQ(alive, 0);
}

TEST(LeftOvers, WaitersOfEveryKindAreUnwound) {
  int alive = 0;
  const auto report = rt::runSchedule({}, [&] {
    ConcurrentQueue global({});
    const auto queue = SerialQueue::create("serial", global);
    CountingSemaphore never(0);
    TaskGroup group;
    rt::Mutex mutex;
    queue->async([&] {
      const Witness witness(alive);
      never.wait();
    });
    group.async(global, [&] {
      const Witness witness(alive);
      queue->sync([] {});
    });
    group.async(global, [&] {
      const Witness witness(alive);
      const std::scoped_lock lock(mutex);
      never.wait();
    });
    group.async(global, [&] {
      const Witness witness(alive);
      rt::sleepNs(kSecondNs);
      const std::scoped_lock lock(mutex);
    });
    const Witness witness(alive);
    group.wait();
  });
  EXPECT_EQ(report.end, rt::ScheduleEnd::kDeadlock);
  EXPECT_EQ(report.blocked.size(), 5U);
  EXPECT_THAT(report.blocked, ::testing::Not(Contains(HasSubstr("could not"))));
  EXPECT_EQ(alive, 0);
}

/// Waits in its destructor for a thread that has to be unwound as well.
struct WaitsWhenDestroyed {
  TaskGroup& group;
  explicit WaitsWhenDestroyed(TaskGroup& waited_for) : group(waited_for) {}
  ~WaitsWhenDestroyed() { group.wait(); }
  WaitsWhenDestroyed(const WaitsWhenDestroyed&) = delete;
  WaitsWhenDestroyed& operator=(const WaitsWhenDestroyed&) = delete;
};

struct LeavesWhenDestroyed {
  TaskGroup& group;
  explicit LeavesWhenDestroyed(TaskGroup& entered) : group(entered) { group.enter(); }
  ~LeavesWhenDestroyed() { group.leave(); }
  LeavesWhenDestroyed(const LeavesWhenDestroyed&) = delete;
  LeavesWhenDestroyed& operator=(const LeavesWhenDestroyed&) = delete;
};

TEST(LeftOvers, ADestructorMayWaitForAnotherOne) {
  int alive = 0;
  const auto report = rt::runSchedule({}, [&alive] {
    TaskGroup group;
    startDetached("leaver", [&] {
      const Witness witness(alive);
      const LeavesWhenDestroyed leaves(group);
      waitForever();
    });
    rt::sleepNs(1);
    startDetached("waiter", [&] {
      const Witness witness(alive);
      const WaitsWhenDestroyed waits(group);
      waitForever();
    });
    waitForever();
  });
  EXPECT_EQ(report.blocked.size(), 3U);
  EXPECT_EQ(alive, 0);
}

TEST(LeftOvers, ADestructorThatNeverEndsIsGivenUpAndSaid) {
  // Not on the stack: the thread that is given up refers to it for good.
  static TaskGroup* const group = new TaskGroup;
  group->enter();
  const auto report = rt::runSchedule({}, [] {
    startDetached("hanger", [] {
      const WaitsWhenDestroyed waits(*group);
      waitForever();
    });
  });
  EXPECT_THAT(report.blocked,
              ElementsAre("hanger#1: waits for a notification", "hanger#1: could not be unwound"));
  // The next schedule must not meet it.
  const auto next = rt::runSchedule({}, [] { group->leave(); });
  EXPECT_EQ(next.end, rt::ScheduleEnd::kFinished);
  EXPECT_THAT(next.blocked, IsEmpty());
}

TEST(LeftOvers, ADeadlockInsideADestructorIsReportedNotFatal) {
  const auto report = rt::runSchedule({}, [] {
    CountingSemaphore never(0);
    ConcurrentQueue queue({.name = "jammed"});
    queue.async([&never] { never.wait(); });
  });
  EXPECT_EQ(report.end, rt::ScheduleEnd::kDeadlock);
  EXPECT_THAT(report.blocked, Contains("main#0: waits for a notification"));
  EXPECT_THAT(report.blocked, Contains("jammed#1: waits for a notification"));
}

TEST(LeftOvers, AnExceptionOfTheBodyReachesTheCaller) {
  int alive = 0;
  const auto body = [&alive] {
    const Witness witness(alive);
    startDetached("waiter", [&alive] {
      const Witness other(alive);
      waitForever();
    });
    rt::sleepNs(1);
    EXPECT_EQ(alive, 2);
    throw std::runtime_error("from the body");
  };
  try {
    rt::runSchedule({}, body);
    ADD_FAILURE() << "nothing was thrown";
  } catch (const std::runtime_error& error) {
    EXPECT_STREQ(error.what(), "from the body");
  }
  EXPECT_EQ(alive, 0);
  EXPECT_FALSE(rt::insideSchedule());
}

TEST(LeftOvers, AJoinableThreadInTheWayIsNoPanic) {
  const auto report = rt::runSchedule({}, [] {
    rt::Thread thread("listener", [] { waitForever(); });
    waitForever();
    thread.join();
  });
  EXPECT_EQ(report.end, rt::ScheduleEnd::kDeadlock);
  EXPECT_EQ(report.blocked.size(), 2U);
}

/// As whoever owns a simulated world does.
struct ClearingAway {
  ~ClearingAway() {
    if (rt::clearingAway()) rt::letKeepersGo();
  }
};

struct Owner {
  explicit Owner(int& alive) : witness(alive) {}
  Witness witness;
  std::shared_ptr<SerialQueue> queue;
};

TEST(Keepers, AQueueOfACutOffScheduleLetsGoOfTasksThatHoldItsOwner) {
  int alive = 0;
  int alive_in_the_end = 0;
  const auto report = rt::runSchedule({}, [&] {
    ConcurrentQueue global({.name = "global", .parallelism = 2});
    const ClearingAway clearing_away;
    const auto owner = std::make_shared<Owner>(alive);
    owner->queue = SerialQueue::create("queue", global);
    owner->queue->async([] { waitForever(); });
    owner->queue->async([owner] { owner->queue = nullptr; });
    alive_in_the_end = alive;
    waitForever();
  });
  EXPECT_EQ(report.end, rt::ScheduleEnd::kDeadlock);
  EXPECT_EQ(alive_in_the_end, 1);
  EXPECT_EQ(alive, 0);
}

TEST(Keepers, KeepWhatTheyHaveInAScheduleThatComesToItsEnd) {
  bool ran = false;
  const auto report = rt::runSchedule({}, [&ran] {
    const ClearingAway clearing_away;
    ConcurrentQueue global({.name = "global", .parallelism = 2});
    SerialQueue::create("queue", global)->async([&ran] { ran = true; });
  });
  EXPECT_EQ(report.end, rt::ScheduleEnd::kFinished);
  EXPECT_TRUE(ran);
}

}  // namespace
}  // namespace spacekeep
