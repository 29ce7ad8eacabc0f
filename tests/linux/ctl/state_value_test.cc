#include "ctl/state_value.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <cstdint>
#include <limits>
#include <string>

#include "ctl/known_keys.h"

namespace spacekeep::ctl {
namespace {

using testing::HasSubstr;
using testing::StartsWith;

Value parsed(std::string_view text, ValueType type = ValueType::kGuessed) {
  const auto result = parseStateValue(text, type);
  const auto* error = std::get_if<ValueError>(&result);
  EXPECT_EQ(error, nullptr) << text << ": " << error->text;
  return error == nullptr ? std::get<Value>(result) : Value("(error)");
}

std::string errorFor(std::string_view text, ValueType type) {
  const auto result = parseStateValue(text, type);
  const auto* error = std::get_if<ValueError>(&result);
  return error == nullptr ? "(no error)" : error->text;
}

TEST(StateValue, WithoutATypeTheTextDecides) {
  EXPECT_EQ(parsed("true"), Value(true));
  EXPECT_EQ(parsed("false"), Value(false));
  EXPECT_EQ(parsed("12"), Value(12));
  EXPECT_EQ(parsed("-3"), Value(-3));
  EXPECT_EQ(parsed("18446744073709551615"), Value(UINT64_MAX));
  EXPECT_EQ(parsed("0.25"), Value(0.25));
  EXPECT_EQ(parsed("250M"), Value(250ULL << 20));
  EXPECT_EQ(parsed("1.5GB"), Value(1'500'000'000));
  for (const char* text : {"True", "", "yes", "1e3", "007x", "12 apples", "18446744073709551616",
                           "-5M", "nan", "0x10", "."}) {
    EXPECT_EQ(parsed(text), Value(text));
  }
}

TEST(StateValue, ATypeWinsOverTheText) {
  EXPECT_EQ(parsed("true", ValueType::kString), Value("true"));
  EXPECT_EQ(parsed("250M", ValueType::kString), Value("250M"));
  EXPECT_EQ(parsed("4096", ValueType::kSize), Value(4096));
  EXPECT_EQ(parsed("4K", ValueType::kSize), Value(4096));
  EXPECT_EQ(parsed("0.5", ValueType::kNumber), Value(0.5));
  EXPECT_EQ(parsed("false", ValueType::kBool), Value(false));
  EXPECT_EQ(parsed(R"(["a"])", ValueType::kJson), Value(Array{"a"}));
}

TEST(StateValue, WhatIsNotOfTheTypeIsRefusedWithTheReason) {
  EXPECT_THAT(errorFor("250M", ValueType::kNumber), StartsWith("\"250M\" is no number."));
  EXPECT_THAT(errorFor("18446744073709551616", ValueType::kNumber), HasSubstr("64 bits"));
  EXPECT_EQ(errorFor("yes", ValueType::kBool), "\"yes\" is no boolean: write true or false");
  EXPECT_THAT(errorFor("10%", ValueType::kSize), HasSubstr("percentages are not known"));
  EXPECT_EQ(errorFor("{", ValueType::kJson),
            "\"{\" is no JSON: a name in double quotes is missing (byte 1)");
  EXPECT_THAT(errorFor("\xFF", ValueType::kString), HasSubstr("no UTF-8"));
}

TEST(StateValue, DataIsOnlyCounted) {
  EXPECT_EQ(printStateValue(Data{{1, 2, 3}}), "<3 bytes>");
  EXPECT_EQ(printStateValue(Data{{1}}), "<1 byte>");
  EXPECT_EQ(printStateValue("a\x1b"), "a\\x1b");
  EXPECT_EQ(printStateValue(Array{1, "a"}), "[1, \"a\"]");
}

TEST(KnownKeys, WhatTheDaemonWouldNotWorkWithIsObjectedTo) {
  EXPECT_EQ(objectionTo("SPACEKEEP_CACHE_ENABLED", true), std::nullopt);
  EXPECT_EQ(objectionTo("SPACEKEEP_CACHE_ENABLED", 1),
            "SPACEKEEP_CACHE_ENABLED is true or false, not a number");
  EXPECT_EQ(objectionTo("SPACEKEEP_FINISH_EARLY", "yes"),
            "SPACEKEEP_FINISH_EARLY is true or false, not a string");
  EXPECT_EQ(objectionTo("SPACEKEEP_LOW_SPACE_BYTES", 262'144'000), std::nullopt);
  EXPECT_THAT(*objectionTo("SPACEKEEP_LOW_SPACE_BYTES", 1),
              StartsWith("SPACEKEEP_LOW_SPACE_BYTES is 1, but must be a number of bytes from"));
  EXPECT_EQ(objectionTo("SPACEKEEP_LOW_SPACE_PERCENT", 0), std::nullopt);
  EXPECT_EQ(objectionTo("SPACEKEEP_LOW_SPACE_PERCENT", 50), std::nullopt);
  EXPECT_EQ(objectionTo("SPACEKEEP_LOW_SPACE_PERCENT", 50.5),
            "SPACEKEEP_LOW_SPACE_PERCENT is 50.5, but must be a number from 0 to 50 (percent); the "
            "default, 5, holds instead");
  EXPECT_NE(objectionTo("SPACEKEEP_LOW_SPACE_INODES_PERCENT", "5"), std::nullopt);
  EXPECT_NE(objectionTo("SPACEKEEP_USER_DEFAULTS", 1), std::nullopt);
  EXPECT_NE(objectionTo("SPACEKEEP_RECENT_SERVICE_STATS", 1), std::nullopt);
  EXPECT_EQ(objectionTo("somebody.elses.key", Array{}), std::nullopt);
}

TEST(KnownKeys, ANumberOfBytesIsShownAsASizeToo) {
  EXPECT_EQ(printValueOf("SPACEKEEP_LOW_SPACE_BYTES", 262'144'000), "262144000 (250.0 MiB)");
  EXPECT_EQ(printValueOf("SPACEKEEP_LOW_SPACE_BYTES", "much"), "much");
  EXPECT_EQ(printValueOf("other", 262'144'000), "262144000");
}

}  // namespace
}  // namespace spacekeep::ctl
