// Events of the file-system stream, from the flags to the purges.
#include <gtest/gtest.h>

#include "daemon/start_up.h"
#include "support/events/events.h"
#include "tests/both/daemon/daemon_world.h"
#include "tests/helpers/schedules.h"

namespace spacekeep::test {
namespace {

constexpr std::uint64_t kAmount = 262'144'000;
constexpr std::uint64_t kManyBytes = 4 * kAmount;

/// A daemon with one service that gives what it is asked for.
struct LowDiskWorld : DaemonWorld {
  explicit LowDiskWorld(const std::vector<std::string>& low_volumes) {
    sim::ServiceBehaviour gives;
    for (const std::string& volume : low_volumes) {
      world.volumes().add(volume, kManyBytes, 0);
      gives.owns.merge(sim::ownsBytes(volume, kManyBytes).owns);
    }
    world.volumes().setLowSpace(low_volumes);
    cache = world.declareService("cache", gives, {{"SPACEKEEP_SERVICES", Array{"PURGE"}}});
    start();
  }

  /// Purges end as soon as they have their bytes, where their waits are not what a test is about.
  void endPurgesEarly() const {
    daemon->clientSetState(Value(true), keys::kFinishEarly, [] {}, {});
    daemon->defaults_queue()->sync([] {});
  }

  /// What the service was asked at the first urgency, one per purge.
  [[nodiscard]] std::vector<Dictionary> requests() const {
    std::vector<Dictionary> infos;
    for (const sim::RecordedCall& call : cache->callsOf("servicePurge")) infos.push_back(call.info);
    return infos;
  }
  [[nodiscard]] std::vector<std::string> problems() const {
    return world.trace().linesOfLevel(kLogProblem);
  }
  [[nodiscard]] bool hasProblem(std::string_view text) const {
    return std::ranges::count(problems(), text) == 1;
  }

  std::shared_ptr<sim::SimulatedService> cache;
};

void expectLowDiskRequest(const Dictionary& request, const std::string& volume) {
  EXPECT_EQ(*request.find("SPACEKEEP_VOLUME"), Value(volume));
  EXPECT_EQ(unsignedAt(request, "SPACEKEEP_AMOUNT"), kAmount);
  EXPECT_EQ(*request.find("SPACEKEEP_ASYNC"), Value(true));
  EXPECT_EQ(*request.find("SPACEKEEP_PURGE_TIMEOUT"), Value(300));
  EXPECT_FALSE(request.contains("SPACEKEEP_URGENCY"));
}

struct FlagsCase {
  const char* what;
  Dictionary event;
  const char* line;       // none: null
  const char* statistic;  // none: null
};

TEST(LowDisk, WhichEventIsCountedByWhichFlags) {
  const FlagsCase cases[] = {
      {"low", {{"_Flags", 0x4U}}, "handleVFSStreamEvent caught VQ_LOWDISK", "SK_LOWDISK_EVENT"},
      {"very low",
       {{"_Flags", 0x200U}},
       "handleVFSStreamEvent caught VQ_VERYLOWDISK",
       "SK_VERYLOWDISK_EVENT"},
      {"both bits count as low only",
       {{"_Flags", 0x204U}},
       "handleVFSStreamEvent caught VQ_LOWDISK",
       "SK_LOWDISK_EVENT"},
      {"among other bits",
       {{"_Flags", 0xfff}},
       "handleVFSStreamEvent caught VQ_LOWDISK",
       "SK_LOWDISK_EVENT"},
      {"neither bit", {{"_Flags", 0xdfbU & ~0x200U}}, nullptr, nullptr},
      {"no flags", {}, nullptr, nullptr},
      {"flags that are no number", {{"_Flags", "4"}}, nullptr, nullptr},
  };
  for (const FlagsCase& each : cases) {
    inEverySchedule(4, [&] {
      SCOPED_TRACE(each.what);
      LowDiskWorld world({"/data"});
      world.endPurgesEarly();
      world.daemon->handleVFSStreamEvent(each.event);
      // Whatever the flags say, the volume that is low is purged.
      ASSERT_EQ(world.requests().size(), 1U);
      expectLowDiskRequest(world.requests()[0], "/data");
      const auto& statistics = world.world.statistics();
      const bool counted = each.statistic != nullptr;
      EXPECT_EQ(
          statistics.reported("SK_LOWDISK_EVENT") + statistics.reported("SK_VERYLOWDISK_EVENT"),
          counted ? 1 : 0);
      if (counted) {
        EXPECT_EQ(statistics.reported(each.statistic), 1);
      }
      EXPECT_EQ(statistics.timesReportedWithoutKey(), counted ? 0U : 1U);
      EXPECT_TRUE(statistics.onlyTheDaemonsDomain());
      EXPECT_EQ(world.hasProblem("handleVFSStreamEvent caught VQ_LOWDISK") ||
                    world.hasProblem("handleVFSStreamEvent caught VQ_VERYLOWDISK"),
                counted);
      if (each.line != nullptr) {
        EXPECT_TRUE(world.hasProblem(each.line));
      }
    });
  }
}

TEST(LowDisk, AnEventWithBothBitsIsCountedAsLowOnly) {
  inEverySchedule(kSchedules, [] {
    LowDiskWorld world({"/data"});
    world.endPurgesEarly();
    world.daemon->handleVFSStreamEvent({{"_Flags", 0x204U}});
    EXPECT_EQ(world.world.statistics().timesReported("SK_LOWDISK_EVENT"), 1U);
    EXPECT_EQ(world.world.statistics().timesReported("SK_VERYLOWDISK_EVENT"), 0U);
    EXPECT_EQ(world.problems(), std::vector<std::string>{"handleVFSStreamEvent caught VQ_LOWDISK"});
  });
}

TEST(LowDisk, AnEventWithNeitherBitStillPurgesEachLowVolumeAndIsReportedWithoutAName) {
  inEverySchedule(kSchedules, [] {
    LowDiskWorld world({"/data", "/"});
    world.endPurgesEarly();
    world.daemon->handleVFSStreamEvent({{"_Flags", 0U}});
    const auto requests = world.requests();
    ASSERT_EQ(requests.size(), 2U);
    expectLowDiskRequest(requests[0], "/data");
    expectLowDiskRequest(requests[1], "/");
    EXPECT_EQ(world.world.statistics().timesReportedWithoutKey(), 1U);
    EXPECT_EQ(world.world.statistics().timesReported("SK_LOWDISK_EVENT"), 0U);
    EXPECT_EQ(world.world.statistics().timesReported("SK_VERYLOWDISK_EVENT"), 0U);
    EXPECT_TRUE(world.problems().empty());
  });
}

TEST(LowDisk, WhileNoVolumeIsLowThereIsNoPurgeAndNoStatisticWhateverTheFlags) {
  for (const std::uint64_t flags : {0x4U, 0x200U, 0x204U, 0U}) {
    inEverySchedule(kSchedules, [&] {
      LowDiskWorld world({});
      world.daemon->handleVFSStreamEvent({{"_Flags", flags}});
      EXPECT_TRUE(world.requests().empty());
      EXPECT_TRUE(world.world.statistics().keys().empty());
      EXPECT_EQ(world.world.statistics().timesReportedWithoutKey(), 0U);
      EXPECT_TRUE(world.problems().empty());
      EXPECT_TRUE(world.world.trace().hasLine(
          "handleVFSStreamEvent No volumes report low disk space, skipping purge"));
    });
  }
}

TEST(LowDisk, ThreeLowVolumesArePurgedOneAfterAnotherInTheirOrder) {
  inEverySchedule(onRealThreads() ? 1 : 10, [] {
    const std::vector<std::string> volumes = {"/z", "/", "/data"};
    LowDiskWorld world(volumes);
    world.daemon->handleVFSStreamEvent({{"_Flags", 0x4U}});
    const auto calls = world.cache->callsOf("servicePurge");
    ASSERT_EQ(calls.size(), 3U);
    for (std::size_t i = 0; i < calls.size(); ++i) {
      expectLowDiskRequest(calls[i].info, volumes[i]);
      // Each volume's purge has ended, waits and all, before the next one begins.
      if (i > 0 && !onRealThreads()) {
        EXPECT_GE(calls[i].arrived_ns, calls[i - 1].arrived_ns + 600'000'000'000);
      }
      EXPECT_EQ(world.world.volumes().freeBytes(volumes[i]), kAmount);
    }
    EXPECT_EQ(world.world.statistics().reported("SK_LOWDISK_EVENT"), 1);
  });
}

TEST(LowDisk, TheEventIsCountedOnceThePurgesHaveEnded) {
  inEverySchedule(10, [] {
    LowDiskWorld world({"/data"});
    world.endPurgesEarly();
    world.daemon->handleVFSStreamEvent({{"_Flags", 0x200U}});
    std::vector<std::string> reports;
    for (const sim::Event& event : world.world.trace().events()) {
      const auto* sent = std::get_if<sim::StatisticSent>(&event.body);
      if (sent != nullptr && sent->kind == sim::StatisticSent::Kind::kReport) {
        reports.push_back(sent->key);
      }
    }
    ASSERT_FALSE(reports.empty());
    EXPECT_EQ(reports.back(), "SK_VERYLOWDISK_EVENT");
    EXPECT_GT(reports.size(), 1U);  // those of the purge came before
  });
}

TEST(LowDisk, APurgeThatFreesNothingIsStillCountedAndTheNextVolumeStillPurged) {
  inEverySchedule(10, [] {
    LowDiskWorld world({"/gone", "/data"});
    world.endPurgesEarly();
    world.world.volumes().remove("/gone");
    world.world.volumes().setLowSpace({"/gone", "/data"});  // went away after it was seen low
    world.daemon->handleVFSStreamEvent({{"_Flags", 0x4U}});
    ASSERT_EQ(world.requests().size(), 1U);
    expectLowDiskRequest(world.requests()[0], "/data");
    EXPECT_EQ(world.world.statistics().reported("SK_LOWDISK_EVENT"), 1);
  });
}

/// The one daemon of the process, with a service that holds each call until it is told to answer.
struct HeldLowDiskWorld : LowDiskWorld {
  explicit HeldLowDiskWorld(const std::vector<std::string>& low_volumes)
      : LowDiskWorld(low_volumes) {
    sim::ServiceBehaviour silent = cache->behaviour();
    silent.purge = {sim::CallBehaviour{.answer = sim::Answer::kNever}};
    cache->setBehaviour(silent);
    Spacekeep::setSharedPlatform(platform);
    Spacekeep::sharedSpacekeep()->clientSetState(Value(true), keys::kFinishEarly, [] {}, {});
    Spacekeep::sharedSpacekeep()->defaults_queue()->sync([] {});
  }
  ~HeldLowDiskWorld() {
    world.shutDown();
    Spacekeep::resetSharedSpacekeep();
  }
  HeldLowDiskWorld(const HeldLowDiskWorld&) = delete;
  HeldLowDiskWorld& operator=(const HeldLowDiskWorld&) = delete;

  /// Handles one event as the stream has it handled.
  rt::Thread handle(const std::string& thread) {
    return {thread, [this] { handleStreamEvent(world.keepAlive(), {{"_Flags", 0x4U}}); }};
  }
  /// True once so many purges have asked the service.
  [[nodiscard]] bool hasAsked(std::size_t times) {
    return eventually([&] { return requests().size() == times; });
  }
};

TEST(LowDisk, TheKeepAliveTransactionLastsUntilTheLastPurgeHasEnded) {
  inEverySchedule(20, [] {
    HeldLowDiskWorld world({"/data", "/z"});
    const sim::CountingKeepAlive& keep_alive = world.world.keepAlive();
    rt::Thread handling = world.handle("handling");
    EXPECT_TRUE(world.hasAsked(1));
    EXPECT_EQ(keep_alive.open(), 1);
    world.cache->answerHeldCalls();
    EXPECT_TRUE(world.hasAsked(2));
    EXPECT_EQ(keep_alive.open(), 1);
    world.cache->answerHeldCalls();
    handling.join();
    EXPECT_EQ(keep_alive.open(), 0);
    EXPECT_EQ(keep_alive.begun(), 1U);
  });
}

TEST(LowDisk, TwoEventsAtTheSameTimeEachCountAndTheirPurgesRunOneAfterTheOther) {
  inEverySchedule(20, [] {
    HeldLowDiskWorld world({"/data"});
    const sim::CountingKeepAlive& keep_alive = world.world.keepAlive();
    rt::Thread one = world.handle("one");
    rt::Thread other = world.handle("other");
    EXPECT_TRUE(world.eventually([&] { return keep_alive.open() == 2; }));
    EXPECT_TRUE(world.hasAsked(1));
    world.cache->answerHeldCalls();
    EXPECT_TRUE(world.hasAsked(2));
    world.cache->answerHeldCalls();
    one.join();
    other.join();
    const auto calls = world.cache->callsOf("servicePurge");
    ASSERT_EQ(calls.size(), 2U);
    EXPECT_GE(calls[1].arrived_ns, calls[0].ended_ns);
    // Neither purge did anything before the other had its outcome.
    std::vector<std::string> course;
    for (const std::string& line : world.world.trace().linesOfLevel(kLogTrace)) {
      if (line.starts_with("startOperation user_timeout_seconds")) course.emplace_back("begins");
      if (line.starts_with("startOperation result")) course.emplace_back("ends");
    }
    EXPECT_EQ(course, (std::vector<std::string>{"begins", "ends", "begins", "ends"}));
    EXPECT_EQ(world.world.statistics().timesReported("SK_LOWDISK_EVENT"), 2U);
  });
}

}  // namespace
}  // namespace spacekeep::test
