// The memory of answers as a query reads and writes it.
#include <gtest/gtest.h>

#include "tests/both/purgeable/query_world.h"
#include "tests/helpers/schedules.h"

namespace spacekeep::test {
namespace {

const Dictionary kRoot{{keys::kVolume, "/"}};

/// A record of "/" with one answer per entry, each that many seconds old.
SpacekeepRecentInfo recordOfAges(const std::map<std::string, std::int64_t>& ages_seconds) {
  const Date now = recentDate(rt::wallClockNs());
  SpacekeepRecentVolumeInfo volume{
      .services = {}, .freespace = 0, .timestamp = now, .volumeName = "/"};
  for (const auto& [id, age_seconds] : ages_seconds) {
    volume.services.emplace(
        id, SpacekeepRecentServiceInfo{
                5, Date{now.unix_ns - age_seconds * static_cast<std::int64_t>(kSecond)}});
  }
  return SpacekeepRecentInfo({{"/", std::move(volume)}});
}

Dictionary entryOf(Value amount, const char* volume = "/") {
  return {{keys::kAmount, std::move(amount)}, {keys::kVolume, volume}};
}

TEST(RecentStatistics, WithoutARecordEveryoneIsAskedAndNobodyCounted) {
  inEverySchedule(kSchedules, [] {
    QueryWorld world;
    world.world.declareService("a", {});
    world.world.declareService("b", {});
    world.start();
    EXPECT_EQ(world.make()->cachedInfo(kRoot),
              (Dictionary{{"SPACEKEEP_SERVICES_TO_COUNT", Dictionary{}},
                          {"SPACEKEEP_SERVICES_TO_QUERY", Array{"a", "b"}}}));
    EXPECT_EQ(world.filled("%s servicesToCount: %@"),
              std::vector<std::string>{"cachedInfo servicesToCount: {}"});
    EXPECT_EQ(world.filled("%s servicesToQuery: %@"),
              std::vector<std::string>{"cachedInfo servicesToQuery: [\"a\", \"b\"]"});
    EXPECT_FALSE(world.stateOnDisk().has_value());
  });
}

TEST(RecentStatistics, WithoutAVolumeEveryoneIsAskedAndTheStoreIsNotRead) {
  inEverySchedule(kSchedules, [] {
    QueryWorld world;
    world.world.declareService("a", {});
    world.start();
    world.remember(recordOf("/", "a", 5));
    EXPECT_EQ(world.make()->cachedInfo({}),
              (Dictionary{{"SPACEKEEP_SERVICES_TO_COUNT", Dictionary{}},
                          {"SPACEKEEP_SERVICES_TO_QUERY", Array{"a"}}}));
    EXPECT_EQ(world.lines("%s %d"), 0U);  // the mark of a read of the store
  });
}

TEST(RecentStatistics, WithoutAnEntryForTheVolumeEveryoneIsAsked) {
  inEverySchedule(kSchedules, [] {
    QueryWorld world;
    world.world.volumes().add("/data", 1000, 0);
    world.world.declareService("a", {});
    world.start();
    world.remember(recordOf("/data", "a", 5));
    const Dictionary info = world.make()->cachedInfo(kRoot);
    EXPECT_EQ(*info.find("SPACEKEEP_SERVICES_TO_QUERY"), Value(Array{"a"}));
    EXPECT_EQ(*info.find("SPACEKEEP_SERVICES_TO_COUNT"), Value(Dictionary{}));
  });
}

TEST(RecentStatistics, WhoIsRememberedIsCountedAndTheOthersAreAsked) {
  inEverySchedule(kSchedules, [] {
    QueryWorld world;
    world.world.declareService("a", {});
    world.world.declareService("b", {});
    world.start();
    world.remember(recordOf("/", "a", "any value"));
    EXPECT_EQ(world.make()->cachedInfo(kRoot),
              (Dictionary{{"SPACEKEEP_SERVICES_TO_COUNT", Dictionary{{"a", "any value"}}},
                          {"SPACEKEEP_SERVICES_TO_QUERY", Array{"b"}}}));
    EXPECT_EQ(world.lines("%s Recent Info is invalid, deleting..."), 0U);
    EXPECT_EQ(world.lines("%s Recent Info need syncing. New values: %@"), 0U);
  });
}

TEST(RecentStatistics, WhenAllAreRememberedItSaysSo) {
  inEverySchedule(kSchedules, [] {
    QueryWorld world;
    world.world.declareService("a", {});
    world.start();
    world.remember(recordOf("/", "a", 5));
    EXPECT_EQ(world.make()->cachedInfo(kRoot).find("SPACEKEEP_SERVICES_TO_QUERY")->array()->size(),
              0U);
    EXPECT_EQ(world.filled("%s using all cached info"),
              std::vector<std::string>{"cachedInfo using all cached info"});
    EXPECT_EQ(world.lines("%s servicesToQuery: %@"), 0U);
  });
}

TEST(RecentStatistics, WhoIsRememberedIsCountedAlsoWithoutBeingAmongTheAskedServices) {
  inEverySchedule(kSchedules, [] {
    QueryWorld world;
    world.start();
    world.remember(recordOf("/", "gone", 5));
    const Dictionary info = world.make()->cachedInfo(kRoot);
    EXPECT_EQ(*info.find("SPACEKEEP_SERVICES_TO_COUNT"), Value(Dictionary{{"gone", 5}}));
    EXPECT_EQ(*info.find("SPACEKEEP_SERVICES_TO_QUERY"), Value(Array{}));
  });
}

TEST(RecentStatistics, AnInvalidRecordIsDeletedAndWhatIsLeftOfItCounted) {
  inEverySchedule(kSchedules, [] {
    QueryWorld world;
    world.world.declareService("a", {});
    world.start();
    world.remember(recordOfAges({{"a", 3600}}));
    const Dictionary info = world.make()->cachedInfo(kRoot);
    EXPECT_EQ(*info.find("SPACEKEEP_SERVICES_TO_COUNT"), Value(Dictionary{}));
    EXPECT_EQ(*info.find("SPACEKEEP_SERVICES_TO_QUERY"), Value(Array{"a"}));
    EXPECT_EQ(world.filled("%s Recent Info is invalid, deleting..."),
              std::vector<std::string>{"cachedInfo Recent Info is invalid, deleting..."});
    EXPECT_EQ(world.record(), std::nullopt);
    EXPECT_EQ(world.get(keys::kRecentServiceStats), std::nullopt);
    // The next one finds no record that it could call invalid.
    static_cast<void>(world.make()->cachedInfo(kRoot));
    EXPECT_EQ(world.lines("%s Recent Info is invalid, deleting..."), 1U);
  });
}

TEST(RecentStatistics, AChangedRecordIsStoredAndWhatIsLeftOfItCounted) {
  inEverySchedule(kSchedules, [] {
    QueryWorld world;
    world.world.declareService("fresh", {});
    world.world.declareService("old", {});
    world.start();
    world.remember(recordOfAges({{"fresh", 0}, {"old", 3600}}));
    const Dictionary info = world.make()->cachedInfo(kRoot);
    EXPECT_EQ(*info.find("SPACEKEEP_SERVICES_TO_COUNT"), Value(Dictionary{{"fresh", 5}}));
    EXPECT_EQ(*info.find("SPACEKEEP_SERVICES_TO_QUERY"), Value(Array{"old"}));
    EXPECT_EQ(world.filled("%s Recent Info need syncing. New values: %@"),
              std::vector<std::string>{"cachedInfo Recent Info need syncing. New values: {\"/\": "
                                       "{\"fresh\": 5}}"});
    const auto bytes = world.get(keys::kRecentServiceStats);
    ASSERT_TRUE(bytes.has_value());
    const auto stored = recentInfoFromArchive(*bytes->data());
    ASSERT_TRUE(stored.has_value());
    EXPECT_EQ(stored->volume("/")->services.size(), 1U);
    EXPECT_EQ(world.remembered(), (Dictionary{{"fresh", 5}}));
  });
}

TEST(RecentStatistics, TwoAnswersForAVolumeKeepBothAndRenewItsFreeSpaceAndDate) {
  inEverySchedule(kSchedules, [] {
    QueryWorld world;
    world.start();
    const auto operation = world.make();
    world.world.volumes().setFree("/", 1000);
    operation->updateServiceStats("a", entryOf(5));
    const auto first = world.record();
    ASSERT_TRUE(first.has_value());
    EXPECT_EQ(first->volume("/")->freespace, 1000U);
    rt::sleepNs(kMs);
    // More than the threshold: an answer renews what it is measured by before it is judged.
    world.world.volumes().setFree("/", 100'000'000);
    operation->updateServiceStats("b", entryOf(6));
    const auto second = world.record();
    ASSERT_TRUE(second.has_value());
    EXPECT_EQ(second->volume("/")->freespace, 100'000'000U);
    EXPECT_GT(second->volume("/")->timestamp.unix_ns, first->volume("/")->timestamp.unix_ns);
    EXPECT_EQ(second->volume("/")->services.at("a"), first->volume("/")->services.at("a"));
    EXPECT_EQ(world.remembered(), (Dictionary{{"a", 5}, {"b", 6}}));
  });
}

TEST(RecentStatistics, AnAnswerForANewVolumeStandsBesideTheOthers) {
  inEverySchedule(kSchedules, [] {
    QueryWorld world;
    world.world.volumes().add("/data", 1000, 77);
    world.start();
    const auto operation = world.make();
    operation->updateServiceStats("a", entryOf(5));
    operation->updateServiceStats("a", entryOf(6, "/data"));
    EXPECT_EQ(world.remembered("/"), (Dictionary{{"a", 5}}));
    EXPECT_EQ(world.remembered("/data"), (Dictionary{{"a", 6}}));
    EXPECT_EQ(world.record()->volume("/data")->freespace, 77U);
    EXPECT_EQ(world.record()->volume("/data")->volumeName, "/data");
  });
}

TEST(RecentStatistics, ASecondAnswerOfOneServiceReplacesItsFirst) {
  inEverySchedule(kSchedules, [] {
    QueryWorld world;
    world.start();
    const auto operation = world.make();
    operation->updateServiceStats("a", entryOf(5));
    operation->updateServiceStats("a", entryOf("none of that"));
    EXPECT_EQ(world.remembered(), (Dictionary{{"a", "none of that"}}));
  });
}

TEST(RecentStatistics, AnAnswerDropsWhatHasBecomeStaleMeanwhile) {
  inEverySchedule(kSchedules, [] {
    QueryWorld world;
    world.start();
    world.remember(recordOfAges({{"old", 3600}}));
    world.make()->updateServiceStats("a", entryOf(5));
    EXPECT_EQ(world.remembered(), (Dictionary{{"a", 5}}));
  });
}

TEST(RecentStatistics, AnUpdateReturnsAtOnceAndALaterReadSeesIt) {
  inEverySchedule(kSchedules, [] {
    QueryWorld world;
    world.world.declareService("a", {});
    world.start();
    const auto operation = world.make();
    world.daemon->defaults_queue()->suspend();
    operation->updateServiceStats("a", entryOf(5));  // does not wait for the queue
    EXPECT_EQ(world.lines("%s ^^^ENTRY, serviceID: %@ : %@, recentInfo: %@"), 0U);
    world.daemon->defaults_queue()->resume();
    EXPECT_EQ(*operation->cachedInfo(kRoot).find("SPACEKEEP_SERVICES_TO_COUNT"),
              Value(Dictionary{{"a", 5}}));
  });
}

TEST(RecentStatistics, AnUpdateTracesWhatItGotAndWhatItKnew) {
  inEverySchedule(kSchedules, [] {
    QueryWorld world;
    world.start();
    const auto operation = world.make();
    operation->updateServiceStats("a", entryOf(5));
    operation->updateServiceStats("b", entryOf(6));
    world.daemon->defaults_queue()->sync([] {});
    EXPECT_EQ(world.filled("%s ^^^ENTRY, serviceID: %@ : %@, recentInfo: %@"),
              (std::vector<std::string>{
                  "updateServiceStats ^^^ENTRY, serviceID: a : {\"SPACEKEEP_AMOUNT\": 5, "
                  "\"SPACEKEEP_VOLUME\": \"/\"}, recentInfo: (none)",
                  "updateServiceStats ^^^ENTRY, serviceID: b : {\"SPACEKEEP_AMOUNT\": 6, "
                  "\"SPACEKEEP_VOLUME\": \"/\"}, recentInfo: {\"/\": {\"a\": 5}}"}));
  });
}

TEST(RecentStatistics, WhatAClientPutThereInsteadCountsAsNoRecord) {
  inEverySchedule(kSchedules, [] {
    QueryWorld world;
    world.world.declareService("a", {});
    world.start();
    EXPECT_TRUE(world.set(keys::kRecentServiceStats, Value(Dictionary{{"/", 5}})));
    const auto operation = world.make();
    EXPECT_EQ(*operation->cachedInfo(kRoot).find("SPACEKEEP_SERVICES_TO_QUERY"), Value(Array{"a"}));
    operation->updateServiceStats("a", entryOf(5));
    EXPECT_EQ(world.remembered(), (Dictionary{{"a", 5}}));
  });
}

TEST(RecentStatistics, AnswersAtOnceAreAllKept) {
  inEverySchedule(kSchedules, [] {
    QueryWorld world;
    world.start();
    const auto operation = world.make();
    std::vector<rt::Thread> threads;
    for (const char* id : {"a", "b", "c", "d"}) {
      threads.emplace_back(id, [&operation, id] { operation->updateServiceStats(id, entryOf(1)); });
    }
    for (rt::Thread& thread : threads) thread.join();
    EXPECT_EQ(world.remembered().size(), 4U);
  });
}

}  // namespace
}  // namespace spacekeep::test
