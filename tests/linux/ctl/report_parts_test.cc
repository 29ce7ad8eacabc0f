// The parts of the report: what it takes from an entry, how it walks the history, since when, and
// how the page is put together.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <map>
#include <string>
#include <vector>

#include "ctl/json_parse.h"
#include "ctl/report/entry.h"
#include "ctl/report/html_page.h"
#include "ctl/report/report_data.h"
#include "ctl/report/since.h"
#include "ctl/report/whole_history.h"

namespace spacekeep::ctl {
namespace {

using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::Not;

constexpr std::int64_t kSecondNs = 1'000'000'000;

TEST(ReportEntry, TakesEverythingThatThePageShows) {
  const Dictionary entry{
      {"SPACEKEEP_ENTRY", 7},
      {"SPACEKEEP_DATE", Value(Date{5 * kSecondNs})},
      {"SPACEKEEP_KIND", "purge"},
      {"SPACEKEEP_CLIENT", Dictionary{{"SPACEKEEP_UID", 1000}, {"SPACEKEEP_PROGRAM", "setup"}}},
      {"SPACEKEEP_VOLUME", "/data"},
      {"SPACEKEEP_AMOUNT", 100},
      {"SPACEKEEP_URGENCY_LIMIT", 3},
      {"SPACEKEEP_URGENCY", 2},
      {"SPACEKEEP_FREESPACE_BEGIN", 1},
      {"SPACEKEEP_FREESPACE_END", 81},
      {"SPACEKEEP_AMOUNT_FREED", 80},
      {"SPACEKEEP_AMOUNT_REPORTED", 90},
      {"SPACEKEEP_REPORTING_SERVICES", Dictionary{{"a", 60}, {"b", 30}}},
      {"SPACEKEEP_OTHER_SERVICES", 3},
      {"SPACEKEEP_SERVICES_INFLIGHT", Array{"c"}},
      {"SPACEKEEP_ELAPSED_TIME", 1.5},
      {"SPACEKEEP_OPERATION_CANCELLED", true},
      {"SPACEKEEP_WHY_SHORT", "no answer in time"}};
  const Dictionary wanted{{"number", 7},
                          {"date", Value(Date{5 * kSecondNs})},
                          {"kind", "purge"},
                          {"client", "setup (user 1000)"},
                          {"volume", "/data"},
                          {"asked", 100},
                          {"limit", 3},
                          {"urgency", 2},
                          {"begin", 1},
                          {"end", 81},
                          {"freed", 80},
                          {"reported", 90},
                          {"services", Dictionary{{"a", 60}, {"b", 30}}},
                          {"others", 3},
                          {"silent", Array{"c"}},
                          {"seconds", 1.5},
                          {"cancelled", true},
                          {"why", "no answer in time"}};
  EXPECT_EQ(pageEntryOf(entry), Value(wanted));
}

TEST(ReportEntry, WhatIsOfAnotherKindThanExpectedIsLeftOut) {
  const Dictionary entry{{"SPACEKEEP_ENTRY", "seven"},
                         {"SPACEKEEP_DATE", 5},
                         {"SPACEKEEP_KIND", 1},
                         {"SPACEKEEP_CLIENT", "me"},
                         {"SPACEKEEP_REPORTING_SERVICES", Dictionary{{"a", "much"}, {"b", 1}}},
                         {"SPACEKEEP_SERVICES_INFLIGHT", Array{1, "c"}},
                         {"SPACEKEEP_OPERATION_CANCELLED", 1},
                         {"ANOTHER", 1}};
  EXPECT_EQ(pageEntryOf(entry),
            Value(Dictionary{{"services", Dictionary{{"b", 1}}}, {"silent", Array{"c"}}}));
}

TEST(ReportEntry, WhoAskedIsSaidAsFarAsItIsKnown) {
  const auto text = [](Dictionary client) {
    return clientTextOf({{"SPACEKEEP_CLIENT", std::move(client)}});
  };
  EXPECT_EQ(text({{"SPACEKEEP_UID", 0},
                  {"SPACEKEEP_PROGRAM", "apt-get"},
                  {"SPACEKEEP_UNIT", "apt.service"}}),
            "apt-get (user 0, apt.service)");
  EXPECT_EQ(text({{"SPACEKEEP_UNIT", "apt.service"}}), "unknown program (apt.service)");
  EXPECT_EQ(text({{"SPACEKEEP_UID", 7}}), "unknown program (user 7)");
  EXPECT_EQ(text({{"SPACEKEEP_PROGRAM", "apt-get"}}), "apt-get");
  EXPECT_EQ(clientTextOf({}), "");
}

Dictionary numbered(int number) {
  return {{"SPACEKEEP_ENTRY", number}, {"SPACEKEEP_DATE", Value(Date{number * kSecondNs})}};
}

/// A daemon with entries `newest` to 1 that gives `page` of them at a time.
class FakeHistory {
 public:
  FakeHistory(int newest, int page) : newest_(newest), page_(page) {}

  sdk::Reply operator()(const Dictionary& request) {
    requests.push_back(request);
    int at = newest_;
    if (const auto before = unsignedAt(request, "SPACEKEEP_BEFORE"))
      at = static_cast<int>(*before) - 1;
    Array entries;
    for (int i = 0; i < page_ && at > 0; ++i, --at) {
      const auto other = others.find(at);
      entries.emplace_back(other == others.end() ? numbered(at) : other->second);
    }
    Dictionary answer{{"SPACEKEEP_ENTRIES", std::move(entries)}};
    if (at > 0) answer.set("SPACEKEEP_NEXT", at + 1);
    return {.outcome = std::move(answer), .error = {}};
  }

  std::vector<Dictionary> requests;
  std::map<int, Dictionary> others;  ///< in the place of numbered()

 private:
  const int newest_;
  const int page_;
};

TEST(ReportHistory, IsReadPageByPageToItsEnd) {
  FakeHistory daemon(25, 10);
  const History history = readHistory({.volume = "/data", .since_ns = {}}, std::ref(daemon));
  EXPECT_EQ(history.access, History::Access::kRead);
  EXPECT_FALSE(history.problem.has_value());
  EXPECT_FALSE(history.older_left_out);
  ASSERT_EQ(history.entries.size(), 25U);
  EXPECT_EQ(history.entries.front(), Value(numbered(25)));
  EXPECT_EQ(history.entries.back(), Value(numbered(1)));
  const Dictionary first{{"SPACEKEEP_LIMIT", 1000}, {"SPACEKEEP_VOLUME", "/data"}};
  Dictionary second = first;
  second.set("SPACEKEEP_BEFORE", 16);
  Dictionary third = first;
  third.set("SPACEKEEP_BEFORE", 6);
  EXPECT_THAT(daemon.requests, ElementsAre(first, second, third));
}

TEST(ReportHistory, LeavesOutWhatIsTooOldAndWhatTellsNoDate) {
  FakeHistory daemon(25, 10);
  daemon.others[16] = {{"SPACEKEEP_ENTRY", 16}};
  const History history = readHistory({.volume = "", .since_ns = 14 * kSecondNs}, std::ref(daemon));
  ASSERT_EQ(history.entries.size(), 11U);
  EXPECT_EQ(history.entries.back(), Value(numbered(14)));
  EXPECT_EQ(daemon.requests.front(), (Dictionary{{"SPACEKEEP_LIMIT", 1000}}));
}

TEST(ReportHistory, AnEntryOfAClockThatWasWrongHidesNoneBeforeIt) {
  FakeHistory daemon(25, 10);
  daemon.others[20] = {{"SPACEKEEP_ENTRY", 20}, {"SPACEKEEP_DATE", Value(Date{0})}};
  const History history = readHistory({.volume = "", .since_ns = 14 * kSecondNs}, std::ref(daemon));
  ASSERT_EQ(history.entries.size(), 11U);
  EXPECT_EQ(history.entries.back(), Value(numbered(14)));
  EXPECT_FALSE(history.older_left_out);
}

TEST(ReportHistory, AnEmptyOneIsNoProblem) {
  FakeHistory daemon(0, 10);
  const History history = readHistory({}, std::ref(daemon));
  EXPECT_EQ(history.access, History::Access::kRead);
  EXPECT_THAT(history.entries, IsEmpty());
  EXPECT_FALSE(history.problem.has_value());
}

TEST(ReportHistory, HasABound) {
  FakeHistory daemon(25'000, 1000);
  const History history = readHistory({}, std::ref(daemon));
  EXPECT_EQ(history.entries.size(), kMostEntries);
  EXPECT_TRUE(history.older_left_out);
  EXPECT_EQ(daemon.requests.size(), 21U);
}

TEST(ReportHistory, AsManyAsTheBoundAreNotTooMany) {
  FakeHistory daemon(static_cast<int>(kMostEntries), 1000);
  const History history = readHistory({}, std::ref(daemon));
  EXPECT_EQ(history.entries.size(), kMostEntries);
  EXPECT_FALSE(history.older_left_out);
}

TEST(ReportHistory, ADaemonWhosePagesDoNotGetOlderIsNotAskedForEver) {
  int calls = 0;
  const History history = readHistory({}, [&calls](const Dictionary&) {
    ++calls;
    return sdk::Reply{.outcome = Dictionary{{"SPACEKEEP_NEXT", 5}}, .error = {}};
  });
  EXPECT_EQ(calls, 2);
  EXPECT_EQ(history.access, History::Access::kFailed);
  EXPECT_EQ(history.problem->text, "the daemon answered with a history that does not end");
}

TEST(ReportHistory, SaysWhichRightIsMissing) {
  const History history = readHistory({}, [](const Dictionary&) { return sdk::Reply(); });
  EXPECT_EQ(history.access, History::Access::kRefused);
  EXPECT_EQ(history.problem->code, ExitCode::kRefused);
  EXPECT_THAT(history.problem->text, HasSubstr("\"ITEMIZED_PURGEABLE_ENTITLEMENT\""));
}

TEST(ReportHistory, AnOlderDaemonIsNoFailure) {
  const History history = readHistory({}, [](const Dictionary&) {
    return sdk::Reply{.outcome = {},
                      .error = sdk::Error{sdk::ErrorKind::kNotSupported, "no such method"}};
  });
  EXPECT_EQ(history.access, History::Access::kNotKept);
  EXPECT_EQ(history.problem->code, ExitCode::kDone);
  EXPECT_THAT(history.problem->text, HasSubstr("keeps no history"));
}

TEST(ReportHistory, WhatWasReadBeforeAFailureStays) {
  FakeHistory daemon(25, 10);
  const History history = readHistory({}, [&daemon](const Dictionary& request) {
    if (request.contains("SPACEKEEP_BEFORE")) {
      return sdk::Reply{.outcome = {}, .error = sdk::Error{sdk::ErrorKind::kDisconnected, "gone"}};
    }
    return daemon(request);
  });
  EXPECT_EQ(history.access, History::Access::kFailed);
  EXPECT_EQ(history.problem->code, ExitCode::kFailed);
  EXPECT_EQ(history.entries.size(), 10U);
}

std::int64_t sinceSeconds(const char* text) {
  const auto since = parseSince(text, 1'000'000 * kSecondNs);
  const auto* ns = std::get_if<std::int64_t>(&since);
  return ns == nullptr ? -1 : *ns / kSecondNs;
}

class ReportSince : public testing::Test {
 protected:
  ReportSince() {
    setenv("TZ", "UTC", 1);
    tzset();
  }
  ~ReportSince() override {
    unsetenv("TZ");
    tzset();
  }
};

TEST_F(ReportSince, IsAnAge) {
  EXPECT_EQ(sinceSeconds("90m"), 1'000'000 - 90 * 60);
  EXPECT_EQ(sinceSeconds("12h"), 1'000'000 - 12 * 3600);
  EXPECT_EQ(sinceSeconds("7d"), 1'000'000 - 7 * 86400);
  EXPECT_EQ(sinceSeconds("1w"), 1'000'000 - 7 * 86400);
  EXPECT_EQ(sinceSeconds("0h"), 1'000'000);
}

TEST_F(ReportSince, IsADayOrAMoment) {
  EXPECT_EQ(sinceSeconds("2026-11-01"), 1'793'491'200);
  EXPECT_EQ(sinceSeconds("2026-11-01 14:30"), 1'793'491'200 + 52'200);
  EXPECT_EQ(sinceSeconds("2026-11-01T14:30:05"), 1'793'491'200 + 52'205);
}

TEST_F(ReportSince, AnythingElseIsRefusedInWords) {
  for (const char* text :
       {"", "7", "d", "7y", "-7d", "1.5h", "2026-02-30", "2026-13-01", "yesterday",
        "2026-11-01 25:00", "99999999999999999999d", "9999999999w"}) {
    const auto since = parseSince(text, 0);
    const auto* error = std::get_if<SinceError>(&since);
    ASSERT_NE(error, nullptr) << text;
    EXPECT_THAT(error->text, HasSubstr("not \"" + std::string(text) + "\""));
  }
}

TEST(ReportPage, NoTextOfTheDataCanBeMarkup) {
  const std::string text = "</script><!--<script>alert(1)&amp;'\"";
  ReportData data;
  data.history.entries.emplace_back(Dictionary{{"SPACEKEEP_VOLUME", text}});
  data.host = text;
  const std::string json = embeddable(jsonOf(data));
  EXPECT_EQ(json.find_first_of("<>&"), std::string::npos) << json;
  const auto read_again = parseJson(json);
  const auto* value = std::get_if<Value>(&read_again);
  ASSERT_NE(value, nullptr);
  EXPECT_EQ(*value->dictionary()->find("host"), Value(text));
}

std::string between(std::string_view page, const std::string& begin, const std::string& end) {
  const std::size_t from = page.find(begin);
  if (from == std::string::npos) return "";
  const std::size_t to = page.find(end, from + begin.size());
  return std::string(page.substr(from + begin.size(), to - from - begin.size()));
}

TEST(ReportPage, IsWholeAndHasTheDataInItsPlace) {
  const std::string page = pageWith("{\"a\":\"<b>\"}");
  EXPECT_EQ(page.find("<!DOCTYPE html>\n"), 0U);
  EXPECT_THAT(page, HasSubstr("id=\"data\">{\"a\":\"\\u003cb\\u003e\"}</script>"));
  EXPECT_THAT(page, testing::EndsWith("</html>\n"));
  for (const char* mark : {"@DATA@", "@STYLE@", "@SCRIPT@", "@SCRIPT_HASH@", "@STYLE_HASH@"}) {
    EXPECT_THAT(page, Not(HasSubstr(mark)));
  }
}

TEST(ReportPage, ForbidsEveryLoad) {
  const std::string policy =
      between(emptyPage(), "http-equiv=\"Content-Security-Policy\" content=\"", "\"");
  EXPECT_THAT(policy,
              testing::MatchesRegex("default-src 'none'; script-src 'sha256-[A-Za-z0-9+/]+='; "
                                    "style-src 'sha256-[A-Za-z0-9+/]+='; base-uri 'none'; "
                                    "form-action 'none'"));
  for (const char* load :
       {"http://", "https://", " src=", "@import", "url(", "<link", "fetch(", "XMLHttpRequest",
        "innerHTML", "outerHTML", "insertAdjacentHTML", "document.write", "eval("}) {
    std::string page(emptyPage());
    // The name of the drawing language, which nobody loads.
    const std::string name = "http://www.w3.org/2000/svg";
    if (const auto at = page.find(name); at != std::string::npos) page.erase(at, name.size());
    EXPECT_THAT(page, Not(HasSubstr(load)));
  }
}

}  // namespace
}  // namespace spacekeep::ctl
