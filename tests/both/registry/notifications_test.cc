// Pings and notifications.
#include <gtest/gtest.h>

#include "tests/both/daemon/daemon_world.h"
#include "tests/helpers/schedules.h"

namespace spacekeep::test {
namespace {

std::shared_ptr<sim::SimulatedService> subscriber(DaemonWorld& world, const std::string& id,
                                                  Array names,
                                                  sim::ServiceBehaviour behaviour = {}) {
  return world.world.declareService(id, std::move(behaviour),
                                    {{"SPACEKEEP_NOTIFICATIONS", std::move(names)}});
}

TEST(Ping, OfALiveServiceIsTrueAfterExactlyOneCall) {
  inEverySchedule(kSchedules, [] {
    DaemonWorld world;
    world.start();
    const auto cache = world.world.addService("cache");
    const auto connection =
        world.world.connector().connectionFromEndpoint(world.world.endpointOf(cache));
    connection->setRemoteInterface(spacekeepServiceInterface());
    connection->resume();
    EXPECT_TRUE(Spacekeep::pingService(
        SpacekeepServiceProtocol(connection->remoteProxy([](const ipc::Error&) {}))));
    EXPECT_EQ(cache->callCount("servicePing"), 1U);
    EXPECT_TRUE(world.world.trace().hasLine("pingService calling servicePing"));
    EXPECT_TRUE(world.world.trace().hasLine("pingService ping got pong"));
  });
}

TEST(Notifications, ANameThatNobodyWantsReachesNobody) {
  inEverySchedule(kSchedules, [] {
    DaemonWorld world;
    const auto other = subscriber(world, "other", {"weather"});
    const auto none = world.world.declareService("none", {});
    world.start();
    world.daemon->notifyRecipients("news", Value(1));
    // A service is called in the order of its notifications: what comes now comes last.
    world.daemon->notify_queue()->sync([] {});
    world.services().at("none")->setDesiredNotifications(Value(Array{"weather"}));
    world.daemon->notifyRecipients("weather", Value("rain"));
    for (const auto& service : {other, none}) {
      EXPECT_TRUE(world.eventually([&] { return !service->calls().empty(); }));
      const auto calls = service->calls();
      ASSERT_EQ(calls.size(), 1U);
      EXPECT_EQ(calls[0].member, "serviceNotify");
      EXPECT_EQ(calls[0].info, (Dictionary{{"weather", "rain"}}));
    }
    EXPECT_TRUE(world.world.trace().hasLine("notifyRecipients name: news, value: 1"));
    EXPECT_EQ(world.lines("%s %d serviceID: %@"), 2U);
  });
}

TEST(Notifications, AServiceThatWantsTwoNamesGetsEachByItself) {
  inEverySchedule(kSchedules, [] {
    DaemonWorld world;
    const auto both = subscriber(world, "both", {"news", "weather"});
    world.start();
    world.daemon->notifyRecipients("news", Value(true));
    world.daemon->notifyRecipients("weather", Value("rain"));
    EXPECT_TRUE(world.eventually([&] { return both->callCount("serviceNotify") == 2; }));
    std::vector<Dictionary> received;
    for (const auto& call : both->callsOf("serviceNotify")) received.push_back(call.info);
    if (received[0].contains("weather")) std::swap(received[0], received[1]);
    EXPECT_EQ(received[0], (Dictionary{{"news", true}}));
    EXPECT_EQ(received[1], (Dictionary{{"weather", "rain"}}));
    EXPECT_TRUE(world.world.trace().hasLine("notifyRecipients 155 serviceID: both"));
  });
}

TEST(Notifications, AServiceThatChecksInAfterwardsDoesNotReceiveIt) {
  inEverySchedule(kSchedules, [] {
    DaemonWorld world;
    const auto early = subscriber(world, "early", {"news"});
    world.start();
    const auto late = world.world.addService("late");
    // Not delivered before the late one is there, so that only the snapshot keeps it from it.
    world.daemon->notify_queue()->suspend();
    world.daemon->notifyRecipients("news", Value(1));
    world.world.checkIn(late, {{"SPACEKEEP_NOTIFICATIONS", Array{"news", "weather"}}})->wait();
    world.daemon->notify_queue()->resume();
    // A service is called in the order of its notifications: this one comes last.
    world.daemon->notifyRecipients("weather", Value("rain"));
    EXPECT_TRUE(world.eventually([&] {
      return early->callCount("serviceNotify") == 1 && late->callCount("serviceNotify") > 0;
    }));
    const auto received = late->callsOf("serviceNotify");
    ASSERT_EQ(received.size(), 1U);
    EXPECT_EQ(received[0].info, (Dictionary{{"weather", "rain"}}));
  });
}

TEST(Notifications, AFailingRecipientIsLoggedAndTheOthersAreReached) {
  inEverySchedule(kSchedules, [] {
    DaemonWorld world;
    sim::ServiceBehaviour failing;
    failing.notify.answer = sim::Answer::kFailsBeforeCall;
    subscriber(world, "a", {"news"}, failing);
    const auto fine = subscriber(world, "b", {"news"});
    world.start();
    world.daemon->notifyRecipients("news", Value(1));
    EXPECT_TRUE(world.eventually([&] {
      return fine->callCount("serviceNotify") == 1 &&
             world.world.trace().hasLine("notifyRecipients connection invalidated");
    }));
  });
}

}  // namespace
}  // namespace spacekeep::test
