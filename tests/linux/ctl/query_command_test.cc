// "query" as a process.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <atomic>
#include <string>

#include "purgeable/recent_archive.h"
#include "tests/linux/ctl/tool_test.h"

namespace spacekeep::ctl {
namespace {

using testing::AllOf;
using testing::EndsWith;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::MatchesRegex;
using testing::Not;

/// A volume that cannot be measured, so that no number of this machine is in the output.
const Dictionary kAnswer{{"com.example.photos", 2048},
                         {"com.example.music", 1024},
                         {"SPACEKEEP_TOTAL_AVAILABLE", 3072},
                         {"SPACEKEEP_VOLUME", "/nowhere/at/all"}};

class QueryCommand : public ToolTest {
 protected:
  /// Both operations answer `answer`; the one that was called is in operation_.
  void answerWith(const Dictionary& answer) {
    for (const char* operation : {"clientPurgeableSpace", "clientItemizedPurgeableSpace"}) {
      daemon_.on(operation, [this, answer, operation](const ipc::Arguments& in,
                                                      const ipc::Responder& responder) {
        seen_.set(std::get<Dictionary>(in.at(0)));
        operation_.set(operation);
        responder.reply(sdk::outcome(answer));
      });
    }
  }
  /// The daemon remembers photos for 30 s, and after the query music too.
  void rememberWith(const Value& before, const Value& after) {
    daemon_.on("clientGetState",
               [this, before, after](const ipc::Arguments& in, const ipc::Responder& responder) {
                 EXPECT_EQ(std::get<std::string>(in.at(0)), "SPACEKEEP_RECENT_SERVICE_STATS");
                 responder.reply({ipc::OptionalValue(readings_++ == 0 ? before : after)});
               });
  }
  static Value archiveOf(const std::map<std::string, std::int64_t>& seconds_ago) {
    SpacekeepRecentVolumeInfo volume{.volumeName = "/nowhere/at/all"};
    for (const auto& [id, seconds] : seconds_ago) {
      const Date date = recentDate(rt::wallClockNs() - seconds * 1'000'000'000);
      volume.services.emplace(id, SpacekeepRecentServiceInfo{Value(1), date});
    }
    return archivedRecentInfo(SpacekeepRecentInfo({{"/nowhere/at/all", volume}}));
  }

  std::atomic<int> readings_ = 0;
  rt::Guarded<std::string> operation_;
};

TEST_F(QueryCommand, ThePlainQueryAsksForTheTotalAndSaysItInALine) {
  answerWith(kAnswer);
  const auto running = daemon_.run();
  const Finished run = ctlWithSocket("query /nowhere/at/all");
  EXPECT_EQ(run.exit_code, 0) << run.err;
  EXPECT_EQ(run.out, "3.0 KiB could be freed on /nowhere/at/all\n");
  EXPECT_THAT(run.err, IsEmpty());
  EXPECT_EQ(operation_.get(), "clientPurgeableSpace");
  EXPECT_EQ(seen_.get(), (Dictionary{{"SPACEKEEP_VOLUME", "/nowhere/at/all"}}));
}

TEST_F(QueryCommand, ItemizedAsksForTheBreakdownAtTheUrgencyAndTellsWhoWasAsked) {
  answerWith(kAnswer);
  const Value before = archiveOf({{"com.example.photos", 30}});
  auto after = recentInfoFromArchive(*before.data());
  ASSERT_TRUE(after.has_value());
  after->update("/nowhere/at/all", "com.example.music", {Value(1), recentDate(rt::wallClockNs())},
                0);
  rememberWith(before, archivedRecentInfo(*after));
  const auto running = daemon_.run();
  const Finished run = ctlWithSocket("query /nowhere/at/all/ --itemized --urgency 4");
  EXPECT_EQ(run.exit_code, 0) << run.err;
  EXPECT_THAT(run.out,
              HasSubstr("com.example.music      1.0 KiB  ############.............  asked now\n"));
  EXPECT_THAT(
      run.out,
      HasSubstr("com.example.photos     2.0 KiB  #########################  from memory, 3"));
  EXPECT_EQ(operation_.get(), "clientItemizedPurgeableSpace");
  EXPECT_EQ(seen_.get(),
            (Dictionary{{"SPACEKEEP_VOLUME", "/nowhere/at/all"}, {"SPACEKEEP_URGENCY", 4}}));
  EXPECT_EQ(readings_, 2);
}

TEST_F(QueryCommand, AMemoryOfAnotherFormatOnlyCostsTheColumn) {
  answerWith(kAnswer);
  rememberWith(Data{{1, 2, 3}}, Data{{1, 2, 3}});
  const auto running = daemon_.run();
  const Finished run = ctlWithSocket("query /nowhere/at/all --itemized");
  EXPECT_EQ(run.exit_code, 0) << run.err;
  EXPECT_EQ(run.out,
            "service             could free\n"
            "com.example.photos     2.0 KiB  ########################################\n"
            "com.example.music      1.0 KiB  ####################....................\n"
            "\n"
            "total                  3.0 KiB\n"
            "on /nowhere/at/all\n");
  EXPECT_THAT(run.err, IsEmpty());
}

TEST_F(QueryCommand, JsonIsOneObject) {
  answerWith(kAnswer);
  const auto running = daemon_.run();
  EXPECT_EQ(ctlWithSocket("query /nowhere/at/all --json").out,
            R"({"total_bytes":3072,"volume":"/nowhere/at/all"})"
            "\n");
  EXPECT_EQ(ctlWithSocket("--json query --itemized /nowhere/at/all").out,
            R"({"services":[{"bytes":2048,"id":"com.example.photos"},)"
            R"({"bytes":1024,"id":"com.example.music"}],"total_bytes":3072,)"
            R"("volume":"/nowhere/at/all"})"
            "\n");
}

TEST_F(QueryCommand, AVolumeThatCanBeMeasuredAddsItsShare) {
  answerWith({{"SPACEKEEP_TOTAL_AVAILABLE", 1024}, {"SPACEKEEP_VOLUME", "/"}});
  const auto running = daemon_.run();
  EXPECT_THAT(ctlWithSocket("query /").out,
              MatchesRegex("1\\.0 KiB could be freed on /, 0\\.0 % of its [0-9.]+ .iB "
                           "\\([0-9.]+ .?i?B are free now\\)\n"));
}

TEST_F(QueryCommand, ARefusalNamesTheEntitlementOfTheOperation) {
  for (const char* operation : {"clientPurgeableSpace", "clientItemizedPurgeableSpace"}) {
    daemon_.on(operation, [](const ipc::Arguments&, const ipc::Responder& responder) {
      responder.reply(sdk::noDictionary());
    });
  }
  const auto running = daemon_.run();
  const Finished plain = ctlWithSocket("query /data");
  EXPECT_EQ(plain.exit_code, 4);
  EXPECT_THAT(plain.err, AllOf(HasSubstr("hold \"PURGEABLE_ENTITLEMENT\""), HasSubstr("/data")));
  EXPECT_THAT(plain.out, IsEmpty());
  EXPECT_THAT(ctlWithSocket("query /data --itemized").err,
              HasSubstr("hold \"ITEMIZED_PURGEABLE_ENTITLEMENT\""));
}

TEST_F(QueryCommand, AnUrgencyThatIsNoneIsAnErrorOfTheArgumentAndNothingIsAsked) {
  answerWith(kAnswer);
  const auto running = daemon_.run();
  for (const char* urgency : {"0", "5", "-1", "high", "1.5", ""}) {
    const Finished run = ctlWithSocket(std::string("query /data --urgency=\"") + urgency + "\"");
    EXPECT_EQ(run.exit_code, 2) << urgency;
    EXPECT_THAT(run.err, HasSubstr("--urgency")) << urgency;
  }
  EXPECT_THAT(ctlWithSocket("query /data --urgency 5").err,
              HasSubstr("--urgency: an urgency is 1, 2, 3 or 4, not \"5\"\n"));
  EXPECT_TRUE(seen_.get().empty());
}

TEST_F(QueryCommand, OnATerminalAQueryThatTakesLongerThanASecondSaysSo) {
  daemon_.on(
      "clientPurgeableSpace", [this](const ipc::Arguments&, const ipc::Responder& responder) {
        EXPECT_TRUE(sdk::eventually(
            [this] { return onTerminalSoFar().find("asking the services") != std::string::npos; }));
        responder.reply(sdk::outcome(kAnswer));
      });
  const auto running = daemon_.run();
  const Finished run = ctlOnTerminal(80, "query /nowhere/at/all");
  EXPECT_EQ(run.exit_code, 0) << run.out;
  EXPECT_THAT(run.out, HasSubstr("\r\x1b[K1 s, asking the services about /nowhere/at/all"));
  EXPECT_THAT(run.out, EndsWith("\r\x1b[K3.0 KiB could be freed on /nowhere/at/all\r\n"));
}

TEST_F(QueryCommand, OnATerminalTheTableIsColouredAndFits) {
  answerWith(kAnswer);
  const auto running = daemon_.run();
  const Finished run = ctlOnTerminal(50, "query /nowhere/at/all --itemized");
  const std::string full =
      "\u2588\u2588\u2588\u2588\u2588\u2588\u2588\u2588\u2588"
      "\u2588\u2588\u2588\u2588\u2588\u2588\u2588\u2588\u2588";
  EXPECT_THAT(run.out,
              HasSubstr("com.example.photos     2.0 KiB  \x1b[32m" + full + "\x1b[0m\r\n"));
  EXPECT_THAT(run.out, Not(HasSubstr("#")));
}

}  // namespace
}  // namespace spacekeep::ctl
