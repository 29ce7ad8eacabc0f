// Simulated connections deliver, fail and end as real ones do.
#include <gtest/gtest.h>

#include "tests/helpers/schedules.h"
#include "tests/simulated/sim/service_line.h"

namespace spacekeep::sim {
namespace {

constexpr unsigned kSchedules = 20;

TEST(SimulatedConnection, FailsACallBeforeTheServiceSeesIt) {
  inEverySchedule(kSchedules, [] {
    Line line(owning(500, {.answer = Answer::kFailsBeforeCall}));
    line.purge(10);
    ASSERT_TRUE(comes(line.failed));
    ASSERT_TRUE(comes(line.invalidated));
    EXPECT_TRUE(line.service->calls().empty());
    EXPECT_EQ(line.interrupted.waitForNs(kSecond), WaitResult::kTimedOut);
    EXPECT_EQ(line.replied.waitForNs(kSecond), WaitResult::kTimedOut);
  });
}

TEST(SimulatedConnection, FailsACallAfterTheServiceDidTheWork) {
  inEverySchedule(kSchedules, [] {
    Line line(owning(500, {.answer = Answer::kFailsDuringCall,
                           .delay_ns = kSecond,
                           .end = ConnectionEnd::kInterrupted}));
    line.purge(10);
    ASSERT_TRUE(comes(line.failed));
    ASSERT_TRUE(comes(line.interrupted));
    EXPECT_EQ(line.world.volumes().freeBytes("/"), 110U);
    EXPECT_EQ(line.service->calls().front().state, RecordedCall::State::kFailed);
  });
}

TEST(SimulatedConnection, EveryPendingCallFailsOnceWhenTheProcessDies) {
  inEverySchedule(kSchedules, [] {
    Line line(owning(500, {.answer = Answer::kNever}));
    line.purge(10, 1, "one");
    line.purge(10, 1, "two");
    ASSERT_TRUE(line.world.eventually([&] { return line.service->calls().size() == 2; }));
    line.service->die();
    ASSERT_TRUE(comes(line.failed));
    ASSERT_TRUE(comes(line.failed));
    ASSERT_TRUE(comes(line.interrupted));
    EXPECT_EQ(line.failed.waitForNs(kSecond), WaitResult::kTimedOut);
  });
}

TEST(SimulatedConnection, ACallAfterTheEndFails) {
  inEverySchedule(kSchedules, [] {
    Line line(ownsBytes("/", 500));
    line.connection->invalidate();
    line.connection->invalidate();
    ASSERT_TRUE(comes(line.invalidated));
    line.purge(10);
    ASSERT_TRUE(comes(line.failed));
    EXPECT_EQ(line.invalidated.waitForNs(kSecond), WaitResult::kTimedOut);
  });
}

TEST(SimulatedConnection, CallsMadeBeforeResumeAreHeldAndKeepTheirOrder) {
  inEverySchedule(kSchedules, [] {
    World world;
    const auto service = world.addService("cache");
    const auto connection = world.connector().connectionFromEndpoint(world.endpointOf(service));
    connection->setRemoteInterface(spacekeepServiceInterface());
    const SpacekeepServiceProtocol proxy(connection->remoteProxy({}));
    CountingSemaphore replied(0);
    proxy.servicePing([&] { replied.signal(); });
    proxy.serviceNotify({{"name", 1}}, [&] { replied.signal(); });
    EXPECT_EQ(replied.waitForNs(kSecond), WaitResult::kTimedOut);
    connection->resume();
    ASSERT_TRUE(comes(replied));
    ASSERT_TRUE(comes(replied));
    ASSERT_EQ(service->calls().size(), 2U);
    EXPECT_EQ(service->calls()[0].member, "servicePing");
    EXPECT_EQ(service->calls()[1].member, "serviceNotify");
    world.shutDown();
  });
}

TEST(SimulatedConnection, WrongArgumentsAndUnknownMembersFailTheCallAlone) {
  inEverySchedule(kSchedules, [] {
    Line line(ownsBytes("/", 500));
    line.proxy->call("servicePurge", {std::string("text")}, {});
    ASSERT_TRUE(comes(line.failed));
    line.proxy->call("serviceDance", {}, {});
    ASSERT_TRUE(comes(line.failed));
    line.purge(10);
    EXPECT_TRUE(comes(line.replied));
  });
}

TEST(SimulatedConnector, AnUnknownEndpointGivesAConnectionThatEnds) {
  inEverySchedule(kSchedules, [] {
    World world;
    const auto connection =
        world.connector().connectionFromEndpoint(std::make_shared<ipc::Descriptor>(-5));
    CountingSemaphore ended(0);
    connection->setInvalidationHandler([&] { ended.signal(); });
    connection->resume();
    EXPECT_TRUE(comes(ended));
    world.shutDown();
  });
}

TEST(SimulatedConnector, ADeclaredServiceHasOneConnectionUntilThatEnds) {
  inEverySchedule(kSchedules, [] {
    World world;
    const auto service = world.declareService("cache", {});
    auto& connector = world.connector();
    const auto& interface = spacekeepServiceInterface();
    const auto first = connector.connectionToDeclared("cache", interface);
    EXPECT_EQ(connector.connectionToDeclared("cache", interface), first);
    service->closeConnections();
    const auto second = connector.connectionToDeclared("cache", interface);
    EXPECT_NE(second, first);
    service->die();
    EXPECT_EQ(connector.connectionToDeclared("cache", interface), nullptr);
    service->start();
    EXPECT_NE(connector.connectionToDeclared("cache", interface), nullptr);
    EXPECT_EQ(connector.connectionToDeclared("nobody", interface), nullptr);
    world.shutDown();
  });
}

}  // namespace
}  // namespace spacekeep::sim
