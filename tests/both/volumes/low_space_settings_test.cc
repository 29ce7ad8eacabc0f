#include "support/volumes/low_space_settings.h"

#include <gtest/gtest.h>

#include <cmath>
#include <vector>

namespace spacekeep {
namespace {

struct Read {
  LowSpaceSettings settings;
  std::vector<std::string> problems;
};

Read read(const Dictionary& state) {
  Read result;
  result.settings = lowSpaceSettingsFrom(
      state, [&](const std::string& problem) { result.problems.push_back(problem); });
  return result;
}

TEST(LowSpaceSettings, WithoutKeysTheDefaultsHold) {
  const Read got = read({{"SOMETHING_ELSE", 7}});
  EXPECT_EQ(got.settings, LowSpaceSettings{});
  EXPECT_EQ(got.settings.bytes, 524'288'000U);
  EXPECT_EQ(got.settings.percent, 5);
  EXPECT_EQ(got.settings.inodes_percent, 5);
  EXPECT_TRUE(got.problems.empty());
}

TEST(LowSpaceSettings, EachKeySetsItsOwn) {
  const Read got = read({{"SPACEKEEP_LOW_SPACE_BYTES", 1'073'741'824},
                         {"SPACEKEEP_LOW_SPACE_PERCENT", 12.5},
                         {"SPACEKEEP_LOW_SPACE_INODES_PERCENT", 0}});
  EXPECT_EQ(got.settings,
            (LowSpaceSettings{.bytes = 1ULL << 30, .percent = 12.5, .inodes_percent = 0}));
  EXPECT_TRUE(got.problems.empty());
}

TEST(LowSpaceSettings, TheEndsOfTheRangesAreGood) {
  const Read least = read({{"SPACEKEEP_LOW_SPACE_BYTES", 1ULL << 20},
                           {"SPACEKEEP_LOW_SPACE_PERCENT", 0},
                           {"SPACEKEEP_LOW_SPACE_INODES_PERCENT", 0.0}});
  EXPECT_EQ(least.settings,
            (LowSpaceSettings{.bytes = 1ULL << 20, .percent = 0, .inodes_percent = 0}));
  EXPECT_TRUE(least.problems.empty());
  const Read most = read({{"SPACEKEEP_LOW_SPACE_BYTES", 1ULL << 60},
                          {"SPACEKEEP_LOW_SPACE_PERCENT", 50},
                          {"SPACEKEEP_LOW_SPACE_INODES_PERCENT", 50U}});
  EXPECT_EQ(most.settings,
            (LowSpaceSettings{.bytes = 1ULL << 60, .percent = 50, .inodes_percent = 50}));
  EXPECT_TRUE(most.problems.empty());
}

TEST(LowSpaceSettings, ABadValueIsToldAndItsDefaultHolds) {
  const Value bad_bytes[] = {
      "500", true, Array{},      Dictionary{}, (1ULL << 20) - 1, (1ULL << 60) + 1,
      0,     -1,   std::nan(""), -HUGE_VAL,    HUGE_VAL};
  for (const Value& bad : bad_bytes) {
    const Read got = read({{"SPACEKEEP_LOW_SPACE_BYTES", bad}, {"SPACEKEEP_LOW_SPACE_PERCENT", 7}});
    EXPECT_EQ(got.settings, LowSpaceSettings{.percent = 7});
    EXPECT_EQ(got.problems.size(), 1U);
  }
  const Value bad_percents[] = {"5", false, Data{}, 50.0001, 51, -0.5, std::nan(""), HUGE_VAL};
  for (const char* key : {"SPACEKEEP_LOW_SPACE_PERCENT", "SPACEKEEP_LOW_SPACE_INODES_PERCENT"}) {
    for (const Value& bad : bad_percents) {
      const Read got = read({{key, bad}});
      EXPECT_EQ(got.settings, LowSpaceSettings{});
      EXPECT_EQ(got.problems.size(), 1U);
    }
  }
}

TEST(LowSpaceSettings, TheProblemSaysKeyValueWhatIsAllowedAndWhatHolds) {
  EXPECT_EQ(read({{"SPACEKEEP_LOW_SPACE_BYTES", "much"}}).problems,
            std::vector<std::string>{
                "SPACEKEEP_LOW_SPACE_BYTES is \"much\", but must be a number of bytes from 1048576 "
                "to 1152921504606846976; the default, 524288000, holds instead"});
  EXPECT_EQ(read({{"SPACEKEEP_LOW_SPACE_INODES_PERCENT", 51}}).problems,
            std::vector<std::string>{
                "SPACEKEEP_LOW_SPACE_INODES_PERCENT is 51, but must be a number from 0 to 50 "
                "(percent); the default, 5, holds instead"});
}

TEST(LowSpaceSettings, EveryBadValueIsToldOnce) {
  const Read got = read({{"SPACEKEEP_LOW_SPACE_BYTES", 5},
                         {"SPACEKEEP_LOW_SPACE_PERCENT", 80},
                         {"SPACEKEEP_LOW_SPACE_INODES_PERCENT", 80}});
  EXPECT_EQ(got.problems.size(), 3U);
}

TEST(LowSpaceSettings, ALongValueIsCutInTheProblem) {
  std::string long_text;
  for (int i = 0; i < 1000; ++i) long_text += "ä";
  const Read got = read({{"SPACEKEEP_LOW_SPACE_BYTES", long_text}});
  ASSERT_EQ(got.problems.size(), 1U);
  EXPECT_LT(got.problems[0].size(), 300U);
  EXPECT_NE(got.problems[0].find("ä..."), std::string::npos) << got.problems[0];
}

}  // namespace
}  // namespace spacekeep
