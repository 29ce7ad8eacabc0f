// The daemon's own part of the state: a record that is seen at once and written late.
#include <gtest/gtest.h>

#include "tests/both/client/state_world.h"
#include "tests/helpers/schedules.h"

namespace spacekeep::test {
namespace {

constexpr const char* kKey = "SPACEKEEP_RECENT_SERVICE_STATS";

TEST(LateState, ARecordComesBackEqualWhileClientsGetItsArchive) {
  inEverySchedule(kSchedules, [] {
    StateWorld world;
    world.start();
    const SpacekeepRecentInfo record = recordOf("/", "cache", 5);
    world.setSync(shared(record), kKey);
    EXPECT_EQ(world.record(), record);
    const auto bytes = world.get(kKey);
    ASSERT_TRUE(bytes.has_value());
    ASSERT_NE(bytes->data(), nullptr);
    EXPECT_EQ(*bytes->data(), archivedRecentInfo(record));
    EXPECT_EQ(recentInfoFromArchive(*bytes->data()), record);
    // Being read as bytes has not changed what the daemon reads.
    EXPECT_EQ(world.record(), record);
  });
}

TEST(LateState, AReadOfARecordThatIsNewerThanItsBytesIsTracedAsAnyOtherRead) {
  inEverySchedule(kSchedules, [] {
    StateWorld world;
    world.start();
    const SpacekeepRecentInfo record = recordOf("/", "cache", 5);
    world.setSync(shared(record), kKey);
    const auto reads = [&] { return world.world.trace().linesWithFormat("%s EXIT").size(); };
    const std::size_t before = reads();
    EXPECT_EQ(world.record(), record);
    EXPECT_EQ(reads() - before, 2U);  // _clientGetState and clientGetStateSync
  });
}

TEST(LateState, TheBytesThatClientsGetAreCurrentAtOnceAlsoInTheWholeState) {
  inEverySchedule(kSchedules, [] {
    StateWorld world;
    world.start();
    for (const int amount : {5, 6}) {
      const SpacekeepRecentInfo record = recordOf("/", "cache", amount);
      world.setSync(shared(record), kKey);
      const auto state = world.get("SPACEKEEP_USER_DEFAULTS");
      ASSERT_TRUE(state.has_value());
      EXPECT_EQ(*state->dictionary()->find(kKey), Value(archivedRecentInfo(record)));
      EXPECT_EQ(*state->dictionary()->find("SPACEKEEP_CACHE_ENABLED"), Value(true));
    }
  });
}

TEST(LateState, IsOnTheDiskInTheEnd) {
  inEverySchedule(kSchedules, [] {
    StateWorld world;
    world.start();
    const SpacekeepRecentInfo record = recordOf("/", "cache", 5);
    world.setSync(shared(record), kKey);
    world.setSync(Value("plain"), "other");
    const Value archive = archivedRecentInfo(record);
    EXPECT_TRUE(world.eventually(
        [&] { return world.onDisk(kKey) == archive && world.onDisk("other") == Value("plain"); }));
    EXPECT_EQ(world.record(), record);
    EXPECT_EQ(world.get(kKey), archive);
    EXPECT_TRUE(world.problems().empty());
  });
}

TEST(LateState, IsThereAfterARestart) {
  inEverySchedule(kSchedules, [] {
    sim::InMemoryDisk::Contents kept;
    SpacekeepRecentInfo record;
    {
      StateWorld world;
      world.start();
      record = recordOf("/", "cache", 5);
      world.setSync(shared(record), kKey);
      EXPECT_TRUE(world.eventually([&] { return world.onDisk(kKey).has_value(); }));
      kept = world.world.disk().read(kSuite);
    }
    StateWorld world;
    world.world.disk().write(kSuite, kept);
    world.start();
    EXPECT_EQ(world.record(), record);
  });
}

TEST(LateState, AValueThatIsNoRecordIsStoredAsItIsAndSeenByClientsAtOnce) {
  inEverySchedule(kSchedules, [] {
    StateWorld world;
    world.start();
    world.setSync(Value(7), "key");
    EXPECT_EQ(world.get("key"), Value(7));
    const StateObject stored = world.getSync("key");
    ASSERT_TRUE(std::holds_alternative<Value>(stored));
    EXPECT_EQ(std::get<Value>(stored), Value(7));
  });
}

TEST(LateState, WritingNothingTakesTheKeyAway) {
  inEverySchedule(kSchedules, [] {
    StateWorld world;
    world.start();
    world.setSync(shared(recordOf("/", "cache", 5)), kKey);
    EXPECT_TRUE(world.eventually([&] { return world.onDisk(kKey).has_value(); }));
    world.setSync({}, kKey);
    EXPECT_EQ(world.record(), std::nullopt);
    EXPECT_EQ(world.get(kKey), std::nullopt);
    EXPECT_TRUE(world.eventually([&] { return !world.onDisk(kKey).has_value(); }));
  });
}

TEST(LateState, WithoutASuiteNothingIsKept) {
  inEverySchedule(kSchedules, [] {
    StateWorld world;
    world.world.disk().refuseToOpen(true);
    world.start();
    world.setSync(shared(recordOf("/", "cache", 5)), kKey);
    world.setSync(Value(7), "key");
    EXPECT_EQ(world.record(), std::nullopt);
    EXPECT_EQ(world.get(kKey), std::nullopt);
    EXPECT_TRUE(std::holds_alternative<std::monostate>(world.getSync("key")));
  });
}

TEST(LateState, EachKeyHasItsOwnRecord) {
  inEverySchedule(kSchedules, [] {
    StateWorld world;
    world.start();
    const SpacekeepRecentInfo one = recordOf("/", "cache", 1);
    const SpacekeepRecentInfo two = recordOf("/", "cache", 2);
    world.setSync(shared(one), "one");
    world.setSync(shared(two), "two");
    EXPECT_EQ(world.recordAt("one"), one);
    EXPECT_EQ(world.recordAt("two"), two);
    EXPECT_EQ(world.recordAt("one"), one);
    EXPECT_TRUE(world.eventually([&] {
      return world.onDisk("one") == Value(archivedRecentInfo(one)) &&
             world.onDisk("two") == Value(archivedRecentInfo(two));
    }));
  });
}

TEST(LateState, WhatAClientWritesUnderTheKeyOfTheRecordReplacesIt) {
  inEverySchedule(kSchedules, [] {
    StateWorld world;
    world.start();
    world.setSync(shared(recordOf("/", "cache", 5)), kKey);
    const SpacekeepRecentInfo other = recordOf("/", "other", 6);
    EXPECT_TRUE(world.set(kKey, Value(archivedRecentInfo(other))));
    EXPECT_EQ(world.record(), other);
    EXPECT_TRUE(world.set(kKey, std::nullopt));
    EXPECT_EQ(world.record(), std::nullopt);
  });
}

TEST(LateState, BytesThatAreNoArchiveCountAsAbsentAndSaySo) {
  inEverySchedule(kSchedules, [] {
    StateWorld world;
    world.start();
    EXPECT_TRUE(world.set(kKey, Value(Data{{1, 2, 3}})));
    EXPECT_TRUE(std::holds_alternative<std::monostate>(world.getSync(kKey)));
    EXPECT_EQ(world.problems(),
              std::vector<std::string>{
                  "clientGetStateSync the bytes of SPACEKEEP_RECENT_SERVICE_STATS are not an "
                  "archive of this version and count as absent"});
    EXPECT_EQ(world.get(kKey), Value(Data{{1, 2, 3}}));
  });
}

TEST(LateState, ASynchronousGetTracesItsWay) {
  inEverySchedule(kSchedules, [] {
    StateWorld world;
    world.putOnDisk(Dictionary{{"key", 1}});
    world.start();
    const auto before = static_cast<std::ptrdiff_t>(world.traces().size());
    static_cast<void>(world.getSync("key"));
    const auto traces = world.traces();
    EXPECT_EQ(std::vector<std::string>(traces.begin() + before, traces.end()),
              (std::vector<std::string>{"clientGetStateSync ENTRY", "clientGetStateSync 622",
                                        "_clientGetState ENTRY", "_clientGetState EXIT",
                                        "clientGetStateSync EXIT"}));
  });
}

TEST(LateState, ASynchronousSetOfWhetherToCacheTellsTheServicesToo) {
  inEverySchedule(kSchedules, [] {
    StateWorld world;
    const auto wants = world.world.declareService(
        "wants", {}, {{"SPACEKEEP_NOTIFICATIONS", Array{"SPACEKEEP_CACHE_ENABLED"}}});
    world.start();
    world.setSync(Value(false), "SPACEKEEP_CACHE_ENABLED");
    EXPECT_TRUE(world.eventually([&] { return wants->callCount("serviceNotify") == 1; }));
  });
}

TEST(LateState, AWriteThatFailsIsAProblemAndMadeUpForWithTheNextOne) {
  inEverySchedule(kSchedules, [] {
    StateWorld world;
    world.start();
    const SpacekeepRecentInfo record = recordOf("/", "cache", 5);
    world.setSync(shared(record), kKey);
    world.world.disk().failSynchronize("the disk is full");
    const std::string line = "writeNow recent statistics are not on the disk: the disk is full";
    EXPECT_TRUE(world.eventually([&] { return world.world.trace().hasLine(line); }));
    world.world.disk().failSynchronize("");
    EXPECT_EQ(world.record(), record);
    EXPECT_FALSE(world.onDisk(kKey).has_value());
    EXPECT_TRUE(world.set("key", Value(1)));
    EXPECT_TRUE(world.eventually([&] { return world.world.disk().writes() == 2; }));
    EXPECT_EQ(world.onDisk(kKey), Value(archivedRecentInfo(record)));
    EXPECT_EQ(world.onDisk("key"), Value(1));
  });
}

TEST(LateState, AClientsSetInBetweenLosesNothingOfIt) {
  inEverySchedule(kSchedules, [] {
    StateWorld world;
    world.start();
    const SpacekeepRecentInfo record = recordOf("/", "cache", 5);
    world.setSync(shared(record), kKey);
    EXPECT_TRUE(world.set("key", Value(1)));
    EXPECT_EQ(world.record(), record);
    EXPECT_TRUE(world.eventually([&] { return world.onDisk(kKey).has_value(); }));
    EXPECT_EQ(world.onDisk("key"), Value(1));
  });
}

TEST(LateState, WhatOthersPutOnTheDiskAfterAWriteThatFailedIsSeenAndKept) {
  inEverySchedule(kSchedules, [] {
    StateWorld world;
    world.start();
    world.world.disk().failSynchronize("the disk is full");
    const SpacekeepRecentInfo record = recordOf("/", "cache", 5);
    world.setSync(shared(record), kKey);
    EXPECT_TRUE(world.eventually(
        [&] { return world.lines("%s recent statistics are not on the disk: %@") == 1; }));
    world.world.disk().failSynchronize("");
    world.putOnDisk(Dictionary{{"theirs", 1}});
    EXPECT_EQ(world.get("theirs"), Value(1));
    EXPECT_TRUE(world.set("key", Value(1)));
    EXPECT_EQ(world.onDisk("theirs"), Value(1));
    EXPECT_EQ(world.record(), record);
  });
}

TEST(LateState, WithNothingElseStoredItMakesTheState) {
  inEverySchedule(kSchedules, [] {
    StateWorld world;
    world.putOnDisk("no dictionary");
    world.start();
    world.setSync(Value("late"), "plain");
    EXPECT_EQ(world.get("plain"), Value("late"));
    EXPECT_EQ(world.get("SPACEKEEP_CACHE_ENABLED"), Value(true));
    EXPECT_TRUE(world.eventually([&] { return world.world.disk().writes() == 2; }));
    EXPECT_EQ(world.stateOnDisk(), Value(Dictionary{{"plain", "late"}}));
    EXPECT_TRUE(world.problems().empty());
  });
}

TEST(LateState, OlderBytesThatAClientPutsBackAreTheRecordThatTheyWere) {
  inEverySchedule(kSchedules, [] {
    StateWorld world;
    world.start();
    const SpacekeepRecentInfo older = recordOf("/", "cache", 5);
    world.setSync(shared(older), kKey);
    EXPECT_TRUE(world.eventually([&] { return world.onDisk(kKey).has_value(); }));
    const auto bytes = world.get(kKey);
    // The store's own object changes and is stored again.
    world.daemon->defaults_queue()->sync([&] {
      const auto record = std::get<StateWorld::Record>(world.daemon->clientGetStateSync(kKey));
      record->update("/", "another", {.amount = 6, .timestamp = recentDate(0)}, 0);
      world.daemon->clientSetStateSync(record, kKey);
    });
    EXPECT_NE(world.record(), older);
    EXPECT_TRUE(world.set(kKey, bytes));
    EXPECT_EQ(world.record(), older);
  });
}

TEST(LateState, AReadOfARecordOnTheDiskIsTheSameObjectWhileNobodyElseHasChangedIt) {
  inEverySchedule(kSchedules, [] {
    StateWorld world;
    world.start();
    const auto record = shared(recordOf("/", "cache", 5));
    world.setSync(record, kKey);
    EXPECT_TRUE(world.eventually([&] { return world.onDisk(kKey).has_value(); }));
    EXPECT_EQ(world.getSync(kKey), StateObject(record));
    const SpacekeepRecentInfo other = recordOf("/", "other", 6);
    world.putOnDisk(Dictionary{{kKey, archivedRecentInfo(other)}});
    EXPECT_EQ(world.record(), other);
    EXPECT_EQ(world.getSync(kKey), world.getSync(kKey));
  });
}

}  // namespace
}  // namespace spacekeep::test
