// When the history reaches the disk, to the nanosecond of virtual time.
#include <gtest/gtest.h>

#include "history/history.h"
#include "tests/both/history/history_world.h"
#include "tests/helpers/schedules.h"

namespace spacekeep::test {
namespace {

/// The moment of the next write since the world began.
void expectOneWriteAt(HistoryWorld& world, std::uint64_t at_ns) {
  const std::uint64_t before = world.world.history().writes();
  ASSERT_LT(world.world.nowNs(), at_ns);
  rt::sleepNs(at_ns - 1 - world.world.nowNs());
  EXPECT_EQ(world.world.history().writes(), before);
  rt::sleepNs(2);
  EXPECT_EQ(world.world.history().writes(), before + 1);
}

TEST(HistoryTimes, ManyEntriesMakeOneWriteFiveSecondsAfterTheFirst) {
  inEverySchedule(10, [] {
    HistoryWorld world;
    const auto history = History::create(world.world.platform());
    const std::uint64_t start_ns = world.world.nowNs();
    for (int i = 0; i < 100; ++i) {
      history->add(numbered(i));
      rt::sleepNs(kSecond / 100);
    }
    expectOneWriteAt(world, start_ns + 5 * kSecond);
    EXPECT_EQ(world.world.history().entries().size(), 100U);
    rt::sleepNs(3600 * kSecond);
    EXPECT_EQ(world.world.history().writes(), 1U) << "nothing happens without entries";
  });
}

TEST(HistoryTimes, EntriesThatComeDuringAWriteMakeTheNextOne) {
  inEverySchedule(10, [] {
    HistoryWorld world;
    const auto history = History::create(world.world.platform());
    world.world.history().setWriteTimeNs(3 * kSecond);
    history->add(numbered(1));
    rt::sleepNs(6 * kSecond);
    history->add(numbered(2));
    rt::sleepNs(20 * kSecond);
    EXPECT_EQ(world.world.history().writes(), 2U);
    EXPECT_EQ(world.world.history().entries().size(), 2U);
  });
}

TEST(HistoryTimes, ADiskThatRefusesIsAskedMoreAndMoreSeldom) {
  inEverySchedule(10, [] {
    HistoryWorld world;
    const auto history = History::create(world.world.platform());
    world.world.history().fail("the disk is full");
    std::uint64_t at_ns = world.world.nowNs() + 5 * kSecond;
    history->add(numbered(1));
    for (std::uint64_t pause_ns = 10 * kSecond; pause_ns <= 3600 * kSecond; pause_ns *= 2) {
      expectOneWriteAt(world, at_ns);
      at_ns += pause_ns;
    }
    expectOneWriteAt(world, at_ns);
    for (int round = 0; round < 3; ++round) expectOneWriteAt(world, at_ns += 3600 * kSecond);
    world.world.history().fail("");
    expectOneWriteAt(world, at_ns += 3600 * kSecond);
    EXPECT_EQ(world.world.history().entries().size(), 1U);
    world.world.history().fail("the disk is full again");
    history->add(numbered(2));
    at_ns = world.world.nowNs() + 5 * kSecond;
    expectOneWriteAt(world, at_ns);
    expectOneWriteAt(world, at_ns + 10 * kSecond);
  });
}

TEST(HistoryTimes, APurgeIsAnsweredAtTheSameMomentWhateverTheHistoryDoes) {
  const auto answered_ns = [](const std::function<void(HistoryWorld&)>& prepare) {
    std::uint64_t moment_ns = 0;
    inEverySchedule(1, [&] {
      HistoryWorld world;
      prepare(world);
      world.world.declareService("cache", sim::ownsBytes("/", 5000));
      world.start();
      const auto purger = world.world.client("purger", {"PURGE_ENTITLEMENT"});
      for (int i = 0; i < 3; ++i) {
        const auto call = world.world.call(
            purger, "clientPurge", {Dictionary{{keys::kVolume, "/"}, {keys::kAmount, 500}}});
        EXPECT_EQ(unsignedAt(call->wait().value_or(Dictionary()), keys::kAmount), 500U);
        moment_ns = call->answeredNs();
      }
    });
    return moment_ns;
  };
  const std::uint64_t expected_ns = answered_ns([](HistoryWorld&) {});
  EXPECT_GT(expected_ns, 0U);
  EXPECT_EQ(answered_ns([](HistoryWorld& world) { world.world.history().fail("full"); }),
            expected_ns);
  EXPECT_EQ(answered_ns([](HistoryWorld& world) { world.world.history().refuseToOpen(true); }),
            expected_ns);
  EXPECT_EQ(
      answered_ns([](HistoryWorld& world) { world.world.history().setWriteTimeNs(900 * kSecond); }),
      expected_ns);
}

}  // namespace
}  // namespace spacekeep::test
