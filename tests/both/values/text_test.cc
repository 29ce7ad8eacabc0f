#include "support/values/text.h"

#include <gtest/gtest.h>

#include <cmath>
#include <cstdint>

namespace spacekeep {
namespace {

using namespace std::string_literals;

Value nested(int depth) {
  Value value = 1;
  for (int i = 0; i < depth; ++i) value = Array{value};
  return value;
}

TEST(TextOf, EveryKind) {
  EXPECT_EQ(textOf(Value("plain \"text\" \\")), "plain \"text\" \\");
  EXPECT_EQ(textOf(Value(true)), "true");
  EXPECT_EQ(textOf(Value(false)), "false");
  EXPECT_EQ(textOf(Value(INT64_MIN)), "-9223372036854775808");
  EXPECT_EQ(textOf(Value(UINT64_MAX)), "18446744073709551615");
  EXPECT_EQ(textOf(Value(0.5)), "0.5");
  EXPECT_EQ(textOf(Value(3.0)), "3");
  EXPECT_EQ(textOf(Value(std::nan(""))), "nan");
  EXPECT_EQ(textOf(Value(Data{{0x0a, 0xff}})), "<0aff>");
  EXPECT_EQ(textOf(Value(Data{})), "<>");
  EXPECT_EQ(textOf(Value(Array{})), "[]");
  EXPECT_EQ(textOf(Dictionary{}), "{}");
  EXPECT_EQ(textOf(static_cast<const Value*>(nullptr)), "(none)");
}

TEST(TextOf, ContainersShowTheirContentQuoted) {
  const Dictionary info{
      {"B", Array{2, "x\"y\\", true}}, {"A", 1}, {"C", Dictionary{{"k", Data{{1}}}}}};
  EXPECT_EQ(textOf(info), R"({"A": 1, "B": [2, "x\"y\\", true], "C": {"k": <01>}})");
  EXPECT_EQ(textOf(Value(info)), textOf(info));
}

TEST(TextOf, DatesAreIso8601InUtc) {
  EXPECT_EQ(textOf(Value(Date{0})), "1970-01-01T00:00:00Z");
  EXPECT_EQ(textOf(Value(Date{1'700'000'000'000'000'000})), "2023-11-14T22:13:20Z");
  EXPECT_EQ(textOf(Value(Date{1'700'000'000'000'000'001})), "2023-11-14T22:13:20.000000001Z");
  EXPECT_EQ(textOf(Value(Date{-1})), "1969-12-31T23:59:59.999999999Z");
  EXPECT_EQ(textOf(Value(Date{INT64_MIN})), "1677-09-21T00:12:43.145224192Z");
  EXPECT_EQ(textOf(Value(Date{INT64_MAX})), "2262-04-11T23:47:16.854775807Z");
}

TEST(TextOf, ControlCharactersAndBrokenUtf8AreEscaped) {
  EXPECT_EQ(textOf(Value("a\nb\rc\td\x1b[0m\x7f")), "a\\nb\\rc\\td\\x1b[0m\\x7f");
  EXPECT_EQ(textOf(Value("\0"s)), "\\x00");
  EXPECT_EQ(textOf(Value("\xc2\x85|\xc2\xa0|\xc3\xa9|\xf0\x9f\x98\x80")),
            "\\xc2\\x85|\xc2\xa0|\xc3\xa9|\xf0\x9f\x98\x80");
  EXPECT_EQ(textOf(Value("\xff\xc3(\xed\xa0\x80\xe2\x82")), "\\xff\\xc3(\\xed\\xa0\\x80\\xe2\\x82");
  EXPECT_EQ(textOf(Dictionary{{"k\n", "v\n"}}), "{\"k\\n\": \"v\\n\"}");
  EXPECT_EQ(lineOf("a\nb"), "a\\nb");
}

TEST(TextOf, LongTextIsCutWithAnEllipsisBetweenCharacters) {
  EXPECT_EQ(textOf(Value(std::string(kMaxTextBytes, 'x'))), std::string(kMaxTextBytes, 'x'));
  const std::string cut = textOf(Value(std::string(kMaxTextBytes + 1, 'x')));
  EXPECT_EQ(cut, std::string(kMaxTextBytes - 3, 'x') + "...");
  std::string euros;
  while (euros.size() <= kMaxTextBytes) euros += "\xe2\x82\xac";
  const std::string cut_euros = textOf(Value(euros));
  EXPECT_LE(cut_euros.size(), kMaxTextBytes);
  EXPECT_TRUE(isUtf8(cut_euros));
  EXPECT_TRUE(cut_euros.ends_with("\xe2\x82\xac..."));
}

TEST(TextOf, ABigContainerIsCutAndNotWalkedToItsEnd) {
  Array array(200'000, Value("entry"));
  const std::string text = textOf(Value(std::move(array)));
  EXPECT_LE(text.size(), kMaxTextBytes);
  EXPECT_TRUE(text.ends_with("..."));
}

TEST(TextOf, LongDataShowsItsStart) {
  EXPECT_EQ(
      textOf(Value(Data{std::vector<std::uint8_t>(kMaxDataBytesInText, 0x0a)})), "<" + [] {
        std::string hex;
        for (std::size_t i = 0; i < kMaxDataBytesInText; ++i) hex += "0a";
        return hex;
      }() + ">");
  EXPECT_TRUE(textOf(Value(Data{std::vector<std::uint8_t>(1'000'000, 1)})).ends_with("01 ...>"));
}

TEST(TextOf, TooDeepNestingIsAnEllipsis) {
  EXPECT_EQ(textOf(nested(kMaxValueDepth)),
            std::string(kMaxValueDepth, '[') + "1" + std::string(kMaxValueDepth, ']'));
  EXPECT_EQ(textOf(nested(kMaxValueDepth + 5)),
            std::string(kMaxValueDepth, '[') + "..." + std::string(kMaxValueDepth, ']'));
}

TEST(Utf8, OverlongSurrogateAndTooLargeFormsAreRefused) {
  for (const char* good : {"", "a", "\x7f", "\xc2\x80", "\xdf\xbf", "\xe0\xa0\x80", "\xed\x9f\xbf",
                           "\xee\x80\x80", "\xf0\x90\x80\x80", "\xf4\x8f\xbf\xbf"}) {
    EXPECT_TRUE(isUtf8(good)) << testing::PrintToString(std::string(good));
  }
  for (const char* bad :
       {"\x80", "\xc0\x80", "\xc1\xbf", "\xe0\x9f\xbf", "\xed\xa0\x80", "\xf0\x8f\xbf\xbf",
        "\xf4\x90\x80\x80", "\xf5\x80\x80\x80", "\xc2", "\xe2\x82", "a\xff"}) {
    EXPECT_FALSE(isUtf8(bad)) << testing::PrintToString(std::string(bad));
  }
}

}  // namespace
}  // namespace spacekeep
