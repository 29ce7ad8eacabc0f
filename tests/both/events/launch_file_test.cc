#include "support/events/launch_file.h"

#include <gtest/gtest.h>

namespace spacekeep {
namespace {

std::string reason(const Value& document) {
  const auto result = scheduleFromDocument(document);
  const auto* error = std::get_if<LaunchFileError>(&result);
  return error == nullptr ? "(accepted)" : error->reason;
}

TEST(LaunchFile, EveryKeyIsRead) {
  const auto result = scheduleFromDocument(Dictionary{{"INTERVAL_SECONDS", 86400},
                                                      {"RANDOM_DELAY_SECONDS", 3600},
                                                      {"MAINS_POWER", true},
                                                      {"MAINS_POWER_WAIT_SECONDS", 7200}});
  const auto& schedule = std::get<DailySchedule>(result);
  EXPECT_EQ(schedule.interval_seconds, 86400U);
  EXPECT_EQ(schedule.random_delay_seconds, 3600U);
  EXPECT_TRUE(schedule.wants_mains_power);
  EXPECT_EQ(schedule.mains_power_wait_seconds, 7200U);
}

TEST(LaunchFile, WhatIsLeftOut) {
  const auto result = scheduleFromDocument(Dictionary{{"INTERVAL_SECONDS", 60}});
  const auto& schedule = std::get<DailySchedule>(result);
  EXPECT_EQ(schedule.random_delay_seconds, 0U);
  EXPECT_FALSE(schedule.wants_mains_power);
  EXPECT_EQ(schedule.mains_power_wait_seconds, 86400U);
}

TEST(LaunchFile, WhatIsBrokenAndWhy) {
  EXPECT_EQ(reason("text"), "the document is no dictionary");
  EXPECT_EQ(reason(Dictionary{}), "INTERVAL_SECONDS is missing");
  EXPECT_EQ(reason(Dictionary{{"INTERVAL_SECONDS", 0}}),
            "INTERVAL_SECONDS must be a number from 1 to 31536000");
  EXPECT_EQ(reason(Dictionary{{"INTERVAL_SECONDS", 31536001}}),
            "INTERVAL_SECONDS must be a number from 1 to 31536000");
  EXPECT_EQ(reason(Dictionary{{"INTERVAL_SECONDS", "daily"}}),
            "INTERVAL_SECONDS must be a number from 1 to 31536000");
  EXPECT_EQ(reason(Dictionary{{"INTERVAL_SECONDS", 60}, {"MAINS_POWER", 1}}),
            "MAINS_POWER must be a boolean");
  EXPECT_EQ(reason(Dictionary{{"INTERVAL_SECONDS", 60}, {"MAINS_POWER_WAIT_SECONDS", 86401}}),
            "MAINS_POWER_WAIT_SECONDS must be a number from 0 to 86400");
  EXPECT_EQ(reason(Dictionary{{"INTERVAL_SECONDS", 60}, {"RANDOM_DELAY_SECONDS", 61}}),
            "RANDOM_DELAY_SECONDS must not be longer than the interval");
  EXPECT_EQ(reason(Dictionary{{"INTERVAL_SECONDS", 60}, {"Interval", 60}}), "unknown key Interval");
}

TEST(LaunchFile, ARunRecordSurvivesTheWayToItsDocumentAndBack) {
  const RunRecord record{.wall_ns = -5, .boot_ns = UINT64_MAX, .boot_id = "abc", .elapsed_ns = 7};
  EXPECT_EQ(runRecordFromDocument(documentFromRunRecord(record)), record);
}

TEST(LaunchFile, AnythingElseIsNoRunRecord) {
  EXPECT_EQ(runRecordFromDocument("text"), std::nullopt);
  EXPECT_EQ(runRecordFromDocument(Dictionary{}), std::nullopt);
  const Value whole = documentFromRunRecord({.boot_id = "abc"});
  for (const auto& [key, value] : *whole.dictionary()) {
    Dictionary part = *whole.dictionary();
    part.remove(key);
    EXPECT_EQ(runRecordFromDocument(part), std::nullopt) << key;
    part.set(key, Array{});
    EXPECT_EQ(runRecordFromDocument(part), std::nullopt) << key;
  }
}

}  // namespace
}  // namespace spacekeep
