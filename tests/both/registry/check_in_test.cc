// Services that check in at run time.
#include <gtest/gtest.h>

#include "tests/both/daemon/daemon_world.h"
#include "tests/helpers/schedules.h"

namespace spacekeep::test {
namespace {

using CallState = sim::ClientCall::State;

const Dictionary kPurges{{"PURGE", true}};

TEST(CheckIn, ANewServiceIsPingedRegisteredAndAnswered) {
  inEverySchedule(kSchedules, [] {
    DaemonWorld world;
    world.start();
    const auto cache = world.world.addService("cache");
    const auto call = world.world.checkIn(
        cache, {{"PURGE", true}, {"PERIODIC", 1}, {"SPACEKEEP_NOTIFICATIONS", Array{"news"}}});
    EXPECT_EQ(call->wait(), (Dictionary{{"SPACEKEEP_ID", "cache"}, {"ANON", true}}));
    EXPECT_EQ(std::get<ipc::OptionalString>(call->answer()[1]), std::nullopt);
    EXPECT_EQ(cache->callCount("servicePing"), 1U);
    const auto record = world.services().at("cache");
    EXPECT_EQ(record->ID, "cache");
    EXPECT_TRUE(record->doesPurge());
    EXPECT_TRUE(record->doesPeriodic());
    EXPECT_FALSE(record->doNotQuery());
    EXPECT_TRUE(record->desires("news"));
    EXPECT_NE(record->connection, nullptr);
    EXPECT_NE(record->endpoint(), nullptr);
    EXPECT_TRUE(world.daemons().empty());
  });
}

TEST(CheckIn, UnderAnIdOfADescriptorIsAnsweredWithNeitherResultNorError) {
  inEverySchedule(kSchedules, [] {
    DaemonWorld world;
    world.world.declareService("declared", {});
    world.start();
    const auto impostor = world.world.addService("declared");
    const auto before = world.services();
    const auto call = world.world.checkIn(
        impostor,
        {{"PURGE", false}, {"PERIODIC", true}, {"SPACEKEEP_NOTIFICATIONS", Array{"news"}}});
    EXPECT_EQ(call->wait(), std::nullopt);
    EXPECT_EQ(call->state(), CallState::kAnswered);
    EXPECT_EQ(std::get<ipc::OptionalString>(call->answer()[1]), std::nullopt);
    EXPECT_EQ(world.services(), before);
    const auto record = world.services().at("declared");
    EXPECT_TRUE(record->doesPurge());
    EXPECT_FALSE(record->doesPeriodic());
    EXPECT_EQ(record->desiredNotifications(), std::nullopt);
    EXPECT_EQ(record->connection, nullptr);
    EXPECT_TRUE(impostor->calls().empty());
    EXPECT_TRUE(world.world.trace().linesOfLevel(kLogProblem).empty());
  });
}

TEST(CheckIn, UnderAnIdOfADescriptorIsAnsweredWithNothingAlsoWithoutTheEntitlement) {
  inEverySchedule(kSchedules, [] {
    DaemonWorld world;
    world.world.declareService("declared", {});
    world.start();
    const std::size_t lines_before = world.world.trace().linesOfLevel(kLogTrace).size();
    const auto impostor = world.world.addService("declared");
    const auto call =
        world.world.call(world.world.client("nobody"), "clientCheckin",
                         {std::string("declared"), world.world.endpointOf(impostor), kPurges});
    EXPECT_EQ(call->wait(), std::nullopt);
    ASSERT_EQ(call->state(), CallState::kAnswered);
    EXPECT_EQ(std::get<ipc::OptionalString>(call->answer()[1]), std::nullopt);
    EXPECT_TRUE(world.world.trace().linesOfLevel(kLogProblem).empty());
    EXPECT_EQ(world.world.trace().linesOfLevel(kLogTrace).size(), lines_before);
  });
}

TEST(CheckIn, WithoutTheServiceEntitlementIsNeverAnswered) {
  inEverySchedule(kSchedules, [] {
    DaemonWorld world;
    world.start();
    const auto cache = world.world.addService("cache");
    const auto call =
        world.world.call(world.world.client("nobody"), "clientCheckin",
                         {std::string("cache"), world.world.endpointOf(cache), kPurges});
    EXPECT_EQ(call->wait(), std::nullopt);
    EXPECT_EQ(call->state(), CallState::kDropped);
    EXPECT_TRUE(world.services().empty());
    EXPECT_TRUE(cache->calls().empty());
    EXPECT_EQ(world.world.trace().linesOfLevel(kLogProblem),
              std::vector<std::string>{"clientCheckin Connection is not entitled!"});
  });
}

TEST(CheckIn, TheSecondOneChangesTheFlagsAndKeepsTheFirstConnection) {
  inEverySchedule(kSchedules, [] {
    DaemonWorld world;
    world.start();
    const auto cache = world.world.addService("cache");
    world.world.checkIn(cache, {{"PURGE", true}, {"PERIODIC", true}})->wait();
    const auto record = world.services().at("cache");
    const auto connection = record->connection;
    const auto endpoint = record->endpoint();
    const auto call = world.world.checkIn(cache, {{"PURGE", false}});
    EXPECT_EQ(call->wait(), (Dictionary{{"SPACEKEEP_ID", "cache"}, {"ANON", true}}));
    EXPECT_EQ(world.services().at("cache"), record);
    EXPECT_FALSE(record->doesPurge());
    EXPECT_FALSE(record->doesPeriodic());
    EXPECT_EQ(record->connection, connection);
    EXPECT_EQ(record->endpoint(), endpoint);
    EXPECT_EQ(world.world.connector().connectionsMade(), 1U);
    EXPECT_EQ(cache->callCount("servicePing"), 1U);
    EXPECT_TRUE(world.world.trace().hasLine("clientCheckin operating on an existing service"));
  });
}

TEST(CheckIn, WithoutNotificationsClearsThem) {
  inEverySchedule(kSchedules, [] {
    DaemonWorld world;
    world.start();
    const auto cache = world.world.addService("cache");
    world.world.checkIn(cache, {{"SPACEKEEP_NOTIFICATIONS", Array{"news"}}})->wait();
    EXPECT_TRUE(world.services().at("cache")->desires("news"));
    world.world.checkIn(cache, kPurges)->wait();
    EXPECT_EQ(world.services().at("cache")->desiredNotifications(), std::nullopt);
  });
}

TEST(CheckIn, AServiceThatClosesItsConnectionIsRemovedAndMayComeBack) {
  inEverySchedule(kSchedules, [] {
    DaemonWorld world;
    world.start();
    const auto cache = world.world.addService("cache");
    world.world.checkIn(cache, kPurges)->wait();
    const auto first = world.services().at("cache");
    cache->closeConnections();
    EXPECT_TRUE(world.eventually([&] { return world.services().empty(); }));
    EXPECT_TRUE(world.world.trace().hasLine("clientCheckin invalidationHandler ENTRY"));
    world.world.checkIn(cache, kPurges)->wait();
    EXPECT_NE(world.services().at("cache"), first);
    EXPECT_EQ(cache->callCount("servicePing"), 2U);
    EXPECT_EQ(world.world.connector().connectionsMade(), 2U);
  });
}

TEST(CheckIn, AServiceWhoseProcessDiesIsRemovedAndMayComeBack) {
  inEverySchedule(kSchedules, [] {
    DaemonWorld world;
    world.start();
    const auto cache = world.world.addService("cache");
    world.world.checkIn(cache, kPurges)->wait();
    const auto first = world.services().at("cache");
    cache->die();
    EXPECT_TRUE(world.eventually([&] { return world.services().empty(); }));
    EXPECT_TRUE(world.world.trace().hasLine("clientCheckin interruptionHandler ENTRY"));
    cache->start();
    EXPECT_EQ(world.world.checkIn(cache, kPurges)->wait(),
              (Dictionary{{"SPACEKEEP_ID", "cache"}, {"ANON", true}}));
    const auto second = world.services().at("cache");
    EXPECT_NE(second, first);
    EXPECT_NE(second->connection, first->connection);
    EXPECT_EQ(cache->callCount("servicePing"), 2U);
  });
}

TEST(CheckIn, TheEndOfAnOldConnectionLeavesANewerRecordAlone) {
  inEverySchedule(kSchedules, [] {
    DaemonWorld world;
    world.start();
    const auto cache = world.world.addService("cache");
    world.world.checkIn(cache, kPurges)->wait();
    const auto older = world.services().at("cache");
    const auto newer = std::make_shared<SKService>("cache");
    world.daemon->collection_queue()->sync([&] { world.daemon->setServices({{"cache", newer}}); });
    cache->closeConnections();
    EXPECT_TRUE(world.eventually(
        [&] { return world.world.trace().hasLine("clientCheckin invalidationHandler ENTRY"); }));
    rt::sleepNs(1'000'000'000);  // time enough for a removal that must not come
    EXPECT_EQ(world.services().at("cache"), newer);
  });
}

TEST(CheckIn, BeyondTheMostServicesANewOneIsRefusedWithAnErrorAndAKnownOneIsNot) {
  inEverySchedule(5, [] {
    DaemonWorld world;
    world.start();
    const auto known = world.world.addService("known");
    world.world.checkIn(known, kPurges)->wait();
    world.daemon->collection_queue()->sync([&] {
      ServiceMap many = world.daemon->services();
      for (std::size_t i = 0; many.size() < kMaxRegisteredServices; ++i) {
        const std::string service_id = "filler " + std::to_string(i);
        many[service_id] = std::make_shared<SKService>(service_id);
      }
      world.daemon->setServices(std::move(many));
    });
    const auto late = world.world.addService("late");
    const auto refused = world.world.checkIn(late, kPurges);
    EXPECT_EQ(refused->wait(), std::nullopt);
    EXPECT_EQ(std::get<ipc::OptionalString>(refused->answer()[1]),
              "4096 services are registered, try again later");
    EXPECT_TRUE(late->calls().empty());
    EXPECT_TRUE(world.world.trace().hasLine(
        "clientCheckin refusing late, 4096 services are registered, try again later"));
    EXPECT_TRUE(world.world.checkIn(known, kPurges)->wait().has_value());
  });
}

TEST(CheckIn, TwoServicesAtOnceAreBothRegistered) {
  inEverySchedule(kSchedules, [] {
    DaemonWorld world;
    world.start();
    const auto a = world.world.checkIn(world.world.addService("a"), kPurges);
    const auto b = world.world.checkIn(world.world.addService("b"), kPurges);
    a->wait();
    b->wait();
    EXPECT_EQ(world.services().size(), 2U);
  });
}

}  // namespace
}  // namespace spacekeep::test
