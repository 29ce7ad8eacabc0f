// Volumes, files, preferences, statistics, events, and the world that holds them.
#include <gtest/gtest.h>

#include "daemon/spacekeep.h"
#include "sim/world/world.h"
#include "support/logging/log.h"
#include "support/values/plist.h"
#include "tests/helpers/schedules.h"

namespace spacekeep::sim {
namespace {

constexpr std::uint64_t kSecond = 1'000'000'000;
constexpr unsigned kSchedules = 20;

TEST(SimulatedVolumes, SpaceNeverLeavesTheBoundsOfTheVolume) {
  inEverySchedule(1, [] {
    World world;
    SimulatedVolumes& volumes = world.volumes();
    volumes.add("/", 1'000, 400);
    EXPECT_EQ(volumes.write("/", 500), 400U);
    EXPECT_EQ(volumes.freeBytes("/"), 0U);
    volumes.giveBack("/", 5'000);
    EXPECT_EQ(volumes.freeBytes("/"), 1'000U);
    EXPECT_EQ(volumes.write("/nowhere", 5), 0U);
    EXPECT_EQ(volumes.freeBytes("/nowhere"), 0U);
  });
}

TEST(SimulatedVolumes, AreListedInMountOrderAndValidOnlyWhileMounted) {
  inEverySchedule(1, [] {
    World world;
    SimulatedVolumes& volumes = world.volumes();
    volumes.add("/z", 10, 1);
    volumes.add("/a", 10, 2);
    EXPECT_EQ(volumes.getLocalVolumes(), (std::vector<std::string>{"/z", "/a"}));
    EXPECT_TRUE(volumes.validateVolume({{"SPACEKEEP_VOLUME", "/z"}}));
    volumes.setLowSpace({"/z"});
    EXPECT_EQ(volumes.lowSpaceVolumes(), std::vector<std::string>{"/z"});
    volumes.remove("/z");
    EXPECT_FALSE(volumes.validateVolume({{"SPACEKEEP_VOLUME", "/z"}}));
    EXPECT_FALSE(volumes.validateVolume({{"SPACEKEEP_VOLUME", 1}}));
    EXPECT_FALSE(volumes.validateVolume({}));
    EXPECT_TRUE(volumes.lowSpaceVolumes().empty());
    const Value path("/a");
    EXPECT_EQ(volumes.volumeFreespace(&path), 2U);
    EXPECT_EQ(volumes.volumeFreespace(nullptr), 0U);
  });
}

TEST(DelayLine, TasksRunAtTheirTimeAndNoneAfterTheStop) {
  inEverySchedule(kSchedules, [] {
    World world;
    std::vector<std::uint64_t> ran_at;
    CountingSemaphore ran(0);
    for (const std::uint64_t seconds : {3U, 1U, 2U}) {
      world.after(seconds * kSecond, [&] {
        ran_at.push_back(world.nowNs());
        ran.signal();
      });
    }
    for (int i = 0; i < 3; ++i) ran.wait();
    EXPECT_EQ(ran_at, (std::vector<std::uint64_t>{kSecond, 2 * kSecond, 3 * kSecond}));
    bool ran_late = false;
    world.after(kSecond, [&] { ran_late = true; });
    world.shutDown();
    rt::sleepNs(2 * kSecond);
    EXPECT_FALSE(ran_late);
  });
}

TEST(InMemoryFiles, AreListedAsAddedWithTheirDirectories) {
  InMemoryFiles files;
  files.addText("/d/z", "text");
  files.addText("/d/sub/a", "deep");
  files.addUnreadable("/d/b", "no right");
  files.addText("/other/x", "");
  EXPECT_EQ(files.entriesBelow("//d/"), (std::vector<std::string>{"z", "sub", "sub/a", "b"}));
  EXPECT_TRUE(files.entriesBelow("/missing").empty());
  files.remove("/d/sub");
  EXPECT_EQ(files.entriesBelow("/d"), (std::vector<std::string>{"z", "b"}));
}

TEST(InMemoryFiles, ReadingGivesTheContentOrTheReason) {
  InMemoryFiles files;
  files.addText("/d/z", "text");
  files.addUnreadable("/d/b", "no right");
  const auto content = files.readWholeFile("//d//z");
  ASSERT_TRUE(std::holds_alternative<std::vector<std::uint8_t>>(content));
  EXPECT_EQ(std::get<std::vector<std::uint8_t>>(content).size(), 4U);
  EXPECT_EQ(std::get<FileError>(files.readWholeFile("/d/b")).reason, "no right");
  EXPECT_EQ(std::get<FileError>(files.readWholeFile("/d")).reason, "not a regular file");
  EXPECT_EQ(std::get<FileError>(files.readWholeFile("/d/q")).reason, "no such file");
}

TEST(InMemoryFiles, APropertyListComesBackAsItWas) {
  InMemoryFiles files;
  const Value content(Dictionary{{"SPACEKEEP_ID", "cache"}});
  files.addPlist("/d/cache.plist", content);
  const auto bytes = std::get<std::vector<std::uint8_t>>(files.readWholeFile("/d/cache.plist"));
  const auto parsed = parsePlist(bytes);
  ASSERT_TRUE(std::holds_alternative<Value>(parsed));
  EXPECT_EQ(std::get<Value>(parsed), content);
}

TEST(InMemoryPreferences, WhatWasNotSynchronizedIsLostWithTheSuite) {
  InMemoryDisk disk;
  {
    InMemoryPreferencesSuite suite(disk, "s");
    suite.set("kept", Value(1));
    EXPECT_EQ(suite.synchronize(), std::nullopt);
    suite.set("lost", Value(2));
    EXPECT_EQ(suite.get("lost"), Value(2));
  }
  InMemoryPreferencesSuite suite(disk, "s");
  EXPECT_EQ(suite.get("kept"), Value(1));
  EXPECT_EQ(suite.get("lost"), std::nullopt);
  suite.set("kept", std::nullopt);
  EXPECT_EQ(suite.get("kept"), std::nullopt);
  EXPECT_EQ(suite.synchronize(), std::nullopt);
  EXPECT_TRUE(disk.read("s").empty());
  EXPECT_EQ(disk.writes(), 2U);
}

TEST(InMemoryPreferences, AFailedSynchronizeKeepsWhatIsUnwritten) {
  InMemoryDisk disk;
  InMemoryPreferencesSuite suite(disk, "s");
  suite.set("key", Value("value"));
  disk.failSynchronize("disk full");
  EXPECT_EQ(suite.synchronize(), "disk full");
  EXPECT_TRUE(disk.read("s").empty());
  disk.failSynchronize("");
  EXPECT_EQ(suite.synchronize(), std::nullopt);
  EXPECT_EQ(disk.read("s").size(), 1U);
}

TEST(InMemoryPreferences, RefreshReadsAndWritesNothing) {
  InMemoryDisk disk;
  InMemoryPreferencesSuite suite(disk, "s");
  suite.set("mine", Value(1));
  disk.write("s", {{"theirs", Value(2)}});
  EXPECT_EQ(suite.get("theirs"), std::nullopt);
  EXPECT_EQ(suite.refresh(), std::nullopt);
  EXPECT_EQ(suite.get("theirs"), Value(2));
  EXPECT_EQ(suite.get("mine"), Value(1));
  EXPECT_EQ(disk.writes(), 1U);
  disk.failSynchronize("no disk");
  EXPECT_EQ(suite.refresh(), "no disk");
}

TEST(InMemoryPreferences, WhatWasDiscardedNeverGetsToTheDisk) {
  InMemoryDisk disk;
  disk.write("s", {{"key", Value("old")}});
  InMemoryPreferencesSuite suite(disk, "s");
  suite.set("key", Value("new"));
  suite.set("other", Value(1));
  suite.discard("key");
  suite.discard("never set");
  EXPECT_EQ(suite.get("key"), Value("old"));
  EXPECT_EQ(suite.synchronize(), std::nullopt);
  const InMemoryDisk::Contents expected{{"key", Value("old")}, {"other", Value(1)}};
  EXPECT_EQ(disk.read("s"), expected);
}

TEST(RecordingStatistics, KeepsObservationsAndSums) {
  Trace trace;
  RecordingStatistics statistics(trace);
  statistics.addDistributionStat(1.5, kStatisticsDomain, "d");
  statistics.addDistributionStat(2.5, kStatisticsDomain, "d");
  statistics.addReportStat(kStatisticsDomain, "r", 5);
  statistics.addReportStat(kStatisticsDomain, "r", -2);
  statistics.addReportStat(kStatisticsDomain, std::nullopt, 9);
  EXPECT_EQ(statistics.distribution("d"), (std::vector<double>{1.5, 2.5}));
  EXPECT_EQ(statistics.reported("r"), 3);
  EXPECT_EQ(statistics.timesReported("r"), 2U);
  EXPECT_EQ(statistics.keys(), (std::vector<std::string>{"d", "r"}));
  EXPECT_TRUE(statistics.onlyTheDaemonsDomain());
  statistics.addReportStat("elsewhere", "r", 1);
  EXPECT_FALSE(statistics.onlyTheDaemonsDomain());
  EXPECT_EQ(trace.events().size(), 5U);
}

TEST(RecordingStatistics, SumsBeyondTheirRangeStayAtItsEnd) {
  Trace trace;
  RecordingStatistics statistics(trace);
  for (int i = 0; i < 2; ++i) {
    statistics.addReportStat(kStatisticsDomain, "most", INT64_MAX - 1);
    statistics.addReportStat(kStatisticsDomain, "least", INT64_MIN + 1);
  }
  EXPECT_EQ(statistics.reported("most"), INT64_MAX);
  EXPECT_EQ(statistics.reported("least"), INT64_MIN);
}

TEST(SimulatedEvents, RunTheirHandlersOnlyWhenSetOff) {
  inEverySchedule(kSchedules, [] {
    World world;
    CountingSemaphore ran(0);
    ActivityState seen = ActivityState::kDone;
    EXPECT_FALSE(world.events().runActivity("daily", ActivityState::kRun));
    world.events().registerActivity("daily", [&](Activity& activity) {
      seen = activity.state();
      ran.signal();
    });
    EXPECT_TRUE(world.events().runActivity("daily", ActivityState::kRun));
    ran.wait();
    EXPECT_EQ(seen, ActivityState::kRun);
    world.events().setStreamHandler("stream", world.global(), [&](const Dictionary& event) {
      if (event.contains("flags")) ran.signal();
    });
    EXPECT_TRUE(world.events().send("stream", {{"flags", 4}}));
    EXPECT_FALSE(world.events().send("other", {}));
    ran.wait();
    world.events().setNotificationResult(13);
    EXPECT_EQ(world.events().postNotification("launched"), 13);
    EXPECT_EQ(world.events().postedNotifications(), std::vector<std::string>{"launched"});
    world.shutDown();
  });
}

TEST(CountingKeepAlive, SeesAnEndTooMany) {
  CountingKeepAlive keep_alive;
  {
    const KeepAliveTransaction outer(keep_alive);
    const KeepAliveTransaction inner(keep_alive);
    EXPECT_EQ(keep_alive.open(), 2);
  }
  EXPECT_EQ(keep_alive.open(), 0);
  EXPECT_EQ(keep_alive.begun(), 2U);
  EXPECT_FALSE(keep_alive.wentNegative());
  keep_alive.end();
  EXPECT_TRUE(keep_alive.wentNegative());
}

TEST(Trace, KeepsLogLinesOfBothLevelsWithTheirObjects) {
  inEverySchedule(1, [] {
    World world;
    logTrace("%s count: %d, info: %@", "test", 3, Dictionary{{"K", 1}});
    logProblem("%s nothing: %@", "test", static_cast<const Value*>(nullptr));
    EXPECT_EQ(world.trace().linesOfLevel(kLogTrace),
              std::vector<std::string>{"test count: 3, info: {\"K\": 1}"});
    EXPECT_EQ(world.trace().linesWithFormat("%s nothing: %@"),
              std::vector<std::string>{"test nothing: (none)"});
    EXPECT_TRUE(world.trace().hasLine("test nothing: (none)"));
    world.logHandle().level = 2;
    logProblem("%s unheard", "test");
    EXPECT_FALSE(world.trace().hasLine("test unheard"));
  });
}

TEST(World, APurgeTakesFiveLines) {
  inEverySchedule(kSchedules, [] {
    World world;
    world.volumes().add("/", 1'000, 100);
    const auto cache = world.declareService("cache", ownsBytes("/", 500));
    const auto daemon = Spacekeep::create(world.platform());
    const auto answer = world
                            .call(world.client("client", {"PURGE_ENTITLEMENT"}), "clientPurge",
                                  {Dictionary{{"SPACEKEEP_VOLUME", "/"},
                                              {"SPACEKEEP_AMOUNT", 300},
                                              {"SPACEKEEP_FINISH_EARLY", true}}})
                            ->wait();
    ASSERT_TRUE(answer);
    EXPECT_EQ(world.volumes().freeBytes("/"), 400U);
    EXPECT_EQ(cache->callCount("servicePurge"), 1U);
    world.shutDown();
  });
}

// The daemon waits for a ping without any limit; the world must come to an end all the same.
TEST(World, ShutsDownWhileAServiceIsSilentToItsPing) {
  inEverySchedule(kSchedules, [] {
    World world;
    ServiceBehaviour silent;
    silent.ping.answer = Answer::kNever;
    const auto daemon = Spacekeep::create(world.platform());
    const auto call = world.checkIn(world.addService("cache", silent), {{"PURGE", true}});
    EXPECT_FALSE(call->waitForNs(3600 * kSecond));
    world.shutDown();
  });
}

TEST(World, ShutsDownAfterAServiceDiedBeforeItAnsweredItsPing) {
  inEverySchedule(kSchedules, [] {
    World world;
    ServiceBehaviour silent;
    silent.ping.answer = Answer::kNever;
    const auto service = world.addService("cache", silent);
    const auto daemon = Spacekeep::create(world.platform());
    const auto call = world.checkIn(service, {{"PURGE", true}});
    ASSERT_TRUE(world.eventually([&] { return service->callCount("servicePing") == 1; }));
    service->die();
    EXPECT_FALSE(call->waitForNs(3600 * kSecond));
    world.shutDown();
  });
}

}  // namespace
}  // namespace spacekeep::sim
