// What the daemon puts down of its own doings, and who may look at it.
#include <gtest/gtest.h>

#include "history/entry.h"
#include "support/timebase.h"
#include "tests/both/history/history_world.h"
#include "tests/helpers/schedules.h"

namespace spacekeep::test {
namespace {

/// A purge that ends without waiting out a deadline.
Dictionary purgeRequest(std::uint64_t amount_bytes) {
  return {{keys::kVolume, "/"},
          {keys::kAmount, amount_bytes},
          {keys::kUrgency, 1},
          {keys::kPurgeTimeout, 300},
          {keys::kFinishEarly, true}};
}

std::shared_ptr<sim::ClientCall> purge(HistoryWorld& world, const Dictionary& request) {
  return world.world.call(world.world.client("purger", {"PURGE_ENTITLEMENT"}), "clientPurge",
                          {request});
}

Value valueOf(const Dictionary& entry, const char* key) {
  const Value* value = entry.find(key);
  return value == nullptr ? Value("absent") : *value;
}

TEST(Remembered, APurgeOfAClientWithWhoAskedAndWhoGave) {
  inEverySchedule(kSchedules, [] {
    HistoryWorld world;
    world.world.declareService("cache", sim::ownsBytes("/", 5000));
    world.start();
    ASSERT_TRUE(purge(world, purgeRequest(1000))->wait().has_value());
    const auto entries = world.entries();
    ASSERT_EQ(entries.size(), 1U);
    const Dictionary& entry = entries.front();
    EXPECT_EQ(valueOf(entry, keys::kEntry), Value(1));
    EXPECT_EQ(valueOf(entry, keys::kKind), Value("purge"));
    EXPECT_EQ(
        valueOf(entry, keys::kClient),
        Value(Dictionary{{keys::kUid, 1000}, {keys::kPid, 4711}, {keys::kProgram, "purger"}}));
    EXPECT_EQ(valueOf(entry, keys::kVolume), Value("/"));
    EXPECT_EQ(valueOf(entry, keys::kAmount), Value(1000));
    EXPECT_EQ(valueOf(entry, keys::kAmountFreed), Value(1000));
    EXPECT_EQ(valueOf(entry, keys::kFreespaceBegin), Value(0));
    EXPECT_EQ(valueOf(entry, keys::kFreespaceEnd), Value(1000));
    EXPECT_EQ(valueOf(entry, keys::kReportingServices), Value(Dictionary{{"cache", 1000}}));
    EXPECT_EQ(valueOf(entry, keys::kUrgency), Value(1));
    EXPECT_FALSE(entry.contains(keys::kWhyShort));
    ASSERT_NE(valueOf(entry, keys::kDate).date(), nullptr);
    EXPECT_GT(valueOf(entry, keys::kDate).date()->unix_ns, 0);
  });
}

TEST(Remembered, AServiceThatWasAskedSeveralTimesWithTheSumOfItsAnswers) {
  inEverySchedule(kSchedules, [] {
    HistoryWorld world;
    // Asked in the order of their names: no urgency ends before the large one has answered.
    world.world.declareService("a-large", sim::ownsBytes("/", 900));
    world.world.declareService("b-empty", sim::ownsBytes("/", 0));
    world.start();
    Dictionary request = purgeRequest(1000);
    request.set(keys::kUrgency, 3);
    // A reply that comes after the outcome may be what the client is answered; not so the entry.
    ASSERT_TRUE(purge(world, request)->wait().has_value());
    const auto entries = world.entries();
    ASSERT_EQ(entries.size(), 1U);
    const Value reported = valueOf(entries.front(), keys::kReportingServices);
    ASSERT_NE(reported.dictionary(), nullptr);
    const std::uint64_t large_bytes = unsignedAt(*reported.dictionary(), "a-large").value_or(0);
    EXPECT_GE(large_bytes, 500U) << "one share; in most schedules several";
    EXPECT_LE(large_bytes, 900U);
    // Why it was short hangs on the schedule: where the divisor passes zero, services are left waiting.
    EXPECT_TRUE(entries.front().contains(keys::kWhyShort));
  });
}

TEST(Remembered, APurgeForWhichAllHaveGivenWhatTheyHadWithTheReason) {
  inEverySchedule(kSchedules, [] {
    HistoryWorld world;
    world.world.declareService("small", sim::ownsBytes("/", 900));
    world.start();
    ASSERT_TRUE(purge(world, purgeRequest(1000))->wait().has_value());
    const auto entries = world.entries();
    ASSERT_EQ(entries.size(), 1U);
    EXPECT_EQ(valueOf(entries.front(), keys::kAmountFreed), Value(900));
    EXPECT_EQ(valueOf(entries.front(), keys::kWhyShort), Value(history::kNothingMoreToGive));
  });
}

TEST(Remembered, APurgeThatNobodyAnswers) {
  inEverySchedule(4, [] {
    HistoryWorld world;
    sim::ServiceBehaviour held = sim::ownsBytes("/", 5000);
    held.purge = {sim::CallBehaviour{.answer = sim::Answer::kNever}};
    world.world.declareService("stuck", held);
    world.start();
    ASSERT_TRUE(purge(world, purgeRequest(1000))->wait().has_value());
    const auto entries = world.entries();
    ASSERT_EQ(entries.size(), 1U);
    EXPECT_EQ(valueOf(entries.front(), keys::kWhyShort), Value(history::kNoAnswerInTime));
    EXPECT_EQ(valueOf(entries.front(), keys::kServicesInFlight), Value(Array{"stuck"}));
  });
}

TEST(Remembered, APurgeWithoutServices) {
  inEverySchedule(4, [] {
    HistoryWorld world;
    world.start();
    ASSERT_TRUE(purge(world, purgeRequest(1000))->wait().has_value());
    const auto entries = world.entries();
    ASSERT_EQ(entries.size(), 1U);
    EXPECT_EQ(valueOf(entries.front(), keys::kWhyShort), Value(history::kNoServices));
  });
}

TEST(Remembered, ARefusalWithAnOutcomeButNeitherAnotherNorAMissingRight) {
  inEverySchedule(kSchedules, [] {
    HistoryWorld world;
    world.start();
    EXPECT_TRUE(purge(world, {{keys::kVolume, "/"}})->wait().has_value());
    EXPECT_FALSE(purge(world, {{keys::kVolume, "/nowhere"}, {keys::kAmount, 1}})->wait());
    const auto stranger = world.world.client("stranger");
    EXPECT_FALSE(world.world.call(stranger, "clientPurge", {purgeRequest(1)})->wait());
    const auto entries = world.entries();
    ASSERT_EQ(entries.size(), 1U);
    EXPECT_EQ(valueOf(entries.front(), keys::kWhyShort),
              Value("refused: Parameter error, no Amount key in info dict"));
  });
}

TEST(Remembered, ThePurgesForLowSpaceAsTheDaemonsOwn) {
  inEverySchedule(4, [] {
    HistoryWorld world;
    world.world.declareService("cache", sim::ownsBytes("/", 300'000'000));
    world.world.volumes().setLowSpace({"/"});
    world.start();
    world.daemon->handleVFSStreamEvent({{"_Flags", 4}});
    const auto entries = world.entries();
    ASSERT_EQ(entries.size(), 1U);
    EXPECT_EQ(valueOf(entries.front(), keys::kKind), Value("low space"));
    EXPECT_FALSE(entries.front().contains(keys::kClient));
    EXPECT_EQ(valueOf(entries.front(), keys::kAmount), Value(262'144'000));
    EXPECT_EQ(valueOf(entries.front(), keys::kAmountFreed), Value(262'144'000));
  });
}

TEST(Remembered, TheDailyPassOfAVolume) {
  inEverySchedule(4, [] {
    HistoryWorld world;
    sim::ServiceBehaviour behaviour;
    behaviour.periodic_amount = 70;
    world.world.declareService("cache", behaviour);
    world.start();
    world.daemon->performPeriodicsWithInfo(Dictionary{{keys::kVolume, "/"}});
    world.daemon->performPeriodicsWithInfo(Dictionary{{keys::kVolume, "/nowhere"}});
    const auto entries = world.entries();
    ASSERT_EQ(entries.size(), 1U);
    EXPECT_EQ(valueOf(entries.front(), keys::kKind), Value("daily pass"));
    EXPECT_EQ(valueOf(entries.front(), keys::kVolume), Value("/"));
    EXPECT_EQ(valueOf(entries.front(), keys::kAmountReported), Value(70));
    EXPECT_FALSE(entries.front().contains(keys::kWhyShort));
  });
}

TEST(Remembered, TheDailyPassNamesWhoDidNotAnswer) {
  inEverySchedule(4, [] {
    HistoryWorld world;
    sim::ServiceBehaviour behaviour;
    behaviour.periodic = sim::CallBehaviour{.answer = sim::Answer::kNever};
    world.world.declareService("stuck", behaviour);
    world.start();
    world.daemon->performPeriodicsWithInfo(Dictionary{{keys::kVolume, "/"}});
    const auto entries = world.entries();
    ASSERT_EQ(entries.size(), 1U);
    EXPECT_EQ(valueOf(entries.front(), keys::kServicesInFlight), Value(Array{"stuck"}));
    EXPECT_EQ(valueOf(entries.front(), keys::kWhyShort), Value("no answer in time"));
    EXPECT_GE(entries.front().find(keys::kElapsedTime)->asDouble().value_or(0), 15.0);
  });
}

TEST(ClientHistory, WithoutTheItemizedRightIsRefusedWithNothing) {
  inEverySchedule(kSchedules, [] {
    HistoryWorld world;
    world.start();
    const auto other = world.world.client(
        "other", {"PURGEABLE_ENTITLEMENT", "PURGE_ENTITLEMENT", "SERVICE_ENTITLEMENT"});
    const auto call = world.world.call(other, "clientHistory", {Dictionary{}});
    EXPECT_EQ(call->wait(), std::nullopt);
    EXPECT_EQ(call->state(), sim::ClientCall::State::kAnswered);
    EXPECT_EQ(world.problems(),
              std::vector<std::string>{"clientHistory Connection is not entitled!"});
    EXPECT_EQ(world.world.history().writes(), 0U);
  });
}

TEST(ClientHistory, OfOneVolumeHoldsNoOther) {
  inEverySchedule(kSchedules, [] {
    HistoryWorld world;
    world.world.volumes().add("/data", 1'000'000, 0);
    world.start();
    Dictionary request = purgeRequest(0);
    ASSERT_TRUE(purge(world, request)->wait().has_value());
    request.set(keys::kVolume, "/data");
    ASSERT_TRUE(purge(world, request)->wait().has_value());
    EXPECT_EQ(world.entries().size(), 2U);
    const auto entries = world.entries({{keys::kVolume, "/data"}});
    ASSERT_EQ(entries.size(), 1U);
    EXPECT_EQ(valueOf(entries.front(), keys::kVolume), Value("/data"));
  });
}

TEST(ClientHistory, OfADaemonThatKeepsNoneIsAnError) {
  inEverySchedule(kSchedules, [] {
    sim::World world;
    const auto daemon = Spacekeep::create(world.platform());
    const auto reader = world.client("reader", {"ITEMIZED_PURGEABLE_ENTITLEMENT"});
    const auto call = world.call(reader, "clientHistory", {Dictionary{}});
    call->wait();
    EXPECT_EQ(call->state(), sim::ClientCall::State::kFailed);
    EXPECT_EQ(call->error(), "this daemon keeps no history");
    world.shutDown();
  });
}

TEST(ClientHistory, ThatCannotBeReadIsAnErrorWithTheReason) {
  inEverySchedule(kSchedules, [] {
    HistoryWorld world;
    world.start();
    world.world.history().fail("the disk is gone");
    const auto reader = world.world.client("reader", {"ITEMIZED_PURGEABLE_ENTITLEMENT"});
    const auto call = world.world.call(reader, "clientHistory", {Dictionary{}});
    call->wait();
    EXPECT_EQ(call->state(), sim::ClientCall::State::kFailed);
    EXPECT_EQ(call->error(), "the disk is gone");
  });
}

}  // namespace
}  // namespace spacekeep::test
