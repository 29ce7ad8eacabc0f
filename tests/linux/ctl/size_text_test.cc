#include "ctl/size_text.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <cstdint>
#include <string>
#include <variant>

namespace spacekeep::ctl {
namespace {

using testing::HasSubstr;

struct GoodCase {
  const char* text;
  std::uint64_t bytes;
};

TEST(SizeText, SizesAsPeopleWriteThem) {
  const GoodCase cases[] = {
      {"0", 0},
      {"1000000", 1'000'000},
      {"512B", 512},
      {"1k", 1024},
      {"1K", 1024},
      {"1KiB", 1024},
      {"1kib", 1024},
      {"1kB", 1000},
      {"1KB", 1000},
      {"500M", 524'288'000},
      {"500MB", 500'000'000},
      {"500 MB", 500'000'000},
      {"2g", 2'147'483'648},
      {"1.5GiB", 1'610'612'736},
      {"1.5GB", 1'500'000'000},
      {"0.5K", 512},
      {"0.3K", 307},  // 307.2, and there are no fifths of a byte
      {"000000000000000000000000000001", 1},
      {"3T", 3'298'534'883'328},
      {"1P", 1'125'899'906'842'624},
      {"2PB", 2'000'000'000'000'000},
      {"1.000000000000000000000000000000K", 1024},
      {"18446744073709551615", UINT64_MAX},
      {"16383.9P", 18'446'631'483'718'867'353U},
  };
  for (const auto& c : cases) {
    const auto size = parseSize(c.text);
    ASSERT_TRUE(std::holds_alternative<std::uint64_t>(size))
        << c.text << ": " << std::get<SizeError>(size).text;
    EXPECT_EQ(std::get<std::uint64_t>(size), c.bytes) << c.text;
  }
}

TEST(SizeText, ControlCharactersOfWhatIsNoSizeAreShownEscaped) {
  for (const char* text : {"12\x1b[31m", "\r500M", "5\n\x07"}) {
    const auto size = parseSize(text);
    ASSERT_TRUE(std::holds_alternative<SizeError>(size)) << text;
    for (const char c : std::get<SizeError>(size).text) EXPECT_GE(c, ' ') << text;
  }
}

struct BadCase {
  const char* text;
  const char* fault;
};

TEST(SizeText, WhatIsNoSizeIsRefusedWithTheReasonAndExamples) {
  const BadCase cases[] = {
      {"", "it is empty"},
      {"-5M", "it is negative"},
      {"M", "it does not begin with a digit"},
      {".5M", "it does not begin with a digit"},
      {" 5M", "it does not begin with a digit"},
      {"+5M", "it does not begin with a digit"},
      {"10%", "percentages are not known, give an amount"},
      {"1,5G", "write a point, not a comma, before the fraction"},
      {"1.G", "there is no digit after the point"},
      {"1.5", "there are no fractions of a byte"},
      {"1.5B", "there are no fractions of a byte"},
      {"5X", "the unit \"X\" is not known"},
      {"5Kib2", "the unit \"Kib2\" is not known"},
      {"5iB", "the unit \"iB\" is not known"},
      {"5M ", "the unit \"M \" is not known"},
      {"5E", "the unit \"E\" is not known"},
      {"1.2.3M", "the unit \".3M\" is not known"},
      {"0x10", "the unit \"x10\" is not known"},
      {"18446744073709551616", "it is more than any volume holds"},
      {"16384P", "it is more than any volume holds"},
      {"999999999999999999999999999999999999999999K", "it is more than any volume holds"},
  };
  for (const auto& c : cases) {
    const auto size = parseSize(c.text);
    ASSERT_TRUE(std::holds_alternative<SizeError>(size)) << c.text;
    EXPECT_THAT(std::get<SizeError>(size).text, HasSubstr(c.fault)) << c.text;
    EXPECT_THAT(std::get<SizeError>(size).text, HasSubstr("Sizes look like 1000000, 500M, 1.5GiB"));
  }
}

TEST(SizeText, SizesArePrintedWithOneDecimalThatIsNeverCarriedUp) {
  const GoodCase cases[] = {
      {"0 B", 0},
      {"1023 B", 1023},
      {"1.0 KiB", 1024},
      {"1.5 KiB", 1536},
      {"1023.9 KiB", 1'048'575},
      {"1.0 MiB", 1'048'576},
      {"499.9 MiB", 524'287'999},
      {"500.0 MiB", 524'288'000},
      {"1.5 GiB", 1'610'612'736},
      {"15.9 EiB", UINT64_MAX},
  };
  for (const auto& c : cases) EXPECT_EQ(printSize(c.bytes), c.text);
}

}  // namespace
}  // namespace spacekeep::ctl
