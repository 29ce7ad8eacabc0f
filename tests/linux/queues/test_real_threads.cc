// What only real threads have: names, signals, clocks of the kernel, and the scaled clock of tests.
#include <gtest/gtest.h>
#include <pthread.h>

#include <array>
#include <csignal>
#include <cstring>
#include <mutex>
#include <set>
#include <stdexcept>
#include <string>
#include <utility>

#include "support/runtime/runtime.h"
#include "support/runtime/threads/time_scale.h"
#include "support/timebase.h"

namespace spacekeep {
namespace {

constexpr std::uint64_t kSecondNs = 1'000'000'000;

class FastClocks {
 public:
  explicit FastClocks(std::uint32_t scale) { rt::setTimeScaleForTests(scale); }
  ~FastClocks() { rt::setTimeScaleForTests(1); }
  FastClocks(const FastClocks&) = delete;
  FastClocks& operator=(const FastClocks&) = delete;
};

TEST(RealThreads, ShowTheFirstFifteenBytesOfTheirName) {
  std::array<char, 32> name{};
  rt::Thread thread("com.quorvel.spacekeep.workers",
                    [&name] { pthread_getname_np(pthread_self(), name.data(), name.size()); });
  thread.join();
  EXPECT_STREQ(name.data(), "com.quorvel.spa");
}

TEST(RealThreads, LeaveSignalsToTheirMaker) {
  sigset_t before;
  pthread_sigmask(SIG_SETMASK, nullptr, &before);
  bool term_is_blocked = false;
  rt::Thread thread("quiet", [&term_is_blocked] {
    sigset_t mask;
    pthread_sigmask(SIG_SETMASK, nullptr, &mask);
    term_is_blocked = sigismember(&mask, SIGTERM) == 1;
  });
  thread.join();
  EXPECT_TRUE(term_is_blocked);
  sigset_t after;
  pthread_sigmask(SIG_SETMASK, nullptr, &after);
  EXPECT_EQ(sigismember(&before, SIGTERM), sigismember(&after, SIGTERM));
}

TEST(RealThreads, HaveSlotsOfTheirOwnThatStartNull) {
  int mine = 0;
  rt::threadSlot(rt::ThreadSlot::kPoolWorker) = &mine;
  void* seen = &mine;
  rt::Thread thread("other", [&seen] { seen = rt::threadSlot(rt::ThreadSlot::kPoolWorker); });
  thread.join();
  EXPECT_EQ(seen, nullptr);
  EXPECT_EQ(rt::threadSlot(rt::ThreadSlot::kPoolWorker), &mine);
  rt::threadSlot(rt::ThreadSlot::kPoolWorker) = nullptr;
}

TEST(RealThreads, MayBeMovedAndJoinedElsewhere) {
  bool ran = false;
  rt::Thread first("moved", [&ran] { ran = true; });
  rt::Thread second(std::move(first));
  rt::Thread third;
  third = std::move(second);
  EXPECT_FALSE(second.joinable());
  third.join();
  EXPECT_TRUE(ran);
}

TEST(RealThreads, RandomNumbersDifferBetweenThreads) {
  std::set<std::uint64_t> numbers{rt::randomNumber()};
  rt::Mutex mutex;
  for (int round = 0; round < 8; ++round) {
    rt::Thread thread("random", [&] {
      const std::scoped_lock lock(mutex);
      numbers.insert(rt::randomNumber());
    });
    thread.join();
  }
  EXPECT_EQ(numbers.size(), 9U);
}

TEST(RealClock, TicksAreNanosecondsAndNeverStepBack) {
  const auto timebase = rt::timebase();
  ASSERT_TRUE(timebase.has_value());
  EXPECT_EQ(timebase->numerator, 1U);
  EXPECT_EQ(timebase->denominator, 1U);
  std::uint64_t last = rt::ticks();
  for (int round = 0; round < 1'000; ++round) {
    const std::uint64_t now = rt::ticks();
    EXPECT_GE(now, last);
    last = now;
  }
}

TEST(RealClock, ADeadlineThatHasPassedIsReportedAtOnce) {
  rt::Mutex mutex;
  rt::CondVar condition;
  const std::scoped_lock lock(mutex);
  EXPECT_FALSE(condition.waitUntil(mutex, 0));
  EXPECT_FALSE(condition.waitUntil(mutex, rt::ticks()));
}

TEST(ScaledClock, RunsFasterAndNeverStepsBack) {
  const std::uint64_t start = rt::ticks();
  std::uint64_t at_the_end = 0;
  {
    const FastClocks fast(10'000);
    EXPECT_GE(rt::ticks(), start);
    const std::uint64_t before_sleep = rt::ticks();
    rt::sleepNs(20 * kSecondNs);  // 2 ms
    EXPECT_GE(rt::ticks(), before_sleep + 20 * kSecondNs);
    at_the_end = rt::ticks();
  }
  EXPECT_GE(rt::ticks(), at_the_end);
  EXPECT_EQ(rt::timeScaleForTests(), 1U);
}

TEST(ScaledClock, AWaitThatTimedOutFindsItsDeadlinePassed) {
  const FastClocks fast(7'777);
  rt::Mutex mutex;
  rt::CondVar condition;
  const std::scoped_lock lock(mutex);
  for (int round = 0; round < 20; ++round) {
    const std::uint64_t deadline = rt::deadlineAfterNs(kSecondNs + 1);
    while (condition.waitUntil(mutex, deadline)) {
    }
    EXPECT_GE(rt::ticks(), deadline);
  }
}

TEST(ScaledClock, TheWallClockGoesAlong) {
  const FastClocks fast(10'000);
  const std::int64_t start = rt::wallClockNs();
  rt::sleepNs(10 * kSecondNs);  // 1 ms
  EXPECT_GE(rt::wallClockNs() - start, static_cast<std::int64_t>(9 * kSecondNs));
}

TEST(Timebase, ElapsedNanosecondsAreTicksTimesTheConversion) {
  EXPECT_EQ(gTimebaseConversion, 0.0);
  EXPECT_EQ(elapsedNs(100, 400), 0.0);
  gTimebaseConversion = 125.0 / 3.0;
  EXPECT_DOUBLE_EQ(elapsedNs(100, 400), 12'500.0);
  EXPECT_DOUBLE_EQ(elapsedNs(400, 100), -12'500.0);
  gTimebaseConversion = 0.0;
}

class BrokenPrograms : public ::testing::Test {
 protected:
  void SetUp() override { GTEST_FLAG_SET(death_test_style, "threadsafe"); }
};

TEST_F(BrokenPrograms, AnExceptionThatLeavesAThreadNamesIt) {
  EXPECT_DEATH(rt::Thread("bad", [] { throw std::runtime_error("oops"); }).join(),
               "panic: thread bad ended by an exception: oops");
}

TEST_F(BrokenPrograms, AThreadThatIsNeitherJoinedNorDetached) {
  EXPECT_DEATH({ const rt::Thread thread("forgotten", [] {}); },
               "destroyed before it was joined or detached");
}

TEST_F(BrokenPrograms, APanicSaysWhy) {
  EXPECT_DEATH(rt::panic("out of marmalade"), "panic: out of marmalade");
}

}  // namespace
}  // namespace spacekeep
