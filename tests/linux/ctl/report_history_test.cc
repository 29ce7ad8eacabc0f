// "report" with a history: all of its pages, what is left out, and what is said without the right.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <algorithm>
#include <string>

#include "ctl/json_parse.h"
#include "support/volumes/linux/linux_volumes.h"
#include "tests/helpers/temporary_directory.h"
#include "tests/linux/ctl/tool_test.h"

namespace spacekeep::ctl {
namespace {

using testing::AllOf;
using testing::HasSubstr;

constexpr const char* kStick = "/media/stick";

class ReportOfHistory : public ToolTest {
 protected:
  ReportOfHistory() {
    daemon_.on("clientGetState", [](const ipc::Arguments&, const ipc::Responder& responder) {
      responder.reply({ipc::OptionalValue(Value(Dictionary{}))});
    });
    daemon_.on("clientItemizedPurgeableSpace",
               [](const ipc::Arguments&, const ipc::Responder& responder) {
                 responder.reply(sdk::outcome({{"SPACEKEEP_TOTAL_AVAILABLE", 0}}));
               });
  }
  ~ReportOfHistory() override { daemon_.stop(); }

  /// Entries `newest` to 1, one an hour, every third of a stick that is not there any more.
  static Dictionary entry(int newest, int number) {
    const std::int64_t hour_ns = 3'600'000'000'000;
    return {{"SPACEKEEP_ENTRY", number},
            {"SPACEKEEP_DATE", Value(Date{rt::wallClockNs() - (newest - number) * hour_ns})},
            {"SPACEKEEP_KIND", "purge"},
            {"SPACEKEEP_VOLUME", number % 3 == 0 ? std::string(kStick) : someVolume()}};
  }
  void keep(int newest) {
    daemon_.on(
        "clientHistory", [newest](const ipc::Arguments& in, const ipc::Responder& responder) {
          const auto& request = std::get<Dictionary>(in.at(0));
          const auto limit = unsignedAt(request, "SPACEKEEP_LIMIT").value_or(100);
          const std::string* volume = stringAt(request, "SPACEKEEP_VOLUME");
          int at = static_cast<int>(
              unsignedAt(request, "SPACEKEEP_BEFORE").value_or(static_cast<unsigned>(newest) + 1));
          Array entries;
          while (at > 1 && entries.size() < limit) {
            const Dictionary next = entry(newest, --at);
            if (volume == nullptr || *next.find("SPACEKEEP_VOLUME") == Value(*volume)) {
              entries.emplace_back(next);
            }
          }
          Dictionary answer{{"SPACEKEEP_ENTRIES", std::move(entries)}};
          if (at > 1) answer.set("SPACEKEEP_NEXT", at);
          responder.reply(sdk::outcome(std::move(answer)));
        });
  }

  static std::string someVolume() { return LinuxVolumes().getLocalVolumes().at(0); }
  [[nodiscard]] std::string file() const { return folder_ / "report.html"; }
  Finished report(const std::string& more) {
    return ctlWithSocket("report --html " + file() + " " + more);
  }
  [[nodiscard]] std::string page() const { return contentOf(file()); }

  spacekeep::test::TemporaryDirectory folder_;
};

TEST_F(ReportOfHistory, EveryPageOfItIsInTheReport) {
  keep(2345);
  daemon_.start();
  const Finished run = report("--json");
  EXPECT_EQ(run.exit_code, 0) << run.err;
  EXPECT_THAT(run.out, HasSubstr("{\"entries\":2345,"));
  EXPECT_THAT(page(), AllOf(HasSubstr("\"number\":2345"), HasSubstr("\"number\":1,")));
}

TEST_F(ReportOfHistory, WhatIsOlderOrOfAnotherVolumeIsLeftOut) {
  keep(100);
  daemon_.start();
  EXPECT_THAT(report("--since 630m").out, HasSubstr(" 11 entries of the history"));
  EXPECT_THAT(report("--volume " + someVolume()).out, HasSubstr(" 67 entries of the history"));
}

TEST_F(ReportOfHistory, AVolumeThatIsGoneHasAPast) {
  keep(30);
  daemon_.start();
  const Finished run = report(std::string("--volume ") + kStick + "/");
  EXPECT_EQ(run.exit_code, 0) << run.err;
  EXPECT_THAT(run.out, HasSubstr(" 0 volumes, 10 entries of the history"));
}

TEST_F(ReportOfHistory, WithoutTheRightThePageSaysWhich) {
  daemon_.on("clientHistory", [](const ipc::Arguments&, const ipc::Responder& responder) {
    responder.reply(sdk::noDictionary());
  });
  daemon_.start();
  const Finished run = report("");
  EXPECT_EQ(run.exit_code, 4);
  EXPECT_THAT(run.err, HasSubstr("\"ITEMIZED_PURGEABLE_ENTITLEMENT\""));
  EXPECT_THAT(page(), HasSubstr("\"history_problem\":\"this user may not see what was freed"));
}

TEST_F(ReportOfHistory, ADaemonThatKeepsNoneIsNoFailure) {
  daemon_.start();
  const Finished run = report("");
  EXPECT_EQ(run.exit_code, 0) << run.err;
  EXPECT_THAT(run.err, HasSubstr("keeps no history"));
  EXPECT_THAT(page(), HasSubstr("\"history_problem\":\"the daemon is older than this tool"));
}

}  // namespace
}  // namespace spacekeep::ctl
