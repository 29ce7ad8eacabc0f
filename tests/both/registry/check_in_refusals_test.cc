// Check-ins whose endpoint or ID cannot be used: what the daemon says of it comes after everything that
// it says without looking at them.
#include <gtest/gtest.h>

#include "tests/both/daemon/daemon_world.h"
#include "tests/helpers/schedules.h"

namespace spacekeep::test {
namespace {

using CallState = sim::ClientCall::State;

const Dictionary kPurges{{"PURGE", true}};

ipc::SharedDescriptor useless() {
  return std::make_shared<ipc::Descriptor>(std::string("it is not connected"));
}

std::shared_ptr<sim::ClientCall> checkInWithAUselessEndpoint(DaemonWorld& world,
                                                             const std::string& service_id,
                                                             const Dictionary& info = kPurges) {
  return world.world.call(world.world.client("service", {"SERVICE_ENTITLEMENT"}), "clientCheckin",
                          {service_id, useless(), info});
}

std::optional<std::string> errorOf(const sim::ClientCall& call) {
  return std::get<ipc::OptionalString>(call.answer()[1]);
}

TEST(UselessEndpoint, OfANewServiceIsAnsweredWithTheReasonAndLogged) {
  inEverySchedule(kSchedules, [] {
    DaemonWorld world;
    world.start();
    const auto call = checkInWithAUselessEndpoint(world, "cache");
    EXPECT_EQ(call->wait(), std::nullopt);
    EXPECT_EQ(errorOf(*call), "its endpoint cannot be used: it is not connected");
    EXPECT_TRUE(world.services().empty());
    EXPECT_EQ(
        world.world.trace().linesOfLevel(kLogProblem),
        std::vector<std::string>{
            "clientCheckin refusing cache, its endpoint cannot be used: it is not connected"});
  });
}

TEST(UselessEndpoint, UnderAnIdOfADescriptorIsAnsweredWithNeitherResultNorError) {
  inEverySchedule(kSchedules, [] {
    DaemonWorld world;
    world.world.declareService("declared", {});
    world.start();
    const auto call = checkInWithAUselessEndpoint(world, "declared");
    EXPECT_EQ(call->wait(), std::nullopt);
    EXPECT_EQ(call->state(), CallState::kAnswered);
    EXPECT_EQ(errorOf(*call), std::nullopt);
    EXPECT_TRUE(world.world.trace().linesOfLevel(kLogProblem).empty());
  });
}

TEST(UselessEndpoint, OfACallerWithoutTheEntitlementIsNeverAnswered) {
  inEverySchedule(kSchedules, [] {
    DaemonWorld world;
    world.start();
    const auto call = world.world.call(world.world.client("nobody"), "clientCheckin",
                                       {std::string("cache"), useless(), kPurges});
    EXPECT_EQ(call->wait(), std::nullopt);
    EXPECT_EQ(call->state(), CallState::kDropped);
    EXPECT_EQ(world.world.trace().linesOfLevel(kLogProblem),
              std::vector<std::string>{"clientCheckin Connection is not entitled!"});
  });
}

TEST(UselessEndpoint, OfARegisteredServiceIsIgnoredAndTheFlagsChange) {
  inEverySchedule(kSchedules, [] {
    DaemonWorld world;
    world.start();
    const auto cache = world.world.addService("cache");
    world.world.checkIn(cache, kPurges)->wait();
    const auto record = world.services().at("cache");
    const auto call = checkInWithAUselessEndpoint(world, "cache", {{"PURGE", false}});
    EXPECT_EQ(call->wait(), (Dictionary{{"SPACEKEEP_ID", "cache"}, {"ANON", true}}));
    EXPECT_EQ(world.services().at("cache"), record);
    EXPECT_FALSE(record->doesPurge());
  });
}

TEST(ServiceId, OfMoreThanTheMostBytesIsRefusedAndOfExactlyThemTaken) {
  inEverySchedule(kSchedules, [] {
    DaemonWorld world;
    world.start();
    const auto longest = world.world.addService(std::string(255, 'a'));
    EXPECT_NE(world.world.checkIn(longest, kPurges)->wait(), std::nullopt);
    const auto longer = world.world.addService(std::string(256, 'a'));
    const auto call = world.world.checkIn(longer, kPurges);
    EXPECT_EQ(call->wait(), std::nullopt);
    EXPECT_EQ(errorOf(*call), "its ID has 256 bytes, more than 255");
    EXPECT_EQ(world.services().size(), 1U);
  });
}

}  // namespace
}  // namespace spacekeep::test
