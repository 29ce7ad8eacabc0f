#include "ctl/text_layout.h"

#include <gtest/gtest.h>

#include <cstdint>
#include <limits>
#include <string>

namespace spacekeep::ctl {
namespace {

TEST(TextLayout, WidthsAreInCharactersNotInBytes) {
  EXPECT_EQ(displayWidth("caf\u00E9"), 4U);
  EXPECT_EQ(padded("caf\u00E9", 6), "caf\u00E9  ");
  EXPECT_EQ(rightAligned("caf\u00E9", 6), "  caf\u00E9");
  EXPECT_EQ(padded("longer", 3), "longer");
  EXPECT_EQ(rightAligned("longer", 3), "longer");
}

TEST(TextLayout, WhatIsTooLongLosesItsMiddle) {
  EXPECT_EQ(shortened("com.example.photos", 18), "com.example.photos");
  EXPECT_EQ(shortened("com.example.photos", 11), "com....otos");
  EXPECT_EQ(shortened("com.example.photos", 4), "...s");
  EXPECT_EQ(shortened("com.example.photos", 3), "com");
  EXPECT_EQ(shortened("com.example.photos", 0), "");
  EXPECT_EQ(shortened("\u00E9\u00E9\u00E9\u00E9\u00E9\u00E9", 5), "\u00E9...\u00E9");
}

TEST(TextLayout, LinesBreakBetweenWordsAndKeepTheirIndent) {
  EXPECT_EQ(wrapped("one two three", 80, 0), "one two three");
  EXPECT_EQ(wrapped("one two three", 7, 0), "one two\nthree");
  EXPECT_EQ(wrapped("one two three", 9, 2), "  one two\n  three");
  EXPECT_EQ(wrapped("one two three", 8, 2), "  one\n  two\n  three");
  EXPECT_EQ(wrapped("a incomprehensible b", 5, 0), "a\nincomprehensible\nb");
  EXPECT_EQ(wrapped("", 5, 2), "  ");
}

TEST(TextLayout, CountsAndSizesAndShares) {
  EXPECT_EQ(printCount(0), "0");
  EXPECT_EQ(printCount(999), "999");
  EXPECT_EQ(printCount(1000), "1,000");
  EXPECT_EQ(printCount(UINT64_MAX), "18,446,744,073,709,551,615");
  EXPECT_EQ(printSignedSize(1536), "1.5 KiB");
  EXPECT_EQ(printSignedSize(-1536), "-1.5 KiB");
  EXPECT_EQ(printSignedSize(std::numeric_limits<std::int64_t>::min()), "-8.0 EiB");
  EXPECT_EQ(printShare(29, 100), "29.0 %");
  EXPECT_EQ(printShare(1, 3), "33.3 %");
  EXPECT_EQ(printShare(1999, 2000), "99.9 %");
  EXPECT_EQ(printShare(5, 0), "-");
}

TEST(TextLayout, AgesInTheUnitThatSaysMost) {
  EXPECT_EQ(printAge(-3), "0 s");
  EXPECT_EQ(printAge(12.9), "12 s");
  EXPECT_EQ(printAge(119.9), "119 s");
  EXPECT_EQ(printAge(120), "2 min");
  EXPECT_EQ(printAge(7199), "119 min");
  EXPECT_EQ(printAge(7200), "2 h");
  EXPECT_EQ(printAge(172'800), "2 days");
}

TEST(TextLayout, TextOfOthersCanDoNothingToATerminal) {
  EXPECT_EQ(harmless("a\x1b[2Jb\n"), "a\\x1b[2Jb\\n");
}

}  // namespace
}  // namespace spacekeep::ctl
