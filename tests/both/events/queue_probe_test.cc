#include "support/events/queue_probe.h"

#include <gtest/gtest.h>

#include "support/events/keep_alive_count.h"
#include "support/queues/waiting.h"
#include "tests/helpers/schedules.h"

namespace spacekeep {
namespace {

constexpr std::uint64_t kSecond = 1'000'000'000;

TEST(QueueProbe, QueuesThatWorkAnswer) {
  inEverySchedule(50, [] {
    ConcurrentQueue global({});
    QueueProbe probe({SerialQueue::create("a", global), SerialQueue::create("b", global)});
    EXPECT_TRUE(probe.answersWithin(600 * kSecond));
    EXPECT_TRUE(probe.answersWithin(600 * kSecond));
  });
}

TEST(QueueProbe, NoQueuesAnswer) {
  inEverySchedule(1, [] { EXPECT_TRUE(QueueProbe({}).answersWithin(0)); });
}

TEST(QueueProbe, OneStuckQueueIsEnoughAndIsAskedOnlyOnce) {
  inEverySchedule(50, [] {
    ConcurrentQueue global({});
    const auto stuck = SerialQueue::create("stuck", global);
    QueueProbe probe({SerialQueue::create("works", global), stuck});
    stuck->suspend();
    for (int i = 0; i < 5; ++i) EXPECT_FALSE(probe.answersWithin(kSecond));
    EXPECT_EQ(stuck->depth(), 1U);
    stuck->resume();
    EXPECT_TRUE(probe.answersWithin(600 * kSecond));
  });
}

TEST(QueueProbe, AQueueThatOutlivesTheProbeMayAnswerLate) {
  inEverySchedule(50, [] {
    ConcurrentQueue global({});
    const auto stuck = SerialQueue::create("stuck", global);
    stuck->suspend();
    {
      QueueProbe probe({stuck});
      EXPECT_FALSE(probe.answersWithin(kSecond));
    }
    stuck->resume();
    stuck->sync([] {});
    EXPECT_EQ(stuck->depth(), 0U);
  });
}

TEST(KeepAliveCount, OnlyTheFirstAndTheLastTransactionAreTold) {
  inEverySchedule(1, [] {
    std::vector<bool> told;
    KeepAliveCount count([&](bool busy) { told.push_back(busy); });
    {
      const KeepAliveTransaction outer(count);
      const KeepAliveTransaction inner(count);
      EXPECT_EQ(count.open(), 2U);
      EXPECT_EQ(told, (std::vector<bool>{true}));
    }
    EXPECT_EQ(count.open(), 0U);
    EXPECT_EQ(told, (std::vector<bool>{true, false}));
  });
}

TEST(KeepAliveCount, ItIsToldInTurnsHoweverManyThreadsThereAre) {
  inEverySchedule(100, [] {
    std::vector<bool> told;
    KeepAliveCount count([&](bool busy) { told.push_back(busy); });
    TaskGroup group;
    ConcurrentQueue queue({});
    for (int i = 0; i < 6; ++i) {
      group.async(queue, [&] { const KeepAliveTransaction transaction(count); });
    }
    group.wait();
    ASSERT_FALSE(told.empty());
    for (std::size_t i = 0; i < told.size(); ++i) EXPECT_EQ(told[i], i % 2 == 0);
    EXPECT_FALSE(told.back());
  });
}

}  // namespace
}  // namespace spacekeep
