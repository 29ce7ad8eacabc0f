#include "support/volumes/low_space_memory.h"

#include <gtest/gtest.h>

namespace spacekeep {
namespace {

// Size 12000: low below 600 and until 900.
SpaceLevel levelIn(LowSpaceMemory& memory, const std::string& volume, std::uint64_t available,
                   std::uint64_t file_system = 1) {
  std::vector<VolumeSample> samples = {
      {.volume = volume,
       .file_system = file_system,
       .space = {.size_bytes = 12000, .available_bytes = available}}};
  memory.judge(samples);
  return samples[0].level;
}

TEST(LowSpaceMemory, RemembersWhoIsShort) {
  LowSpaceMemory memory;
  EXPECT_EQ(levelIn(memory, "/data", 700), SpaceLevel::kEnough);
  EXPECT_EQ(levelIn(memory, "/data", 599), SpaceLevel::kLow);
  EXPECT_EQ(levelIn(memory, "/data", 700), SpaceLevel::kLow);
  EXPECT_EQ(levelIn(memory, "/data", 900), SpaceLevel::kEnough);
  EXPECT_EQ(levelIn(memory, "/data", 700), SpaceLevel::kEnough);
}

TEST(LowSpaceMemory, SaysByWhichThresholdsItJudged) {
  LowSpaceMemory memory;
  std::vector<VolumeSample> samples = {{.volume = "/data", .space = {.size_bytes = 12000}}};
  memory.judge(samples);
  EXPECT_EQ(samples[0].thresholds, (SpaceThresholds{.low_bytes = 600, .very_low_bytes = 200}));
}

TEST(LowSpaceMemory, NewSettingsHoldFromTheNextLookAndForgetWhoWasShort) {
  LowSpaceMemory memory;
  EXPECT_EQ(levelIn(memory, "/data", 599), SpaceLevel::kLow);
  EXPECT_TRUE(memory.setSettings({.percent = 4}));  // low below 480, and until 720
  EXPECT_EQ(levelIn(memory, "/data", 599), SpaceLevel::kEnough);
  EXPECT_TRUE(memory.setSettings({.percent = 5}));
  EXPECT_EQ(levelIn(memory, "/data", 599), SpaceLevel::kLow);
}

TEST(LowSpaceMemory, TheSameSettingsAgainChangeNothing) {
  LowSpaceMemory memory;
  EXPECT_EQ(levelIn(memory, "/data", 599), SpaceLevel::kLow);
  EXPECT_FALSE(memory.setSettings({}));
  EXPECT_EQ(levelIn(memory, "/data", 700), SpaceLevel::kLow);
}

TEST(LowSpaceMemory, AVolumeThatWasGoneStartsAfresh) {
  LowSpaceMemory memory;
  EXPECT_EQ(levelIn(memory, "/data", 599), SpaceLevel::kLow);
  EXPECT_EQ(levelIn(memory, "/other", 12000), SpaceLevel::kEnough);
  EXPECT_EQ(levelIn(memory, "/data", 700), SpaceLevel::kEnough);
}

TEST(LowSpaceMemory, AnotherFileSystemAtTheSamePlaceStartsAfresh) {
  LowSpaceMemory memory;
  EXPECT_EQ(levelIn(memory, "/data", 599, 1), SpaceLevel::kLow);
  EXPECT_EQ(levelIn(memory, "/data", 700, 2), SpaceLevel::kEnough);
}

}  // namespace
}  // namespace spacekeep
