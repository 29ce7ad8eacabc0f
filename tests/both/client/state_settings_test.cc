// What the client state tells the daemon itself.
#include "client/state_settings.h"

#include <gtest/gtest.h>

#include "tests/both/client/state_world.h"
#include "tests/helpers/schedules.h"

namespace spacekeep::test {
namespace {

constexpr const char* kFinishEarly = "SPACEKEEP_FINISH_EARLY";
constexpr const char* kBytes = "SPACEKEEP_LOW_SPACE_BYTES";
constexpr const char* kPercent = "SPACEKEEP_LOW_SPACE_PERCENT";
constexpr const char* kInodes = "SPACEKEEP_LOW_SPACE_INODES_PERCENT";

/// How many urgencies a purge of nothing waits out: none when it may finish early.
std::size_t waitsOfAPurge(StateWorld& world, Dictionary request = {}) {
  const std::size_t before = world.lines("%s timed out waiting for: %@");
  request.set(keys::kVolume, "/");
  request.set(keys::kAmount, 0);
  EXPECT_TRUE(world.daemon->purge(std::move(request), nullptr).has_value());
  return world.lines("%s timed out waiting for: %@") - before;
}

LowSpaceSettings settingsOf(StateWorld& world) {
  return world.world.volumes().lowSpaceSettings().value_or(LowSpaceSettings{.bytes = 0});
}

TEST(StateSettings, WhichKeysTheDaemonActsOn) {
  for (const char* key : {kFinishEarly, kBytes, kPercent, kInodes}) {
    EXPECT_TRUE(isSettingKey(key)) << key;
  }
  for (const char* key : {"", "key", "SPACEKEEP_CACHE_ENABLED", "SPACEKEEP_USER_DEFAULTS",
                          "SPACEKEEP_RECENT_SERVICE_STATS"}) {
    EXPECT_FALSE(isSettingKey(key)) << key;
  }
}

TEST(StateSettings, OnlyABooleanSaysWhetherPurgesFinishEarly) {
  const auto none = [](const std::string& problem) { ADD_FAILURE() << problem; };
  EXPECT_FALSE(finishEarlyFrom({}, none));
  EXPECT_FALSE(finishEarlyFrom({{kFinishEarly, false}}, none));
  EXPECT_TRUE(finishEarlyFrom({{kFinishEarly, true}}, none));
  for (const Value& value : {Value(1), Value("true"), Value(Array{true})}) {
    unsigned problems = 0;
    EXPECT_FALSE(finishEarlyFrom({{kFinishEarly, value}}, [&](const std::string&) { ++problems; }));
    EXPECT_EQ(problems, 1U);
  }
}

TEST(FinishEarlyByDefault, HoldsForPurgesThatDoNotSayFromTheSetOnUntilItIsTakenAway) {
  inEverySchedule(10, [] {
    StateWorld world;
    world.start();
    EXPECT_EQ(waitsOfAPurge(world), 3U);
    EXPECT_TRUE(world.set(kFinishEarly, Value(true)));
    EXPECT_EQ(waitsOfAPurge(world), 0U);
    EXPECT_EQ(waitsOfAPurge(world, {{kFinishEarly, false}}), 3U);
    EXPECT_TRUE(world.set(kFinishEarly, std::nullopt));
    EXPECT_EQ(waitsOfAPurge(world), 3U);
    EXPECT_EQ(waitsOfAPurge(world, {{kFinishEarly, true}}), 0U);
  });
}

TEST(FinishEarlyByDefault, IsTakenFromTheStoredStateAtStart) {
  inEverySchedule(10, [] {
    StateWorld world;
    world.putOnDisk(Dictionary{{kFinishEarly, true}});
    world.start();
    EXPECT_EQ(waitsOfAPurge(world), 0U);
    EXPECT_TRUE(world.problems().empty());
  });
}

TEST(FinishEarlyByDefault, OfAnotherKindIsAProblemAndCountsAsFalse) {
  const std::string line =
      "applySettings SPACEKEEP_FINISH_EARLY = 1 is no boolean; set it to true or false. Until "
      "then false holds.";
  inEverySchedule(10, [&] {
    StateWorld world;
    world.start();
    EXPECT_TRUE(world.set(kFinishEarly, Value(true)));
    EXPECT_TRUE(world.set(kFinishEarly, Value(1)));
    EXPECT_EQ(world.problems(), std::vector<std::string>{line});
    EXPECT_EQ(waitsOfAPurge(world), 3U);
    EXPECT_EQ(world.get(kFinishEarly), Value(1));
  });
  inEverySchedule(10, [&] {
    StateWorld world;
    world.putOnDisk(Dictionary{{kFinishEarly, 1}});
    world.start();
    EXPECT_EQ(world.problems(), std::vector<std::string>{line});
    EXPECT_EQ(waitsOfAPurge(world), 3U);
  });
}

TEST(LowSpaceState, WithoutAnyOfTheKeysTheDefaultsHold) {
  inEverySchedule(kSchedules, [] {
    StateWorld world;
    world.start();
    EXPECT_EQ(settingsOf(world), LowSpaceSettings());
    EXPECT_TRUE(world.problems().empty());
  });
}

TEST(LowSpaceState, IsSetAndTakenBackKeyByKey) {
  inEverySchedule(kSchedules, [] {
    StateWorld world;
    world.start();
    EXPECT_TRUE(world.set(kBytes, Value(kLeastLowSpaceBytes)));
    EXPECT_EQ(settingsOf(world), LowSpaceSettings{.bytes = kLeastLowSpaceBytes});
    EXPECT_TRUE(world.set(kPercent, Value(2.5)));
    EXPECT_TRUE(world.set(kInodes, Value(0)));
    EXPECT_EQ(
        settingsOf(world),
        (LowSpaceSettings{.bytes = kLeastLowSpaceBytes, .percent = 2.5, .inodes_percent = 0}));
    EXPECT_TRUE(world.set(kBytes, std::nullopt));
    EXPECT_EQ(settingsOf(world), (LowSpaceSettings{.percent = 2.5, .inodes_percent = 0}));
    EXPECT_TRUE(world.problems().empty());
  });
}

TEST(LowSpaceState, IsTakenFromTheStoredStateAtStart) {
  inEverySchedule(kSchedules, [] {
    StateWorld world;
    world.putOnDisk(Dictionary{{kBytes, kMostLowSpaceBytes}, {kPercent, 50}});
    world.start();
    EXPECT_EQ(settingsOf(world), (LowSpaceSettings{.bytes = kMostLowSpaceBytes, .percent = 50}));
  });
}

TEST(LowSpaceState, ABadValueIsAProblemAndTheDefaultHoldsForItsKeyAlone) {
  struct Case {
    const char* key;
    Value value;
    std::string line;
  };
  const std::string bytes_range =
      ", but must be a number of bytes from 1048576 to 1152921504606846976; the default, "
      "524288000, holds instead";
  const std::string percent_range = ", but must be a number from 0 to 50 (percent); the default, 5";
  const Case cases[] = {
      {kBytes, "lots", "applySettings SPACEKEEP_LOW_SPACE_BYTES is \"lots\"" + bytes_range},
      {kBytes, 1048575, "applySettings SPACEKEEP_LOW_SPACE_BYTES is 1048575" + bytes_range},
      {kPercent, 51, "applySettings SPACEKEEP_LOW_SPACE_PERCENT is 51" + percent_range},
      {kInodes, true, "applySettings SPACEKEEP_LOW_SPACE_INODES_PERCENT is true" + percent_range}};
  for (const Case& each : cases) {
    inEverySchedule(4, [&] {
      StateWorld world;
      world.start();
      EXPECT_TRUE(world.set(each.key, each.value));
      const auto problems = world.problems();
      ASSERT_EQ(problems.size(), 1U);
      EXPECT_EQ(problems[0].substr(0, each.line.size()), each.line);
      EXPECT_EQ(settingsOf(world), LowSpaceSettings());
      EXPECT_EQ(world.get(each.key), each.value);
    });
  }
}

TEST(LowSpaceState, ABadValueInTheStoredStateIsAProblemAtStartAndTheOthersHold) {
  inEverySchedule(kSchedules, [] {
    StateWorld world;
    world.putOnDisk(Dictionary{{kBytes, "lots"}, {kPercent, 3}});
    world.start();
    EXPECT_EQ(world.problems().size(), 1U);
    EXPECT_EQ(settingsOf(world), LowSpaceSettings{.percent = 3});
  });
}

TEST(LowSpaceState, ABadValueIsNotComplainedOfAgainWhenOtherKeysAreSet) {
  inEverySchedule(kSchedules, [] {
    StateWorld world;
    world.start();
    EXPECT_TRUE(world.set(kBytes, Value("lots")));
    EXPECT_TRUE(world.set("key", Value(1)));
    EXPECT_EQ(world.problems().size(), 1U);
  });
}

TEST(LowSpaceState, AStoredStateThatIsNoDictionaryLeavesTheDefaults) {
  inEverySchedule(kSchedules, [] {
    StateWorld world;
    world.putOnDisk("no dictionary");
    world.start();
    EXPECT_EQ(settingsOf(world), LowSpaceSettings());
  });
}

}  // namespace
}  // namespace spacekeep::test
