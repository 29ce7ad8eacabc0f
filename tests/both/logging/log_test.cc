#include "support/logging/log.h"

#include <gtest/gtest.h>

#include <cmath>
#include <cstdio>
#include <limits>

#include "tests/helpers/log_capture.h"

namespace spacekeep {
namespace {

using test::LogCapture;

std::string format(const char* text, const std::vector<LogArgument>& arguments) {
  return formatLogLine(text, arguments);
}

std::string printed(const char* text, double number) {
  char buffer[512];
#pragma GCC diagnostic push
#pragma GCC diagnostic ignored "-Wformat-nonliteral"
  std::snprintf(buffer, sizeof(buffer), text, number);
#pragma GCC diagnostic pop
  return buffer;
}

TEST(LogGating, TracingGoesOutWithoutAHandleAndProblemsDoNot) {
  LogCapture log(std::nullopt);
  logTrace("%s ENTRY", "purge");
  logProblem("%s refused", "purge");
  ASSERT_EQ(log.lines().size(), 1u);
  EXPECT_EQ(log.lines()[0].level, 5);
  EXPECT_EQ(log.lines()[0].category, "Spacekeep");
  EXPECT_EQ(log.lines()[0].format, "%s ENTRY");
  EXPECT_EQ(log.lines()[0].text, "purge ENTRY");
}

TEST(LogGating, EachLevelOfTheHandleLetsThroughWhatItShould) {
  struct Case {
    std::int32_t level;
    std::size_t traces, problems;
  };
  for (const Case& expected : {Case{-1, 0, 0}, Case{2, 0, 0}, Case{3, 0, 1}, Case{4, 0, 1},
                               Case{5, 1, 1}, Case{9, 1, 1}}) {
    LogCapture log(expected.level);
    logTrace("%s t", "op");
    logProblem("%s p", "op");
    EXPECT_EQ(log.count(kLogTrace, "op t"), expected.traces) << expected.level;
    EXPECT_EQ(log.count(kLogProblem, "op p"), expected.problems) << expected.level;
  }
}

TEST(LogGating, ALevelThatChangesTakesEffectAtOnce) {
  LogCapture log(4);
  logTrace("%s one", "op");
  log.handle()->level = 5;
  logTrace("%s two", "op");
  EXPECT_EQ(log.texts(kLogTrace), std::vector<std::string>{"op two"});
}

TEST(LogGating, TheCaptureGivesBackWhatWasThere) {
  LogHandle handle;
  setLogHandle(&handle);
  { LogCapture log; }
  EXPECT_EQ(getLogHandle(), &handle);
  EXPECT_EQ(gMOLogWrite.load(), &writeLogLine);
  setLogHandle(nullptr);
}

TEST(LogCalls, EveryKindOfArgumentReachesTheLine) {
  LogCapture log;
  const std::string id = "com.example.cache";
  const Dictionary info{{"A", 1}, {"B", "x"}};
  const Value number = 7;
  logTrace("%s %s %d %u %lld %llu %f %@ %@ %@ %@ %%", __func__, id, -3, 4u, std::int64_t{-5},
           std::uint64_t{6}, 0.5, info, number, &number, nullptr);
  EXPECT_EQ(log.texts(kLogTrace).at(0),
            std::string(__func__) +
                " com.example.cache -3 4 -5 6 0.500000 {\"A\": 1, \"B\": \"x\"} 7 7 (none) %");
}

TEST(LogCalls, ANullTextIsSaidToBeNone) {
  LogCapture log;
  const char* nothing = nullptr;
  const Dictionary* no_info = nullptr;
  logProblem("%s %@ %@", "op", nothing, no_info);
  EXPECT_EQ(log.texts(kLogProblem).at(0), "op (none) (none)");
}

TEST(LogFormat, DoublesPrintAsPrintfPrintsThem) {
  for (const double number :
       {0.0, -0.0, 1.0, 0.1, 2.5e-7, 5e-7, 1234567.0000005, -3.9999996, 1e300,
        std::numeric_limits<double>::max(), std::numeric_limits<double>::denorm_min(),
        std::numeric_limits<double>::infinity(), -std::numeric_limits<double>::infinity(),
        std::nan("")}) {
    EXPECT_EQ(format("%f", {number}), printed("%f", number));
  }
}

TEST(LogFormat, IntegersPrintAtTheWidthOfTheirPlaceholder) {
  EXPECT_EQ(format("%d", {std::int64_t{INT32_MIN}}), "-2147483648");
  EXPECT_EQ(format("%u", {std::uint64_t{UINT32_MAX}}), "4294967295");
  EXPECT_EQ(format("%lld", {std::int64_t{INT64_MIN}}), "-9223372036854775808");
  EXPECT_EQ(format("%llu", {std::uint64_t{UINT64_MAX}}), "18446744073709551615");
  EXPECT_EQ(format("%lld", {std::uint64_t{UINT64_MAX}}), "-1");
  EXPECT_EQ(format("%llu", {std::int64_t{-1}}), "18446744073709551615");
  EXPECT_EQ(format("%@", {std::int64_t{-1}}), "-1");
}

TEST(LogFormat, APlaceholderWithoutAnArgumentStaysAsItStands) {
  EXPECT_EQ(format("%s %@ %llu %f %d", {std::string_view("op")}), "op %@ %llu %f %d");
}

TEST(LogFormat, AnUnknownPlaceholderStaysAndTakesNoArgument) {
  EXPECT_EQ(format("%x %q 100% %", {std::string_view("op")}), "%x %q 100% %");
  EXPECT_EQ(format("%x %s", {std::string_view("op")}), "%x op");
}

TEST(LogFormat, AnArgumentOfAnotherKindPrintsAsItsOwnKind) {
  EXPECT_EQ(format("%d", {std::string_view("text")}), "text");
  EXPECT_EQ(format("%s", {std::int64_t{-4}}), "-4");
  EXPECT_EQ(format("%d", {1.5}), "1.500000");
  EXPECT_EQ(format("%f", {std::int64_t{2}}), "2.000000");
}

TEST(LogFormat, AnArgumentCannotForgeALineOrAPlaceholder) {
  EXPECT_EQ(format("%s %@", {std::string_view("op"), std::string_view("a\nfake %s \x1b[31m")}),
            "op a\\nfake %s \\x1b[31m");
}

TEST(LogFormat, ALongArgumentIsCut) {
  const std::string longest(3'000'000, 'x');
  EXPECT_LT(format("%@", {std::string_view(longest)}).size(), 20'000u);
}

TEST(LogWriter, TheDefaultWriterWritesOneLineToStandardError) {
  LogHandle handle;
  setLogHandle(&handle);
  testing::internal::CaptureStderr();
  logProblem("%s volume %@ is\tfull", "purge", "/data\n");
  EXPECT_EQ(testing::internal::GetCapturedStderr(),
            "Spacekeep[3] purge volume /data\\n is\tfull\n");
  setLogHandle(nullptr);
}

}  // namespace
}  // namespace spacekeep
