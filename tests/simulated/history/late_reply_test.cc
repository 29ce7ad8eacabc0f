// What the history shows of a purge whose answer to the client is a service's late reply.
#include <gtest/gtest.h>

#include "history/history.h"
#include "tests/both/history/history_world.h"
#include "tests/helpers/schedules.h"

namespace spacekeep::test {
namespace {

/// Gives what it owns on "/" so late.
sim::ServiceBehaviour givesAfter(std::uint64_t delay_ns, std::uint64_t bytes) {
  sim::ServiceBehaviour behaviour = sim::ownsBytes("/", bytes);
  behaviour.purge = {sim::CallBehaviour{.delay_ns = delay_ns}};
  return behaviour;
}

// The purge has come to its outcome after 2 s. A newcomer that is slow to answer its ping holds the
// registry, and with it the end of the purge, until after the late reply.
TEST(Remembered, AReplyAfterTheOutcomeIsTheAnswerButNotWhatTheHistoryShows) {
  inEverySchedule(kSchedules, [] {
    HistoryWorld world;
    world.world.declareService("late", givesAfter(3 * kSecond, 5000));
    world.world.declareService("soon", givesAfter(kSecond / 2, 300));
    world.start();
    const auto purge = world.world.call(
        world.world.client("purger", {"PURGE_ENTITLEMENT"}), "clientPurge",
        {Dictionary{{keys::kVolume, "/"}, {keys::kAmount, 1000}, {keys::kUrgency, 1}}});
    rt::sleepNs(kSecond);
    sim::ServiceBehaviour slow;
    slow.ping = sim::CallBehaviour{.delay_ns = 3 * kSecond};
    const auto newcomer = world.world.addService("newcomer", slow);
    world.world.checkIn(newcomer, {{"PURGE", true}})->wait();
    const auto answer = purge->wait();
    ASSERT_TRUE(answer.has_value());
    EXPECT_EQ(unsignedAt(*answer, keys::kAmount), 500U);
    const auto entries = world.entries();
    ASSERT_EQ(entries.size(), 1U);
    const Dictionary& entry = entries.front();
    EXPECT_EQ(unsignedAt(entry, keys::kAmount), 1000U);
    EXPECT_EQ(unsignedAt(entry, keys::kAmountFreed), 300U);
    EXPECT_EQ(entry.find(keys::kElapsedTime)->asDouble(), 2.0);
    EXPECT_EQ(unsignedAt(entry, keys::kFreespaceEnd), 300U);
  });
}

}  // namespace
}  // namespace spacekeep::test
