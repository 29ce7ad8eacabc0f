// "history" as a process: what it asks the daemon, and what it does without an answer.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <string>

#include "tests/linux/ctl/tool_test.h"

namespace spacekeep::ctl {
namespace {

using testing::HasSubstr;
using testing::IsEmpty;

class HistoryCommand : public ToolTest {
 protected:
  ~HistoryCommand() override { daemon_.stop(); }

  void answerWith(const ipc::Arguments& answer) {
    daemon_.on("clientHistory", [this, answer](const ipc::Arguments& in, const ipc::Responder& r) {
      seen_.set(std::get<Dictionary>(in.at(0)));
      r.reply(answer);
    });
    daemon_.start();
  }
  static ipc::Arguments onePurge() {
    return sdk::outcome(
        {{"SPACEKEEP_ENTRIES",
          Array{Dictionary{{"SPACEKEEP_ENTRY", 1},
                           {"SPACEKEEP_DATE", Date{1'700'000'000'000'000'000}},
                           {"SPACEKEEP_KIND", "purge"},
                           {"SPACEKEEP_CLIENT",
                            Dictionary{{"SPACEKEEP_UID", 0}, {"SPACEKEEP_PROGRAM", "backup"}}},
                           {"SPACEKEEP_VOLUME", "/data"},
                           {"SPACEKEEP_AMOUNT", 1 << 20},
                           {"SPACEKEEP_AMOUNT_FREED", 1 << 20}}}}});
  }
};

TEST_F(HistoryCommand, ShowsTheEntries) {
  answerWith(onePurge());
  const Finished run = ctlWithSocket("history");
  EXPECT_EQ(run.exit_code, 0) << run.err;
  EXPECT_THAT(run.err, IsEmpty());
  EXPECT_THAT(run.out, HasSubstr("     1.0 MiB     1.0 MiB  /data   backup (root)\n"));
  EXPECT_THAT(run.out, HasSubstr("\n1 entry\n"));
  EXPECT_EQ(seen_.get(), (Dictionary{{"SPACEKEEP_LIMIT", 21}}));
}

TEST_F(HistoryCommand, AsksForOneVolumeAndAsManyAsWanted) {
  answerWith(onePurge());
  const Finished run = ctlWithSocket("history --volume /data/ --limit 5 --json");
  EXPECT_EQ(run.exit_code, 0) << run.err;
  EXPECT_THAT(run.out, HasSubstr("\"freed_bytes\":1048576"));
  EXPECT_EQ(seen_.get(), (Dictionary{{"SPACEKEEP_VOLUME", "/data"}, {"SPACEKEEP_LIMIT", 6}}));
}

TEST_F(HistoryCommand, LeavesOutWhatIsOlderThanAsked) {
  answerWith(onePurge());
  EXPECT_THAT(ctlWithSocket("history --since 3d").out, HasSubstr("Nothing was done"));
  EXPECT_THAT(ctlWithSocket("history --since 2023-11-01").out, HasSubstr("1 entry"));
}

TEST_F(HistoryCommand, ATimeThatIsNoneIsWrongUsage) {
  const Finished run = ctlWithSocket("history --since tomorrow");
  EXPECT_EQ(run.exit_code, 2);
  EXPECT_THAT(run.err, HasSubstr("since when is an age like 90m, 12h, 7d or 4w"));
  EXPECT_EQ(ctlWithSocket("history --limit 0").exit_code, 2);
  EXPECT_EQ(ctlWithSocket("history --limit 10001").exit_code, 2);
}

TEST_F(HistoryCommand, ARefusalNamesTheRight) {
  answerWith(sdk::noDictionary());
  const Finished run = ctlWithSocket("history");
  EXPECT_EQ(run.exit_code, 4);
  EXPECT_THAT(run.err, HasSubstr("ITEMIZED_PURGEABLE_ENTITLEMENT"));
  EXPECT_THAT(run.out, IsEmpty());
}

TEST_F(HistoryCommand, ADaemonWithoutAHistoryIsAFailureInWords) {
  daemon_.start();
  const Finished run = ctlWithSocket("history --json");
  EXPECT_EQ(run.exit_code, 5);
  EXPECT_THAT(run.err, HasSubstr("the daemon does not offer clientHistory"));
  EXPECT_THAT(run.out, HasSubstr("{\"error\":"));
}

TEST_F(HistoryCommand, WithoutADaemonItIsUnreachable) {
  EXPECT_EQ(ctlWithSocket("history").exit_code, 3);
}

}  // namespace
}  // namespace spacekeep::ctl
