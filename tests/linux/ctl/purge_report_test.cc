#include "ctl/purge_report.h"

#include <gtest/gtest.h>

#include <cstdint>
#include <limits>
#include <string>

#include "ctl/json_text.h"

namespace spacekeep::ctl {
namespace {

constexpr std::uint64_t kMiB = 1 << 20;

/// Two services, of which one answers at once and the other never; the amount is not reached.
Dictionary outcomeWithASilentService() {
  return {{"SPACEKEEP_VOLUME", "/data"},
          {"SPACEKEEP_AMOUNT", 30 * kMiB},
          {"SPACEKEEP_AMOUNT_REPORTED", 40 * kMiB},
          {"SPACEKEEP_ELAPSED_TIME", 6.04},
          {"SPACEKEEP_FREESPACE_BEGIN", 100 * kMiB},
          {"SPACEKEEP_FREESPACE_END", 130 * kMiB},
          {"SPACEKEEP_URGENCY", 2},
          {"SPACEKEEP_URGENCY_1_OPERATION_INFO",
           Dictionary{{"SPACEKEEP_REPORTING_SERVICES", Dictionary{{"photos", 25 * kMiB}}},
                      {"SPACEKEEP_SERVICES_INFLIGHT", Array{"silent"}},
                      {"SPACEKEEP_URGENCY_1_TIMEOUT_SECONDS", 2}}},
          {"SPACEKEEP_URGENCY_2_OPERATION_INFO",
           Dictionary{{"SPACEKEEP_REPORTING_SERVICES", Dictionary{{"photos", 15 * kMiB}}},
                      {"SPACEKEEP_SERVICES_INFLIGHT", Array{"silent"}},
                      {"SPACEKEEP_URGENCY_2_TIMEOUT_SECONDS", 4}}}};
}

TEST(PurgeReport, TellsWhatEachServiceReportedAndWhoDidNotAnswer) {
  const PurgeReport report = purgeReport(outcomeWithASilentService(), 50 * kMiB);
  EXPECT_EQ(report.volume, "/data");
  EXPECT_EQ(report.asked_bytes, 50 * kMiB);
  EXPECT_EQ(report.freed_bytes, 30 * kMiB);
  EXPECT_EQ(report.reported_bytes, 40 * kMiB);
  EXPECT_FALSE(report.reached());
  ASSERT_EQ(report.urgencies.size(), 2U);
  EXPECT_EQ(report.urgencies[0].urgency, 1);
  ASSERT_EQ(report.urgencies[0].services.size(), 1U);
  EXPECT_EQ(report.urgencies[0].services[0].id, "photos");
  EXPECT_EQ(report.urgencies[0].services[0].reported_bytes, 25 * kMiB);
  EXPECT_EQ(report.urgencies[0].unanswered, std::vector<std::string>{"silent"});
  EXPECT_EQ(report.urgencies[1].timeout_seconds, 4U);
}

TEST(PurgeReport, TheTableShowsEveryUrgencyAndTheSums) {
  EXPECT_EQ(tableOf(purgeReport(outcomeWithASilentService(), 50 * kMiB), {}),
            "urgency  service      reported\n"
            "      1  photos       25.0 MiB\n"
            "      1  silent   did not answer within 2 s\n"
            "      2  photos       15.0 MiB\n"
            "      2  silent   did not answer within 4 s\n"
            "\n"
            "asked     50.0 MiB\n"
            "freed     30.0 MiB (100.0 MiB free before, 130.0 MiB after)\n"
            "reported  40.0 MiB by the services\n"
            "took      6.0 s\n"
            "result    not reached, 20.0 MiB missing\n");
}

TEST(PurgeReport, SaysWhatWasReportedBeforeTheLastAnswersThatTheTableLists) {
  const Dictionary outcome{
      {"SPACEKEEP_AMOUNT", 8 * kMiB},
      {"SPACEKEEP_AMOUNT_REPORTED", 8 * kMiB},
      {"SPACEKEEP_URGENCY_1_OPERATION_INFO",
       Dictionary{{"SPACEKEEP_REPORTING_SERVICES", Dictionary{{"one", 5 * kMiB}}}}}};
  EXPECT_NE(tableOf(purgeReport(outcome, 8 * kMiB), {})
                .find("reported  8.0 MiB by the services, 3.0 MiB of it "
                      "in answers before the last one"),
            std::string::npos);
}

TEST(PurgeReport, OnATerminalTooNarrowForItIdsLoseTheirMiddleAndLinesBreakBetweenWords) {
  const Dictionary outcome{
      {"SPACEKEEP_AMOUNT", 8 * kMiB},
      {"SPACEKEEP_AMOUNT_REPORTED", 8 * kMiB},
      {"SPACEKEEP_URGENCY_1_OPERATION_INFO",
       Dictionary{{"SPACEKEEP_REPORTING_SERVICES", Dictionary{{"com.example.photos", 8 * kMiB}}},
                  {"SPACEKEEP_SERVICES_INFLIGHT", Array{"com.example.downloads"}}}}};
  EXPECT_EQ(tableOf(purgeReport(outcome, 8 * kMiB), {.columns = 40, .terminal = true}),
            "urgency  service                reported\n"
            "      1  com.exa....photos       8.0 MiB\n"
            "      1  com.exa...wnloads  no answer\n"
            "\n"
            "asked     8.0 MiB\n"
            "freed     8.0 MiB (0 B free before, 0 B\n"
            "          after)\n"
            "reported  8.0 MiB by the services\n"
            "took      0.0 s\n"
            "result    reached\n");
}

TEST(PurgeReport, TheJsonHoldsTheSameInBytes) {
  EXPECT_EQ(jsonOf(purgeReport(outcomeWithASilentService(), 50 * kMiB)),
            R"({"asked_bytes":52428800,"cancelled":false,"elapsed_seconds":6.04,)"
            R"("free_after_bytes":136314880,"free_before_bytes":104857600,"freed_bytes":31457280,)"
            R"("reached":false,"reported_bytes":41943040,"urgencies":[)"
            R"({"services":[{"id":"photos","reported_bytes":26214400}],"timeout_seconds":2,)"
            R"("unanswered":["silent"],"urgency":1},)"
            R"({"services":[{"id":"photos","reported_bytes":15728640}],"timeout_seconds":4,)"
            R"("unanswered":["silent"],"urgency":2}],"volume":"/data"})");
}

TEST(PurgeReport, TheAmountIsReachedWhenExactlyAsMuchWasFreed) {
  const Dictionary outcome{{"SPACEKEEP_VOLUME", "/data"}, {"SPACEKEEP_AMOUNT", 1000}};
  EXPECT_TRUE(purgeReport(outcome, 1000).reached());
  EXPECT_FALSE(purgeReport(outcome, 1001).reached());
}

TEST(PurgeReport, AnUrgencyInWhichNobodyWasAskedSaysSo) {
  const Dictionary outcome{{"SPACEKEEP_AMOUNT", 2048},
                           {"SPACEKEEP_URGENCY_3_OPERATION_INFO",
                            Dictionary{{"SPACEKEEP_SERVICES_INFLIGHT", Array{}},
                                       {"SPACEKEEP_URGENCY_3_TIMEOUT_SECONDS", 6}}}};
  EXPECT_EQ(tableOf(purgeReport(outcome, 1024), {}),
            "urgency  service      reported\n"
            "      3  (nobody was asked)\n"
            "\n"
            "asked     1.0 KiB\n"
            "freed     2.0 KiB (0 B free before, 0 B after)\n"
            "reported  0 B by the services\n"
            "took      0.0 s\n"
            "result    reached\n");
}

TEST(PurgeReport, AnErrorIsNeverASuccessEvenWhenNothingWasAskedFor) {
  const Dictionary outcome{{"SPACEKEEP_ERROR", "Parameter error, no Amount key in info dict"}};
  const PurgeReport report = purgeReport(outcome, 0);
  EXPECT_FALSE(report.reached());
  EXPECT_NE(tableOf(report, {}).find("not done: Parameter error, no Amount key in info dict"),
            std::string::npos);
  EXPECT_NE(jsonOf(report).find(R"("error":"Parameter error)"), std::string::npos);
}

TEST(PurgeReport, WhatIsOfAnotherKindThanExpectedReadsAsAbsent) {
  const Dictionary outcome{{"SPACEKEEP_VOLUME", 7},
                           {"SPACEKEEP_AMOUNT", "many"},
                           {"SPACEKEEP_ELAPSED_TIME", "long"},
                           {"SPACEKEEP_URGENCY_1_OPERATION_INFO", "none"},
                           {"SPACEKEEP_URGENCY_2_OPERATION_INFO",
                            Dictionary{{"SPACEKEEP_REPORTING_SERVICES", Array{}},
                                       {"SPACEKEEP_SERVICES_INFLIGHT", Array{3, "a"}}}}};
  const PurgeReport report = purgeReport(outcome, 5);
  EXPECT_EQ(report.volume, "");
  EXPECT_EQ(report.freed_bytes, 0U);
  EXPECT_EQ(report.elapsed_seconds, 0);
  ASSERT_EQ(report.urgencies.size(), 1U);
  EXPECT_TRUE(report.urgencies[0].services.empty());
  EXPECT_EQ(report.urgencies[0].unanswered, std::vector<std::string>{"a"});
}

TEST(PurgeReport, ACancelledPurgeSaysSo) {
  const Dictionary outcome{{"SPACEKEEP_AMOUNT", 0}, {"SPACEKEEP_OPERATION_CANCELLED", true}};
  EXPECT_NE(tableOf(purgeReport(outcome, 1024), {})
                .find("not reached, 1.0 KiB missing (the purge was cancelled)"),
            std::string::npos);
}

TEST(PurgeReport, AServiceIdWithControlCharactersCannotWriteToTheTerminal) {
  const Dictionary outcome{
      {"SPACEKEEP_URGENCY_1_OPERATION_INFO",
       Dictionary{{"SPACEKEEP_REPORTING_SERVICES", Dictionary{{"evil\x1b[2J\n", 1}}}}}};
  const std::string table = tableOf(purgeReport(outcome, 1), {});
  EXPECT_EQ(table.find('\x1b'), std::string::npos);
  EXPECT_NE(table.find("evil"), std::string::npos);
}

TEST(JsonText, EveryKindOfValueIsValidJson) {
  EXPECT_EQ(jsonOf(Value("a \"b\" \\ \n\x01 \xC3\xA9")),
            "\"a \\\"b\\\" \\\\ \\u000a\\u0001 \xC3\xA9\"");
  EXPECT_EQ(jsonOf(Value(true)), "true");
  EXPECT_EQ(jsonOf(Value(std::numeric_limits<std::int64_t>::min())), "-9223372036854775808");
  EXPECT_EQ(jsonOf(Value(UINT64_MAX)), "18446744073709551615");
  EXPECT_EQ(jsonOf(Value(0.5)), "0.5");
  EXPECT_EQ(jsonOf(Value(std::numeric_limits<double>::infinity())), "null");
  EXPECT_EQ(jsonOf(Value(std::numeric_limits<double>::quiet_NaN())), "null");
  EXPECT_EQ(jsonOf(Value(Data{{1, 255}})), "[1,255]");
  EXPECT_EQ(jsonOf(Value(Date{1'500'000'000})), "1.5");
  EXPECT_EQ(jsonOf(Value(Array{})), "[]");
  EXPECT_EQ(jsonOf(Value(Array{Array{}, Dictionary{}, 1})), "[[],{},1]");
  EXPECT_EQ(jsonOf(Value(Dictionary{{"b", 1}, {"a", Array{"x", "y"}}})),
            R"({"a":["x","y"],"b":1})");
}

TEST(JsonText, BytesThatAreNoUtf8BecomeTheReplacementCharacter) {
  const std::string mark = "\xEF\xBF\xBD";
  EXPECT_EQ(jsonOf(Value(std::string("a\xFFz"))), "\"a" + mark + "z\"");
  EXPECT_EQ(jsonOf(Value(std::string("\xC0\xAF"))), "\"" + mark + mark + "\"");  // overlong
  EXPECT_EQ(jsonOf(Value(std::string("\xED\xA0\x80"))),
            "\"" + mark + mark + mark + "\"");                                   // surrogate
  EXPECT_EQ(jsonOf(Value(std::string("\xE2\x82"))), "\"" + mark + mark + "\"");  // cut off
  EXPECT_EQ(jsonOf(Value(std::string("\xF0\x9F\x98\x80"))), "\"\xF0\x9F\x98\x80\"");
}

}  // namespace
}  // namespace spacekeep::ctl
