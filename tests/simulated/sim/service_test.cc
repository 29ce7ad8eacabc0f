// A simulated service does as its behaviour says.
#include <gtest/gtest.h>

#include "tests/helpers/schedules.h"
#include "tests/simulated/sim/service_line.h"

namespace spacekeep::sim {
namespace {

constexpr unsigned kSchedules = 20;

TEST(SimulatedService, GivesWhatItIsAskedForAndTheVolumeShowsIt) {
  inEverySchedule(kSchedules, [] {
    Line line(ownsBytes("/", 500));
    line.purge(200);
    ASSERT_TRUE(comes(line.replied));
    EXPECT_EQ(line.answeredAmount(), 200U);
    EXPECT_EQ(line.world.volumes().freeBytes("/"), 300U);
    EXPECT_EQ(line.service->ownedBytes("/"), 300U);
  });
}

TEST(SimulatedService, NeverGivesMoreThanItOwns) {
  inEverySchedule(kSchedules, [] {
    Line line(ownsBytes("/", 500));
    line.purge(2'000);
    ASSERT_TRUE(comes(line.replied));
    EXPECT_EQ(line.answeredAmount(), 500U);
    EXPECT_EQ(line.world.volumes().freeBytes("/"), 600U);
  });
}

TEST(SimulatedService, GivesAtAnUrgencyWhatMayGoUpToIt) {
  inEverySchedule(kSchedules, [] {
    ServiceBehaviour behaviour;
    behaviour.owns["/"] = {0, 10, 20, 40, 80};
    Line line(behaviour);
    line.purge(1'000, 1);
    ASSERT_TRUE(comes(line.replied));
    EXPECT_EQ(line.answeredAmount(), 10U);
    line.purge(1'000, 3);
    ASSERT_TRUE(comes(line.replied));
    EXPECT_EQ(line.answeredAmount(), 60U);
    line.purge(1'000, 4);
    ASSERT_TRUE(comes(line.replied));
    EXPECT_EQ(line.answeredAmount(), 80U);
  });
}

TEST(SimulatedService, GivesLessOrMoreThanAskedByPercent) {
  inEverySchedule(kSchedules, [] {
    Line less(owning(5'000, {.percent_given = 50}));
    less.purge(101);
    ASSERT_TRUE(comes(less.replied));
    EXPECT_EQ(less.answeredAmount(), 50U);
  });
  inEverySchedule(kSchedules, [] {
    Line more(owning(5'000, {.percent_given = 250}));
    more.purge(100);
    ASSERT_TRUE(comes(more.replied));
    EXPECT_EQ(more.answeredAmount(), 250U);
    EXPECT_EQ(more.world.volumes().freeBytes("/"), 350U);
  });
}

TEST(SimulatedService, ReportsOtherThanItFreed) {
  inEverySchedule(kSchedules, [] {
    Line line(owning(5'000, {.percent_reported = 150, .reported_extra = 7}));
    line.purge(100);
    ASSERT_TRUE(comes(line.replied));
    EXPECT_EQ(line.answeredAmount(), 157U);
    EXPECT_EQ(line.world.volumes().freeBytes("/"), 200U);
    const RecordedCall call = line.service->calls().front();
    EXPECT_EQ(call.freed, 100U);
    EXPECT_EQ(call.reported, 157U);
  });
}

TEST(SimulatedService, AnswersExactlyAfterItsDelay) {
  inEverySchedule(kSchedules, [] {
    Line line(owning(500, {.delay_ns = 3 * kSecond}));
    const std::uint64_t start = line.world.nowNs();
    line.purge(1);
    ASSERT_TRUE(comes(line.replied));
    EXPECT_EQ(line.world.nowNs() - start, 3 * kSecond);
  });
}

TEST(SimulatedService, SpaceComesBackLaterThanTheAnswer) {
  inEverySchedule(kSchedules, [] {
    Line line(owning(500, {.space_returns_after_ns = 2 * kSecond}));
    line.purge(50);
    ASSERT_TRUE(comes(line.replied));
    EXPECT_EQ(line.answeredAmount(), 50U);
    EXPECT_EQ(line.world.volumes().freeBytes("/"), 100U);
    rt::sleepNs(2 * kSecond + 1);
    EXPECT_EQ(line.world.volumes().freeBytes("/"), 150U);
  });
}

TEST(SimulatedService, RepliesWithoutANumericAmount) {
  inEverySchedule(kSchedules, [] {
    ServiceBehaviour behaviour = ownsBytes("/", 500);
    behaviour.purge = {{.answer = Answer::kRepliesWithoutAmount},
                       {.answer = Answer::kRepliesWithText},
                       {.answer = Answer::kRepliesNothing}};
    Line line(behaviour);
    line.purge(10);
    ASSERT_TRUE(comes(line.replied));
    ASSERT_TRUE(line.answer);
    EXPECT_FALSE(line.answer->contains("SPACEKEEP_AMOUNT"));
    line.purge(10);
    ASSERT_TRUE(comes(line.replied));
    EXPECT_NE(stringAt(*line.answer, "SPACEKEEP_AMOUNT"), nullptr);
    line.purge(10);
    ASSERT_TRUE(comes(line.replied));
    EXPECT_FALSE(line.answer);
  });
}

TEST(SimulatedService, HandlesTheNthCallAsTheNthEntrySaysAndLaterOnesAsTheLast) {
  inEverySchedule(kSchedules, [] {
    ServiceBehaviour behaviour = ownsBytes("/", 500);
    behaviour.purge = {{.percent_given = 0}, {.percent_given = 100}};
    Line line(behaviour);
    for (const std::uint64_t expected : {0U, 10U, 10U}) {
      line.purge(10);
      ASSERT_TRUE(comes(line.replied));
      EXPECT_EQ(line.answeredAmount(), expected);
    }
  });
}

TEST(SimulatedService, HoldsACallForGoodUntilToldToAnswer) {
  inEverySchedule(kSchedules, [] {
    Line line(owning(500, {.answer = Answer::kNever}));
    line.purge(10);
    EXPECT_EQ(line.replied.waitForNs(3600 * kSecond), WaitResult::kTimedOut);
    EXPECT_EQ(line.service->calls().front().state, RecordedCall::State::kOpen);
    line.service->answerHeldCalls();
    ASSERT_TRUE(comes(line.replied));
    EXPECT_EQ(line.answeredAmount(), 10U);
  });
}

TEST(SimulatedService, CountsARequestThatComesWhileOneOfTheSameTokenIsOpen) {
  inEverySchedule(kSchedules, [] {
    Line line(owning(500, {.answer = Answer::kNever}));
    line.purge(10, 1, "one");
    line.purge(10, 1, "other");
    ASSERT_TRUE(line.world.eventually([&] { return line.service->calls().size() == 2; }));
    EXPECT_EQ(line.service->askedTwiceAtOnce(), 0U);
    line.purge(10, 1, "one");
    ASSERT_TRUE(line.world.eventually([&] { return line.service->calls().size() == 3; }));
    EXPECT_EQ(line.service->askedTwiceAtOnce(), 1U);
  });
}

TEST(SimulatedService, ACancelStopsAHeldPurgeWhereItIsToldTo) {
  inEverySchedule(kSchedules, [] {
    ServiceBehaviour behaviour = owning(500, {.answer = Answer::kNever});
    behaviour.cancel_stops_purge = true;
    Line line(behaviour);
    line.purge(10);
    ASSERT_TRUE(line.world.eventually([&] { return line.service->calls().size() == 1; }));
    CountingSemaphore cancelled(0);
    SpacekeepServiceProtocol(line.proxy).serviceCancelPurge([&] { cancelled.signal(); });
    ASSERT_TRUE(comes(line.replied));
    ASSERT_TRUE(comes(cancelled));
    EXPECT_EQ(line.answeredAmount(), 0U);
  });
}

}  // namespace
}  // namespace spacekeep::sim
