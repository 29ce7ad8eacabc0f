#include <gtest/gtest.h>

#include <memory>
#include <vector>

#include "support/queues/borrowed_thread.h"
#include "support/queues/serial_queue.h"
#include "support/queues/waiting.h"
#include "tests/helpers/schedules.h"

namespace spacekeep {
namespace {

TEST(BorrowedThread, RunsWhatItsTaskSubmitsItselfAndInOrder) {
  inEverySchedule(50, [] {
    ConcurrentQueue queue({});
    std::vector<int> order;  // written without a lock: one thread runs all of it
    BorrowedThread self(queue, [] { FAIL() << "nothing waited"; });
    EXPECT_TRUE(self.run([&] {
      queue.async([&] { order.push_back(2); });
      queue.async([&] { order.push_back(3); });
      order.push_back(1);
    }));
    EXPECT_EQ(order, (std::vector<int>{1, 2, 3}));
    EXPECT_EQ(queue.counts().peak_threads, 0U);
  });
}

TEST(BorrowedThread, RunsTheTasksOfAnIdleSerialQueueItself) {
  inEverySchedule(50, [] {
    ConcurrentQueue global({});
    const auto serial = SerialQueue::create("test", global);
    bool ran = false;
    BorrowedThread self(global, [] { FAIL() << "nothing waited"; });
    EXPECT_TRUE(self.run([&] { serial->async([&] { ran = true; }); }));
    EXPECT_TRUE(ran);
    EXPECT_EQ(global.counts().peak_threads, 0U);
  });
}

TEST(BorrowedThread, GivesUpItsDutyOnceBeforeItWaitsAndPassesOnTheRest) {
  inEverySchedule(200, [] {
    ConcurrentQueue queue({});
    CountingSemaphore signalled_by_the_rest(0);
    int given_up = 0;
    BorrowedThread self(queue, [&] { ++given_up; });
    EXPECT_FALSE(self.run([&] {
      // Were this kept by the thread that waits for it, nothing would ever signal.
      queue.async([&] { signalled_by_the_rest.signal(); });
      signalled_by_the_rest.wait();
      queue.async([&] { signalled_by_the_rest.signal(); });
      signalled_by_the_rest.wait();
    }));
    EXPECT_EQ(given_up, 1);
  });
}

TEST(BorrowedThread, LeavesTasksOfOtherQueuesAlone) {
  inEverySchedule(50, [] {
    ConcurrentQueue lent_to({});
    ConcurrentQueue other({});
    const auto ran = std::make_shared<CountingSemaphore>(0);
    BorrowedThread self(lent_to, [] {});
    self.run([&] { other.async([ran] { ran->signal(); }); });
    ran->wait();
    EXPECT_EQ(other.counts().peak_threads, 1U);
  });
}

TEST(BorrowedThread, IsKnownToItsThreadOnlyWhileItLives) {
  inEverySchedule(10, [] {
    ConcurrentQueue queue({});
    EXPECT_EQ(BorrowedThread::current(), nullptr);
    {
      const BorrowedThread self(queue, [] {});
      EXPECT_EQ(BorrowedThread::current(), &self);
    }
    EXPECT_EQ(BorrowedThread::current(), nullptr);
  });
}

}  // namespace
}  // namespace spacekeep
