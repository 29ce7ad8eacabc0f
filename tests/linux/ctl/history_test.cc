// The history as the tool reads and shows it: entries, pages, table, object.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <string>
#include <utility>
#include <vector>

#include "ctl/history/table.h"

namespace spacekeep::ctl {
namespace {

using testing::HasSubstr;

/// 2023-11-14 22:13:20 UTC.
constexpr std::int64_t kMomentNs = 1'700'000'000'000'000'000;

Dictionary wholeEntry() {
  return {{"SPACEKEEP_ENTRY", 12},
          {"SPACEKEEP_DATE", Date{kMomentNs}},
          {"SPACEKEEP_KIND", "purge"},
          {"SPACEKEEP_CLIENT", Dictionary{{"SPACEKEEP_UID", 1000},
                                          {"SPACEKEEP_PID", 77},
                                          {"SPACEKEEP_PROGRAM", "backup"},
                                          {"SPACEKEEP_UNIT", "backup.service"}}},
          {"SPACEKEEP_VOLUME", "/data"},
          {"SPACEKEEP_AMOUNT", 500 << 20},
          {"SPACEKEEP_AMOUNT_FREED", 300 << 20},
          {"SPACEKEEP_AMOUNT_REPORTED", 310 << 20},
          {"SPACEKEEP_FREESPACE_BEGIN", 100 << 20},
          {"SPACEKEEP_FREESPACE_END", 400 << 20},
          {"SPACEKEEP_URGENCY_LIMIT", 3},
          {"SPACEKEEP_URGENCY", 2},
          {"SPACEKEEP_ELAPSED_TIME", 6.04},
          {"SPACEKEEP_REPORTING_SERVICES",
           Dictionary{{"logs", 9 << 20}, {"photos", 300 << 20}, {"void", 0}}},
          {"SPACEKEEP_OTHER_SERVICES", 1 << 20},
          {"SPACEKEEP_SERVICES_INFLIGHT", Array{"mail", "maps"}},
          {"SPACEKEEP_WHY_SHORT", "no answer in time"}};
}

Dictionary ownEntry(const char* kind) {
  return {{"SPACEKEEP_ENTRY", 11},
          {"SPACEKEEP_DATE", Date{kMomentNs}},
          {"SPACEKEEP_KIND", kind},
          {"SPACEKEEP_VOLUME", "/"},
          {"SPACEKEEP_AMOUNT_FREED", 0}};
}

HistoryWords testWords() {
  return {.user = [](std::uint64_t uid) { return "user" + std::to_string(uid); },
          .moment = [](const Date&) { return std::string("2023-11-14 22:13"); }};
}

HistoryList listOf(const std::vector<Dictionary>& entries) {
  HistoryList list;
  for (const Dictionary& entry : entries) list.entries.push_back(historyEntryOf(entry));
  return list;
}

Style terminal(std::size_t columns) { return {.columns = columns, .terminal = true}; }

TEST(HistoryEntryOf, KindsThatAreWrongAreLeftOut) {
  Dictionary odd = wholeEntry();
  for (const auto& [key, value] : wholeEntry()) odd.set(key, true);
  const HistoryEntry entry = historyEntryOf(odd);
  EXPECT_EQ(entry.number, 0U);
  EXPECT_FALSE(entry.ended || entry.client || entry.asked_bytes || entry.elapsed_seconds);
  EXPECT_TRUE(entry.services.empty() && entry.silent.empty() && entry.why_short.empty());
}

TEST(HistoryTable, TellsWhenHowMuchWhereWhoAndWhy) {
  EXPECT_EQ(textOf(listOf({wholeEntry(), ownEntry("daily pass")}), testWords(), Style()),
            "when                   asked       freed  volume  who\n"
            "2023-11-14 22:13   500.0 MiB   300.0 MiB  /data   backup (user1000)\n"
            "    fell short: no answer in time from mail, maps\n"
            "    photos 300.0 MiB, logs 9.0 MiB, others 1.0 MiB; 6.0 s, urgency 2\n"
            "2023-11-14 22:13           -         0 B  /       daemon: daily pass\n"
            "    nobody gave anything\n"
            "2 entries\n");
}

TEST(HistoryTable, OnANarrowTerminalPutsTheAskerBelowAndBreaksLongLines) {
  EXPECT_EQ(textOf(listOf({wholeEntry()}), testWords(), terminal(52)),
            "when                   asked       freed  volume  who\n"
            "2023-11-14 22:13   500.0 MiB   300.0 MiB  /data\n"
            "    backup (user1000)\n"
            "    fell short: no answer in time from mail, maps\n"
            "    photos 300.0 MiB, logs 9.0 MiB, others 1.0 MiB;\n"
            "    6.0 s, urgency 2\n"
            "1 entry\n");
}

TEST(HistoryTable, ShortensALongVolumeOnATerminalAlone) {
  Dictionary entry = wholeEntry();
  entry.set("SPACEKEEP_VOLUME", "/media/somebody/a-drive-with-a-long-name");
  EXPECT_THAT(textOf(listOf({entry}), testWords(), terminal(80)),
              HasSubstr("300.0 MiB  /media/s...ong-name  backup (user1000)\n"));
  EXPECT_THAT(textOf(listOf({entry}), testWords(), Style()),
              HasSubstr("/media/somebody/a-drive-with-a-long-name"));
}

TEST(HistoryTable, ARefusalHasNoCourse) {
  EXPECT_EQ(textOf(listOf({Dictionary{{"SPACEKEEP_DATE", Date{kMomentNs}},
                                      {"SPACEKEEP_KIND", "purge"},
                                      {"SPACEKEEP_CLIENT", Dictionary{{"SPACEKEEP_PID", 5}}},
                                      {"SPACEKEEP_VOLUME", "/"},
                                      {"SPACEKEEP_WHY_SHORT", "refused: no amount"}}}),
                   testWords(), Style()),
            "when                   asked       freed  volume  who\n"
            "2023-11-14 22:13           -           -  /       process 5\n"
            "    fell short: refused: no amount\n"
            "1 entry\n");
}

TEST(HistoryTable, SaysThatThereAreOlderOnes) {
  HistoryList list = listOf({wholeEntry()});
  list.older = true;
  EXPECT_THAT(textOf(list, testWords(), Style()),
              HasSubstr("\nthe newest 1; --limit shows more\n"));
}

TEST(HistoryTable, OfNothingSaysSo) {
  EXPECT_EQ(textOf({}, testWords(), Style()),
            "Nothing was done, as far as the daemon remembers.\n");
}

TEST(HistoryTable, WhatOthersWroteCanDoNothingOnATerminal) {
  Dictionary entry = wholeEntry();
  entry.set("SPACEKEEP_CLIENT", Dictionary{{"SPACEKEEP_PROGRAM", "\x1b[31m\n"}});
  entry.set("SPACEKEEP_VOLUME", "/a\nb");
  entry.set("SPACEKEEP_WHY_SHORT", "\x1b[2J");
  entry.set("SPACEKEEP_REPORTING_SERVICES", Dictionary{{"a\x1b[0m", 1}});
  entry.set("SPACEKEEP_SERVICES_INFLIGHT", Array{"\x07"});
  entry.set("SPACEKEEP_KIND", "\x1b");
  const std::string text = textOf(listOf({entry, ownEntry("\x1b[1m")}), testWords(), Style());
  EXPECT_EQ(text.find('\x1b'), std::string::npos) << text;
  EXPECT_EQ(text.find('\x07'), std::string::npos) << text;
  EXPECT_THAT(text, HasSubstr("/a\\nb"));
}

TEST(HistoryAsker, IsTheProgramElseTheUnitElseTheProcess) {
  HistoryEntry entry;
  entry.client = HistoryClient{.uid = 3, .pid = 9, .program = "sh", .unit = "a.service"};
  EXPECT_EQ(askerOf(entry, testWords()), "sh (user3)");
  entry.client->program.clear();
  EXPECT_EQ(askerOf(entry, testWords()), "a.service (user3)");
  entry.client->unit.clear();
  EXPECT_EQ(askerOf(entry, testWords()), "process 9 (user3)");
  entry.client = HistoryClient{};
  EXPECT_EQ(askerOf(entry, testWords()), "somebody");
}

TEST(HistoryObject, HoldsEverythingUnderPlainNames) {
  EXPECT_EQ(
      jsonOf(listOf({wholeEntry()}), testWords()),
      "{\"entries\":[{\"asked_bytes\":524288000,\"client\":{\"pid\":77,\"program\":\"backup\","
      "\"uid\":1000,\"unit\":\"backup.service\",\"user\":\"user1000\"},\"elapsed_seconds\":6.04,"
      "\"ended\":1700000000,\"free_begin_bytes\":104857600,\"free_end_bytes\":419430400,"
      "\"freed_bytes\":314572800,\"kind\":\"purge\",\"number\":12,"
      "\"other_services_bytes\":1048576,\"reported_bytes\":325058560,\"services\":["
      "{\"bytes\":314572800,\"id\":\"photos\"},{\"bytes\":9437184,\"id\":\"logs\"},"
      "{\"bytes\":0,\"id\":\"void\"}],\"silent_services\":[\"mail\",\"maps\"],\"urgency\":2,"
      "\"urgency_limit\":3,\"volume\":\"/data\",\"why_short\":\"no answer in time\"}],"
      "\"older\":false}");
}

TEST(LocalWords, NameTheUserOrItsNumber) {
  EXPECT_EQ(localWords().user(0), "root");
  EXPECT_EQ(localWords().user(4'000'123'456), "uid 4000123456");
  EXPECT_EQ(localWords().user(UINT64_MAX), "uid 18446744073709551615");
}

/// Pages of so many entries each, numbered down from the first.
struct Pages {
  std::vector<std::uint64_t> sizes;
  std::uint64_t number = 1000;
  std::vector<Dictionary> requests{};

  sdk::Reply operator()(const Dictionary& request) {
    const std::uint64_t size = sizes.at(requests.size());
    requests.push_back(request);
    Array entries;
    for (std::uint64_t i = 0; i < size; ++i, --number) {
      entries.emplace_back(
          Dictionary{{"SPACEKEEP_ENTRY", number},
                     {"SPACEKEEP_DATE", Date{static_cast<std::int64_t>(number) * 1'000'000'000}}});
    }
    Dictionary page{{"SPACEKEEP_ENTRIES", std::move(entries)}};
    if (requests.size() < sizes.size()) page.set("SPACEKEEP_NEXT", number + 1);
    return {std::move(page), std::nullopt};
  }
};

TEST(NewestEntries, GoesThroughThePagesUntilThereIsEnough) {
  Pages pages{.sizes = {3, 3, 3}};
  auto list =
      newestEntries({.wanted = {.volume = "/data", .since_ns = {}}, .limit = 5}, std::ref(pages));
  ASSERT_TRUE(list);
  EXPECT_EQ(list->entries.size(), 5U);
  EXPECT_TRUE(list->older);
  EXPECT_EQ(
      pages.requests,
      (std::vector<Dictionary>{
          {{"SPACEKEEP_LIMIT", 6}, {"SPACEKEEP_VOLUME", "/data"}},
          {{"SPACEKEEP_BEFORE", 998}, {"SPACEKEEP_LIMIT", 6}, {"SPACEKEEP_VOLUME", "/data"}}}));
}

TEST(NewestEntries, EndsWithTheLastPage) {
  Pages pages{.sizes = {3, 2}};
  auto list = newestEntries({.limit = 5}, std::ref(pages));
  ASSERT_TRUE(list);
  EXPECT_EQ(list->entries.size(), 5U);
  EXPECT_FALSE(list->older);
}

TEST(NewestEntries, LeavesOutWhatIsOlderThanAsked) {
  Pages pages{.sizes = {3, 2}};
  auto list = newestEntries(
      {.wanted = {.volume = "", .since_ns = std::int64_t{999'000'000'000}}, .limit = 5},
      std::ref(pages));
  ASSERT_TRUE(list);
  ASSERT_EQ(list->entries.size(), 2U);
  EXPECT_EQ(list->entries.back().number, 999U);
}

TEST(NewestEntries, DoesNotGoRoundInCirclesWithADaemonThatDoes) {
  const auto same = [](const Dictionary&) {
    return sdk::Reply{Dictionary{{"SPACEKEEP_ENTRIES", Array{}}, {"SPACEKEEP_NEXT", 7}},
                      std::nullopt};
  };
  auto list = newestEntries({.limit = 5}, same);
  ASSERT_TRUE(list);
  EXPECT_TRUE(list->entries.empty());
}

TEST(NewestEntries, TellsARefusalAndAnError) {
  auto refused = newestEntries({}, [](const Dictionary&) { return sdk::Reply(); });
  ASSERT_TRUE(refused);
  EXPECT_TRUE(refused->refused);
  auto failed = newestEntries({}, [](const Dictionary&) {
    return sdk::Reply{std::nullopt, sdk::Error{sdk::ErrorKind::kFailed, "why"}};
  });
  ASSERT_FALSE(failed);
  EXPECT_EQ(failed.error().text, "why");
}

}  // namespace
}  // namespace spacekeep::ctl
