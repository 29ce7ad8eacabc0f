// What was done last on a volume, in sentences.
#include "ctl/past.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <string>
#include <vector>

namespace spacekeep::ctl {
namespace {

using testing::HasSubstr;

constexpr std::int64_t kNsPerSecond = 1'000'000'000;
constexpr Date kNow{1'700'000'000 * kNsPerSecond};

HistoryWords words() {
  return {.user = [](std::uint64_t) { return std::string("alice"); },
          .moment = [](const Date&) { return std::string("then"); }};
}

HistoryEntry purge(const std::string& why_short = "") {
  HistoryEntry entry;
  entry.ended = Date{kNow.unix_ns - 3 * 3600 * kNsPerSecond};
  entry.kind = "purge";
  entry.client = HistoryClient{.uid = 1000, .pid = 7, .program = "backup", .unit = ""};
  entry.asked_bytes = 500 << 20;
  entry.freed_bytes = 300 << 20;
  entry.urgency_limit = 3;
  entry.why_short = why_short;
  return entry;
}

std::string lastOf(const std::vector<Paragraph>& paragraphs) { return paragraphs.back().text; }

TEST(PastSentence, TellsWhenWhoAskedForWhatAndWhatCameOfIt) {
  EXPECT_EQ(sentenceOf(purge(), kNow, words()),
            "3 h ago backup (alice) asked for 500.0 MiB and got 300.0 MiB");
  EXPECT_EQ(sentenceOf(purge("nothing more to give"), kNow, words()),
            "3 h ago backup (alice) asked for 500.0 MiB and got 300.0 MiB: nothing more to give");
  HistoryEntry own = purge();
  own.client.reset();
  own.kind = "low space";
  EXPECT_EQ(sentenceOf(own, kNow, words()),
            "3 h ago the daemon, short of space, asked for 500.0 MiB and got 300.0 MiB");
  own.kind = "daily pass";
  EXPECT_EQ(sentenceOf(own, kNow, words()), "3 h ago the daily pass gained 300.0 MiB");
}

TEST(PastSentence, DoesWithoutWhatIsNotKnown) {
  HistoryEntry entry = purge("refused: no amount");
  entry.ended.reset();
  entry.asked_bytes.reset();
  entry.freed_bytes.reset();
  EXPECT_EQ(sentenceOf(entry, kNow, words()),
            "once backup (alice) asked for something and got nothing: refused: no amount");
}

TEST(PastLines, StandBelowEachOtherAndAreBrokenOnATerminal) {
  EXPECT_EQ(pastLines({"3 h ago this", "5 h ago that"}, Style()),
            "  3 h ago this\n  5 h ago that\n");
  EXPECT_EQ(pastLines({"3 h ago backup (alice) asked for 500.0 MiB and got 300.0 MiB"},
                      {.columns = 40, .terminal = true}),
            "  3 h ago backup (alice) asked for 500.0\n  MiB and got 300.0 MiB\n");
  EXPECT_EQ(pastLines({}, Style()), "");
}

TEST(PastParagraphs, AreNoneWithoutEntries) {
  EXPECT_TRUE(pastParagraphs({}, kNow, words()).empty());
}

TEST(PastParagraphs, ListWhatWasDoneAndNeedNoAdviceWhenItWasEnough) {
  const auto paragraphs = pastParagraphs({purge()}, kNow, words());
  ASSERT_EQ(paragraphs.size(), 2U);
  EXPECT_EQ(paragraphs[0].text, "What the daemon did here last:");
  EXPECT_FALSE(paragraphs[0].is_item);
  EXPECT_TRUE(paragraphs[1].is_item);
}

TEST(PastParagraphs, SayWhatToDoAboutEachReasonOfTheLastPurge) {
  const auto advice = [](const HistoryEntry& entry) {
    return lastOf(pastParagraphs({entry, purge()}, kNow, words()));
  };
  EXPECT_THAT(advice(purge("no services")), HasSubstr("nobody to ask"));
  EXPECT_THAT(advice(purge("no answer in time")), HasSubstr("doctor"));
  EXPECT_THAT(advice(purge("nothing more to give")), HasSubstr("up to urgency 3; a higher one"));
  HistoryEntry last = purge("nothing more to give");
  last.urgency_limit = 4;
  EXPECT_THAT(advice(last), HasSubstr("more services"));
  EXPECT_THAT(advice(purge("cancelled")), HasSubstr("asked for"));
}

TEST(PastParagraphs, LookPastTheDailyPassForTheLastPurge) {
  HistoryEntry pass = purge("no services");
  pass.kind = "daily pass";
  EXPECT_THAT(lastOf(pastParagraphs({pass, purge("no answer in time")}, kNow, words())),
              HasSubstr("did not wait longer"));
}

}  // namespace
}  // namespace spacekeep::ctl
