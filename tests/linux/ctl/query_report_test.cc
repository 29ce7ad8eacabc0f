#include "ctl/query_report.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cstdint>
#include <string>

#include "purgeable/recent_archive.h"

namespace spacekeep::ctl {
namespace {

constexpr std::uint64_t kMiB = 1 << 20;
constexpr std::int64_t kSecond = 1'000'000'000;
constexpr Date kNow{1'800'000'000 * kSecond};
constexpr MeasuredSpace kSpace{.size_bytes = 1000 * kMiB, .free_bytes = 200 * kMiB};

Date secondsAgo(std::int64_t seconds) { return Date{kNow.unix_ns - seconds * kSecond}; }

/// The daemon's memory of "/data", as it stands in the client state.
Value archiveOf(const AnswerDates& dates) {
  SpacekeepRecentVolumeInfo volume{.timestamp = kNow, .volumeName = "/data"};
  for (const auto& [id, date] : dates)
    volume.services.emplace(id, SpacekeepRecentServiceInfo{Value(1), date});
  return archivedRecentInfo(SpacekeepRecentInfo({{"/data", volume}}));
}

const AnswerDates kBefore{{"com.example.photos", secondsAgo(12)},
                          {"com.example.old", secondsAgo(130)}};
const AnswerDates kAfter{{"com.example.photos", secondsAgo(12)},
                         {"com.example.old", secondsAgo(0)},
                         {"com.example.odd", secondsAgo(1)}};
const MemoryOfDaemon kMemory{.before = kBefore, .after = kAfter, .now = kNow};

Dictionary answer() {
  return {{"com.example.photos", 50 * kMiB},
          {"com.example.old", 100 * kMiB},
          {"com.example.odd", "much"},
          {"SPACEKEEP_TOTAL_AVAILABLE", 150 * kMiB},
          {"SPACEKEEP_VOLUME", "/data"}};
}

QueryReport reportWithout(const MemoryOfDaemon& memory) {
  return queryReport(answer(), memory, {});
}

TEST(RecentAnswers, TheDatesOfTheVolumeComeOutOfTheDaemonsRecord) {
  EXPECT_EQ(answerDates(archiveOf(kBefore), "/data"), kBefore);
  EXPECT_EQ(answerDates(archiveOf(kBefore), "/other"), AnswerDates{});
  EXPECT_EQ(answerDates(std::nullopt, "/data"), AnswerDates{});
}

TEST(RecentAnswers, WhatIsNotTheRecordGivesNothing) {
  EXPECT_EQ(answerDates(Value("text"), "/data"), std::nullopt);
  EXPECT_EQ(answerDates(Value(Data{{1, 2, 3}}), "/data"), std::nullopt);
  EXPECT_EQ(answerDates(Value(Data{}), "/data"), std::nullopt);
}

TEST(RecentAnswers, AnUnchangedDateIsMemoryAndAFreshOneAQuestion) {
  EXPECT_EQ(originOf("com.example.photos", kBefore, kAfter, kNow),
            (AnswerOrigin{.from_memory = true, .age_seconds = 12}));
  EXPECT_EQ(originOf("com.example.old", kBefore, kAfter, kNow),
            (AnswerOrigin{.from_memory = false, .age_seconds = 0}));
  EXPECT_EQ(originOf("com.example.odd", kBefore, kAfter, kNow),
            (AnswerOrigin{.from_memory = false, .age_seconds = 1}));
  EXPECT_EQ(originOf("com.example.gone", kBefore, kAfter, kNow), std::nullopt);
}

TEST(RecentAnswers, ADateAheadOfTheClockIsNotOlderThanNow) {
  const AnswerDates ahead{{"a", Date{kNow.unix_ns + 5 * kSecond}}};
  EXPECT_EQ(originOf("a", ahead, ahead, kNow),
            (AnswerOrigin{.from_memory = true, .age_seconds = 0}));
}

TEST(RecentAnswers, InWords) {
  EXPECT_EQ(textOf(AnswerOrigin{.from_memory = true, .age_seconds = 12.7}),
            "from memory, 12 s ago");
  EXPECT_EQ(textOf(AnswerOrigin{.from_memory = false, .age_seconds = 0}), "asked now");
  EXPECT_EQ(textOf(std::optional<AnswerOrigin>()), "");
}

TEST(QueryReport, ServicesAreSortedByAmountAndThoseWithoutANumberComeLast) {
  Dictionary info = answer();
  info.set("com.example.twin", 50 * kMiB);
  info.set("com.example.debt", -1);
  const QueryReport report = queryReport(info, kMemory, kSpace);
  ASSERT_EQ(report.services.size(), 5U);
  EXPECT_EQ(report.services[0].id, "com.example.old");
  EXPECT_EQ(report.services[1].id, "com.example.photos");
  EXPECT_EQ(report.services[2].id, "com.example.twin");
  EXPECT_EQ(report.services[3].id, "com.example.debt");
  EXPECT_EQ(report.services[4].id, "com.example.odd");
  EXPECT_EQ(report.services[4].bytes, std::nullopt);
  EXPECT_EQ(report.total_bytes, 150 * std::int64_t{kMiB});
}

TEST(QueryReport, TheSummaryTellsTotalShareAndWhatCameFromMemory) {
  EXPECT_EQ(summaryOf(queryReport(answer(), kMemory, kSpace), {}),
            "150.0 MiB could be freed on /data, 15.0 % of its 1000.0 MiB (200.0 MiB are free now)\n"
            "2 services asked now, 1 from memory, at most 12 s old\n"
            "1 service gave no number and is not counted\n");
}

TEST(QueryReport, TheSummaryIsOneLineWhenNothingElseIsKnown) {
  const Dictionary info{
      {"a", 1024}, {"SPACEKEEP_TOTAL_AVAILABLE", 1024}, {"SPACEKEEP_VOLUME", "/data"}};
  EXPECT_EQ(summaryOf(queryReport(info, {.before = {}, .after = {}, .now = kNow}, {}), {}),
            "1.0 KiB could be freed on /data\n");
  const AnswerDates dates{{"a", secondsAgo(119)}};
  EXPECT_EQ(summaryOf(queryReport(info, {.before = dates, .after = dates, .now = kNow}, {}), {}),
            "1.0 KiB could be freed on /data\n"
            "1 service from memory, at most 119 s old\n");
  EXPECT_EQ(
      summaryOf(queryReport(info, {.before = AnswerDates{}, .after = dates, .now = kNow}, {}), {}),
      "1.0 KiB could be freed on /data\n"
      "1 service asked now\n");
}

TEST(QueryReport, ATerminalGetsTheSummaryInLinesOfItsWidth) {
  EXPECT_EQ(summaryOf(queryReport(answer(), kMemory, kSpace), {.columns = 40, .terminal = true}),
            "150.0 MiB could be freed on /data, 15.0\n"
            "% of its 1000.0 MiB (200.0 MiB are free\n"
            "now)\n"
            "2 services asked now, 1 from memory, at\n"
            "most 12 s old\n"
            "1 service gave no number and is not\n"
            "counted\n");
}

TEST(QueryTable, ItemizedHasALinePerServiceWithABarAndItsOrigin) {
  EXPECT_EQ(itemizedTableOf(queryReport(answer(), kMemory, kSpace), {}),
            "service             could free\n"
            "com.example.old      100.0 MiB  #########################  asked now\n"
            "com.example.photos    50.0 MiB  ############.............  from memory, 12 s ago\n"
            "com.example.odd              ?  .........................  asked now\n"
            "\n"
            "total                150.0 MiB\n"
            "15.0 % of /data, which has 1000.0 MiB (200.0 MiB are free now)\n"
            "? is an answer that is not a number; it is not in the total\n");
}

TEST(QueryTable, WithoutAMemoryToReadThereIsNoSuchColumn) {
  const MemoryOfDaemon half{.before = kBefore, .after = std::nullopt, .now = kNow};
  EXPECT_EQ(itemizedTableOf(reportWithout(half), {.columns = 60}),
            "service             could free\n"
            "com.example.old      100.0 MiB  ############################\n"
            "com.example.photos    50.0 MiB  ##############..............\n"
            "com.example.odd              ?  ............................\n"
            "\n"
            "total                150.0 MiB\n"
            "on /data\n"
            "? is an answer that is not a number; it is not in the total\n");
}

TEST(QueryTable, OnANarrowTerminalEachServiceHasTwoLines) {
  EXPECT_EQ(
      itemizedTableOf(queryReport(answer(), kMemory, kSpace), {.columns = 40, .terminal = true}),
      "service             could free\n"
      "com.example.old      100.0 MiB\n"
      "  ###############  asked now\n"
      "com.example.photos    50.0 MiB\n"
      "  #######........  from memory, 12 s ago\n"
      "com.example.odd              ?\n"
      "  ...............  asked now\n"
      "\n"
      "total                150.0 MiB\n"
      "15.0 % of /data, which has 1000.0 MiB\n"
      "(200.0 MiB are free now)\n"
      "? is an answer that is not a number; it\n"
      "is not in the total\n");
}

TEST(QueryTable, NoLineIsWiderThanItsTerminalButAPipeGetsEveryIdInFull) {
  Dictionary info = answer();
  const std::string long_id = "com.example." + std::string(100, 'x') + ".cache";
  info.set(long_id, 7);
  for (std::size_t columns = kFewestColumns; columns <= 200; ++columns) {
    const std::string table =
        itemizedTableOf(queryReport(info, kMemory, kSpace), {.columns = columns, .terminal = true});
    std::size_t begin = 0;
    for (std::size_t end = table.find('\n'); end != std::string::npos;
         end = table.find('\n', begin)) {
      EXPECT_LE(end - begin, std::max<std::size_t>(columns, 24))
          << table.substr(begin, end - begin);
      begin = end + 1;
    }
  }
  const std::string piped = itemizedTableOf(queryReport(info, kMemory, kSpace), {});
  EXPECT_NE(piped.find(long_id), std::string::npos);
  EXPECT_NE(piped.find("######"), std::string::npos);
}

TEST(QueryTable, NothingThatCouldBeFreedIsSaidInWords) {
  const Dictionary info{{"SPACEKEEP_TOTAL_AVAILABLE", 0}, {"SPACEKEEP_VOLUME", "/data"}};
  EXPECT_EQ(itemizedTableOf(queryReport(info, kMemory, kSpace), {}),
            "No service knows of anything that it could free on /data.\n");
}

TEST(QueryTable, AnIdWithControlCharactersCannotWriteToTheTerminal) {
  const Dictionary info{{"evil\x1b[2J\n", 1}, {"SPACEKEEP_VOLUME", "/da\x1bta"}};
  const QueryReport report = queryReport(info, kMemory, kSpace);
  EXPECT_EQ(itemizedTableOf(report, {}).find('\x1b'), std::string::npos);
  EXPECT_EQ(summaryOf(report, {}).find('\x1b'), std::string::npos);
}

TEST(QueryJson, HoldsTheSameInBytesAndTheServicesOnlyWhenItemized) {
  const QueryReport report = queryReport(answer(), kMemory, kSpace);
  EXPECT_EQ(jsonOf(report, false),
            R"({"asked_services":2,"free_bytes":209715200,"remembered_services":1,)"
            R"("size_bytes":1048576000,"total_bytes":157286400,"volume":"/data"})");
  EXPECT_EQ(jsonOf(report, true),
            R"({"asked_services":2,"free_bytes":209715200,"remembered_services":1,"services":[)"
            R"({"age_seconds":0,"bytes":104857600,"from_memory":false,"id":"com.example.old"},)"
            R"({"age_seconds":12,"bytes":52428800,"from_memory":true,"id":"com.example.photos"},)"
            R"({"age_seconds":1,"answer":"much","from_memory":false,"id":"com.example.odd"}],)"
            R"("size_bytes":1048576000,"total_bytes":157286400,"volume":"/data"})");
}

TEST(QueryJson, WhatIsUnknownIsAbsent) {
  const Dictionary info{{"a", 1}, {"SPACEKEEP_TOTAL_AVAILABLE", "many"}};
  EXPECT_EQ(jsonOf(queryReport(info, {.before = {}, .after = {}, .now = kNow}, {}), true),
            R"({"services":[{"bytes":1,"id":"a"}],"total_bytes":0,"volume":""})");
}

}  // namespace
}  // namespace spacekeep::ctl
