// When the client state cannot be stored, and who may touch it.
#include <gtest/gtest.h>

#include "tests/both/client/state_world.h"
#include "tests/helpers/schedules.h"

namespace spacekeep::test {
namespace {

using CallState = sim::ClientCall::State;

TEST(StateFailure, ASetThatIsNotOnTheDiskIsAnErrorAndTheOldValueStaysAlsoAfterALaterSet) {
  inEverySchedule(kSchedules, [] {
    StateWorld world;
    world.start();
    EXPECT_TRUE(world.set("key", Value("old")));
    world.world.disk().failSynchronize("the disk is full");
    const auto refused = world.setAsClient("key", Value("new"));
    EXPECT_EQ(refused->state(), CallState::kFailed);
    EXPECT_EQ(refused->error(), "the disk is full");
    EXPECT_EQ(refused->answers(), 0U);
    EXPECT_TRUE(
        world.world.trace().hasLine("_clientSetState key is not on the disk: the disk is full"));
    world.world.disk().failSynchronize("");
    EXPECT_EQ(world.get("key"), Value("old"));
    EXPECT_TRUE(world.set("another", Value(1)));
    EXPECT_EQ(world.get("key"), Value("old"));
    EXPECT_EQ(world.stateOnDisk(), Value(Dictionary{{"another", 1}, {"key", "old"}}));
  });
}

TEST(StateFailure, AFirstSetThatFailsLeavesNoState) {
  inEverySchedule(kSchedules, [] {
    StateWorld world;
    world.start();
    world.world.disk().failSynchronize("the disk is full");
    EXPECT_FALSE(world.set("key", Value("new")));
    world.world.disk().failSynchronize("");
    EXPECT_EQ(world.get("key"), std::nullopt);
    EXPECT_TRUE(world.set("another", Value(1)));
    EXPECT_EQ(world.stateOnDisk(), Value(Dictionary{{"another", 1}}));
  });
}

TEST(StateFailure, AValueThatCannotBeTakenAwayStays) {
  inEverySchedule(kSchedules, [] {
    StateWorld world;
    world.start();
    EXPECT_TRUE(world.set("key", Value("old")));
    world.world.disk().failSynchronize("the disk is full");
    EXPECT_FALSE(world.set("key", std::nullopt));
    world.world.disk().failSynchronize("");
    EXPECT_EQ(world.get("key"), Value("old"));
    EXPECT_EQ(world.onDisk("key"), Value("old"));
  });
}

TEST(StateFailure, TellsNobodyAndSetsNothingInTheDaemon) {
  inEverySchedule(kSchedules, [] {
    StateWorld world;
    const auto wants = world.world.declareService(
        "wants", {}, {{"SPACEKEEP_NOTIFICATIONS", Array{"SPACEKEEP_CACHE_ENABLED"}}});
    world.start();
    world.world.disk().failSynchronize("the disk is full");
    EXPECT_FALSE(world.set("SPACEKEEP_CACHE_ENABLED", Value(false)));
    EXPECT_FALSE(world.set(kLowSpaceBytesKey, Value(kLeastLowSpaceBytes)));
    world.world.shutDown();
    EXPECT_TRUE(wants->calls().empty());
    EXPECT_EQ(world.world.volumes().lowSpaceSettings(), LowSpaceSettings());
  });
}

TEST(StateFailure, WithoutAHandlerForItTheReplyRunsAllTheSame) {
  inEverySchedule(kSchedules, [] {
    StateWorld world;
    world.start();
    world.world.disk().failSynchronize("the disk is full");
    unsigned replies = 0;
    world.daemon->defaults_queue()->sync(
        [&] { world.daemon->_clientSetState(Value(1), "key", [&] { ++replies; }); });
    EXPECT_EQ(replies, 1U);
  });
}

TEST(StateFailure, WithoutASuiteSetsFailAndGetsAnswerTheDefaults) {
  inEverySchedule(kSchedules, [] {
    StateWorld world;
    world.world.disk().refuseToOpen(true);
    world.start();
    const auto refused = world.setAsClient("key", Value(1));
    EXPECT_EQ(refused->state(), CallState::kFailed);
    EXPECT_EQ(refused->error(), "there is no preferences suite");
    EXPECT_EQ(world.get("key"), std::nullopt);
    EXPECT_EQ(world.get("SPACEKEEP_CACHE_ENABLED"), Value(true));
    world.setSync(Value(1), "key");
    EXPECT_TRUE(std::holds_alternative<std::monostate>(world.getSync("key")));
  });
}

TEST(StateFailure, ASetOfTheDaemonsRecordThatFailsLeavesTheRecord) {
  inEverySchedule(kSchedules, [] {
    StateWorld world;
    world.start();
    const SpacekeepRecentInfo record = recordOf("/", "cache", 5);
    world.setSync(shared(record), keys::kRecentServiceStats);
    world.world.disk().failSynchronize("the disk is full");
    EXPECT_FALSE(world.set(keys::kRecentServiceStats, Value("mine now")));
    world.world.disk().failSynchronize("");
    EXPECT_EQ(world.record(), record);
  });
}

class StateDeathTest : public ::testing::Test {
 protected:
  void SetUp() override { GTEST_FLAG_SET(death_test_style, "threadsafe"); }

  static void inAStartedDaemon(const std::function<void(Spacekeep&)>& act) {
    inEverySchedule(1, [&] {
      StateWorld world;
      world.start();
      act(*world.daemon);
    });
  }
};

constexpr const char* kQueueText = " must run on queue com.quorvel.spacekeep_defaults";

TEST_F(StateDeathTest, ASetOffItsQueueEndsTheProcess) {
  EXPECT_DEATH(
      inAStartedDaemon([](Spacekeep& daemon) { daemon._clientSetState(Value(1), "key", [] {}); }),
      std::string("_clientSetState") + kQueueText);
}

TEST_F(StateDeathTest, AGetOffItsQueueEndsTheProcess) {
  EXPECT_DEATH(inAStartedDaemon([](Spacekeep& daemon) {
                 daemon._clientGetState(Value("key"), [](const ipc::OptionalValue&) {});
               }),
               std::string("_clientGetState") + kQueueText);
}

TEST_F(StateDeathTest, ASynchronousSetOffItsQueueEndsTheProcess) {
  EXPECT_DEATH(
      inAStartedDaemon([](Spacekeep& daemon) { daemon.clientSetStateSync(Value(1), "key"); }),
      std::string("clientSetStateSync") + kQueueText);
}

TEST_F(StateDeathTest, ASynchronousGetOffItsQueueEndsTheProcess) {
  EXPECT_DEATH(inAStartedDaemon(
                   [](Spacekeep& daemon) { static_cast<void>(daemon.clientGetStateSync("key")); }),
               std::string("clientGetStateSync") + kQueueText);
}

TEST_F(StateDeathTest, AGetOnAnotherQueueOfTheDaemonEndsTheProcess) {
  EXPECT_DEATH(inAStartedDaemon([](Spacekeep& daemon) {
                 daemon.collection_queue()->sync(
                     [&] { static_cast<void>(daemon.clientGetStateSync("key")); });
               }),
               std::string("clientGetStateSync") + kQueueText);
}

}  // namespace
}  // namespace spacekeep::test
