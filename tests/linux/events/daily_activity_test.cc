#include "support/events/daily_activity.h"

#include <gtest/gtest.h>

#include <mutex>

#include "support/events/linux/event_files.h"
#include "support/events/linux/linux_activity_host.h"
#include "support/events/linux/power_supply.h"
#include "support/queues/waiting.h"
#include "tests/helpers/log_capture.h"
#include "tests/linux/events/event_world.h"

namespace spacekeep {
namespace {

using test::LogCapture;
using test::ScratchDirectory;

constexpr std::uint64_t kSecond = 1'000'000'000;

class DailyActivityAtWork : public ::testing::Test {
 protected:
  std::shared_ptr<DailyActivity> start(DailySchedule schedule) {
    auto activity = std::make_shared<DailyActivity>(
        std::make_shared<LinuxActivityHost>(
            loop_, LinuxActivityHost::Options{.record_path = record_path_,
                                              .power_supply_directory = "/nowhere"}),
        global_,
        [this](Activity& called) {
          {
            const std::scoped_lock lock(mutex_);
            states_.push_back(called.state());
          }
          called_.signal();
        },
        DailyActivity::Options{.name = "daily", .schedule = schedule});
    activity->start();
    return activity;
  }
  std::vector<ActivityState> states() {
    const std::scoped_lock lock(mutex_);
    return states_;
  }

  ScratchDirectory directory_;
  const std::string record_path_ = directory_.path() + "/daily.run";
  ConcurrentQueue global_{ConcurrentQueue::Options{}};
  const std::shared_ptr<EventLoop> loop_ = std::make_shared<EventLoop>();
  CountingSemaphore called_{0};
  rt::Mutex mutex_;
  std::vector<ActivityState> states_;  // protected by mutex_
};

TEST_F(DailyActivityAtWork, ChecksInFirstAndRunsEachTimeItIsDue) {
  const auto activity = start({.interval_seconds = 1});
  for (int i = 0; i < 3; ++i) called_.wait();
  loop_->stop();
  const auto seen = states();
  EXPECT_EQ(seen[0], ActivityState::kCheckIn);
  EXPECT_EQ(seen[1], ActivityState::kRun);
  EXPECT_EQ(seen[2], ActivityState::kRun);
}

TEST_F(DailyActivityAtWork, KeepsTheRunOnDiskBeforeItStarts) {
  const auto activity = start({.interval_seconds = 86400});
  called_.wait();
  called_.wait();
  const auto record = loadRunRecord(record_path_);
  loop_->stop();
  ASSERT_TRUE(record.has_value());
  EXPECT_EQ(record->boot_id, readSystemClocks().boot_id);
  EXPECT_LE(record->boot_ns, bootClockNs());
}

TEST_F(DailyActivityAtWork, ARunIsLoggedAndSoIsARecordThatCannotBeKept) {
  const LogCapture log;
  directory_.write("daily.run/in the way", "");
  const auto activity = start({.interval_seconds = 86400});
  called_.wait();
  called_.wait();
  loop_->stop();
  EXPECT_EQ(log.countExact(kLogTrace, "run runs daily"), 1U);
  EXPECT_TRUE(log.contains(kLogProblem, "keepRecord cannot keep the run times of daily: "));
}

TEST_F(DailyActivityAtWork, ARestartDoesNotRunAgainBeforeItIsDue) {
  const Clocks now = readSystemClocks();
  ASSERT_EQ(saveRunRecord(record_path_,
                          {.wall_ns = now.wall_ns, .boot_ns = now.boot_ns, .boot_id = now.boot_id}),
            std::nullopt);
  const auto activity = start({.interval_seconds = 86400});
  called_.wait();
  EXPECT_EQ(called_.waitForNs(kSecond / 2), WaitResult::kTimedOut);
  loop_->stop();
  EXPECT_EQ(states(), (std::vector<ActivityState>{ActivityState::kCheckIn}));
}

TEST_F(DailyActivityAtWork, AMissedRunIsMadeUpForOnce) {
  const Clocks now = readSystemClocks();
  const auto week_ns = std::int64_t{7} * 86400 * std::int64_t{kSecond};
  ASSERT_EQ(
      saveRunRecord(record_path_,
                    {.wall_ns = now.wall_ns - week_ns, .boot_ns = 5, .boot_id = "an earlier boot"}),
      std::nullopt);
  const auto activity = start({.interval_seconds = 86400});
  called_.wait();
  called_.wait();
  EXPECT_EQ(called_.waitForNs(kSecond / 2), WaitResult::kTimedOut);
  loop_->stop();
  EXPECT_EQ(states(), (std::vector<ActivityState>{ActivityState::kCheckIn, ActivityState::kRun}));
}

TEST(EventFiles, TheFirstDirectoryWins) {
  const ScratchDirectory directory;
  const auto document = [](int seconds) {
    return "<plist version=\"1.0\"><dict><key>INTERVAL_SECONDS</key><integer>" +
           std::to_string(seconds) + "</integer></dict></plist>";
  };
  directory.write("vendor/daily.plist", document(60));
  const std::vector<std::string> directories = {directory.path() + "/admin",
                                                directory.path() + "/vendor"};
  EXPECT_EQ(loadSchedule(directories, "daily")->interval_seconds, 60U);
  directory.write("admin/daily.plist", document(70));
  EXPECT_EQ(loadSchedule(directories, "daily")->interval_seconds, 70U);
}

TEST(EventFiles, AMissingOrBrokenLaunchFileIsLoggedAndGivesNoSchedule) {
  const ScratchDirectory directory;
  const LogCapture log;
  EXPECT_EQ(loadSchedule({directory.path()}, "daily"), std::nullopt);
  EXPECT_EQ(log.countExact(kLogProblem,
                           "loadSchedule there is no launch file daily.plist, the activity will "
                           "not run"),
            1U);
  const std::string path = directory.write(
      "daily.plist",
      "<plist version=\"1.0\"><dict><key>EVERY</key><integer>5</integer></dict></plist>");
  EXPECT_EQ(loadSchedule({directory.path()}, "daily"), std::nullopt);
  EXPECT_EQ(log.countExact(kLogProblem, "loadSchedule launch file " + path +
                                            " is not used, the activity daily will not run: "
                                            "INTERVAL_SECONDS is missing"),
            1U);
}

TEST(EventFiles, TheShippedLaunchFileIsGood) {
  const auto schedule =
      loadSchedule({SPACEKEEP_SOURCE_DIR "/packaging/launch.d"}, "com.quorvel.Spacekeep.daily");
  ASSERT_TRUE(schedule.has_value());
  EXPECT_EQ(schedule->interval_seconds, 86400U);
  EXPECT_EQ(schedule->random_delay_seconds, 3600U);
  EXPECT_TRUE(schedule->wants_mains_power);
  EXPECT_EQ(schedule->mains_power_wait_seconds, 86400U);
}

TEST(EventFiles, ADamagedRunRecordIsLoggedAndCountsAsNone) {
  const ScratchDirectory directory;
  const std::string path = directory.write("daily.run", "garbage");
  const LogCapture log;
  EXPECT_EQ(loadRunRecord(path), std::nullopt);
  EXPECT_EQ(log.count(kLogProblem, "cannot read " + path), 1U);
  EXPECT_EQ(loadRunRecord(directory.path() + "/absent"), std::nullopt);
  EXPECT_EQ(log.texts(kLogProblem).size(), 1U);
}

TEST(EventFiles, ARunRecordThatCannotBeWrittenSaysWhy) {
  const auto reason = saveRunRecord("/nowhere/daily.run", {});
  ASSERT_TRUE(reason.has_value());
  EXPECT_NE(reason->find("No such file or directory"), std::string::npos) << *reason;
}

TEST(PowerSupply, WhatCountsAsMainsPower) {
  struct Supply {
    const char* type;
    const char* scope;
    const char* online;
  };
  struct Case {
    const char* what;
    std::vector<Supply> supplies;
    bool on_mains;
  };
  const Case cases[] = {
      {"no supplies", {}, true},
      {"a charger that is plugged in", {{"Battery", "", ""}, {"Mains", "", "1"}}, true},
      {"a charger that is not", {{"Battery", "", ""}, {"Mains", "", "0"}}, false},
      {"a battery alone", {{"Battery", "System", ""}}, false},
      {"the battery of a mouse", {{"Battery", "Device", ""}}, true},
      {"one of two USB ports", {{"Battery", "", ""}, {"USB", "", "0"}, {"USB", "", "1"}}, true},
  };
  for (const Case& each : cases) {
    const ScratchDirectory directory;
    int number = 0;
    for (const Supply& supply : each.supplies) {
      const std::string name = "supply" + std::to_string(number++);
      directory.write(name + "/type", std::string(supply.type) + "\n");
      if (*supply.scope != 0) directory.write(name + "/scope", std::string(supply.scope) + "\n");
      if (*supply.online != 0) directory.write(name + "/online", std::string(supply.online) + "\n");
    }
    EXPECT_EQ(onMainsPower(directory.path()), each.on_mains) << each.what;
  }
  EXPECT_TRUE(onMainsPower("/nowhere"));
}

}  // namespace
}  // namespace spacekeep
