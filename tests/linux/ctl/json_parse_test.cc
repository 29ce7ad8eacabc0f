#include "ctl/json_parse.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <cstdint>
#include <limits>
#include <string>

#include "ctl/json_text.h"

namespace spacekeep::ctl {
namespace {

using testing::HasSubstr;

Value parsed(std::string_view text) {
  const auto result = parseJson(text);
  const auto* error = std::get_if<JsonError>(&result);
  EXPECT_EQ(error, nullptr) << text << ": " << error->text;
  return error == nullptr ? std::get<Value>(result) : Value("(error)");
}

struct GoodCase {
  const char* text;
  Value value;
};

TEST(JsonParse, EveryKindOfValue) {
  const GoodCase cases[] = {
      {"true", true},
      {" false\n", false},
      {"0", 0},
      {"-0", 0},
      {"-9223372036854775808", std::numeric_limits<std::int64_t>::min()},
      {"18446744073709551615", UINT64_MAX},
      {"18446744073709551616", 18446744073709551616.0},
      {"1.5e3", 1500.0},
      {"2E-1", 0.2},
      {"\"\"", ""},
      {R"("a\"\\\/\b\f\n\r\tz")", "a\"\\/\b\f\n\r\tz"},
      {R"("\u00e9\u20AC\ud83D\uDe00")", "\u00E9\u20AC\U0001F600"},
      {"\"\u00E9\"", "\u00E9"},
      {"[]", Array{}},
      {"{ }", Dictionary{}},
      {R"( [ 1 , "a" , [ ] ] )", Array{1, "a", Array{}}},
      {R"({"b":1,"a":{"c":[true]},"b":2})",
       Dictionary{{"a", Dictionary{{"c", Array{true}}}}, {"b", 2}}},
  };
  for (const auto& c : cases) EXPECT_EQ(parsed(c.text), c.value) << c.text;
}

TEST(JsonParse, WhatTheToolWritesItReadsBack) {
  const Value value = Dictionary{{"a", Array{1, -2, 0.5, true, "x\n\u00E9"}}, {"b", Dictionary{}}};
  EXPECT_EQ(parsed(jsonOf(value)), value);
}

struct BadCase {
  std::string text;
  const char* error;
};

TEST(JsonParse, WhatIsNoJsonIsRefusedWithTheReasonAndThePlace) {
  const BadCase cases[] = {
      {"", "a value is missing (byte 0)"},
      {"null", "null is no value; \"state unset\" removes a key (byte 0)"},
      {"tru", "this is no JSON value (byte 0)"},
      {"truex", "there is more behind the value (byte 4)"},
      {"01", "this is no number (byte 0)"},
      {"+1", "this is no number (byte 0)"},
      {"1.", "this is no number (byte 0)"},
      {"1e", "this is no number (byte 0)"},
      {"1e999", "this is no number (byte 0)"},
      {"-", "this is no number (byte 0)"},
      {"[1 2]", "\",\" or \"]\" is missing (byte 3)"},
      {"[1,]", "this is no JSON value (byte 3)"},
      {"[", "a value is missing (byte 1)"},
      {"{1:2}", "a name in double quotes is missing (byte 1)"},
      {"{\"a\"}", "\":\" is missing (byte 4)"},
      {"{\"a\":1", "\",\" or \"}\" is missing (byte 6)"},
      {"\"abc", "the closing quote of a string is missing (byte 4)"},
      {"\"\\x\"", "this escape is not known (byte 2)"},
      {"\"\\", "this escape is not known (byte 2)"},
      {"\"\\u12\"", "\\u needs four hexadecimal digits (byte 3)"},
      {"\"\\u-123\"", "\\u needs four hexadecimal digits (byte 3)"},
      {"\"\\ud800\"", "half a character (byte 7)"},
      {"\"\\udc00\"", "half a character (byte 7)"},
      {"\"\\u0000\"", "a string cannot hold a zero character (byte 7)"},
      {"\"a\nb\"", "a control character must be escaped (byte 2)"},
      {"\"\xFF\"", "this is no UTF-8 (byte 1)"},
  };
  for (const auto& c : cases) {
    const auto result = parseJson(c.text);
    ASSERT_TRUE(std::holds_alternative<JsonError>(result)) << c.text;
    EXPECT_EQ(std::get<JsonError>(result).text, c.error) << c.text;
  }
}

std::string nested(int depth) {
  return std::string(static_cast<std::size_t>(depth), '[') +
         std::string(static_cast<std::size_t>(depth), ']');
}

TEST(JsonParse, NestingHasABound) {
  EXPECT_TRUE(std::holds_alternative<Value>(parseJson(nested(kMaxValueDepth))));
  const auto result = parseJson(nested(kMaxValueDepth + 1));
  ASSERT_TRUE(std::holds_alternative<JsonError>(result));
  EXPECT_THAT(std::get<JsonError>(result).text, HasSubstr("nested deeper than 32"));
  EXPECT_TRUE(std::holds_alternative<JsonError>(parseJson(std::string(1'000'000, '['))));
}

}  // namespace
}  // namespace spacekeep::ctl
