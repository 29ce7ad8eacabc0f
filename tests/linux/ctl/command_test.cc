// The tool as a process: what it prints and how it exits.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <string>

#include "tests/linux/ctl/tool_test.h"

namespace spacekeep::ctl {
namespace {

using testing::AllOf;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::Not;
using testing::StartsWith;

class CommandTest : public ToolTest {
 protected:
  /// Answers purges with so many bytes freed, and keeps the request.
  void answerWith(std::uint64_t freed) {
    daemon_.on("clientPurge", [this, freed](const ipc::Arguments& in, const ipc::Responder& r) {
      seen_.set(std::get<Dictionary>(in.at(0)));
      r.reply(sdk::outcome(
          {{"SPACEKEEP_VOLUME", "/data"},
           {"SPACEKEEP_AMOUNT", freed},
           {"SPACEKEEP_AMOUNT_REPORTED", freed},
           {"SPACEKEEP_ELAPSED_TIME", 0.5},
           {"SPACEKEEP_URGENCY_1_OPERATION_INFO",
            Dictionary{{"SPACEKEEP_REPORTING_SERVICES", Dictionary{{"photos", freed}}}}}}));
    });
    daemon_.start();
  }
};

TEST_F(CommandTest, AReachedAmountExitsWithZeroAndPrintsTheTable) {
  answerWith(500 << 20);
  const Finished run = ctlWithSocket("purge /data 500M");
  EXPECT_EQ(run.exit_code, 0) << run.err;
  EXPECT_THAT(run.out, AllOf(HasSubstr("      1  photos      500.0 MiB\n"),
                             HasSubstr("result    reached\n")));
  EXPECT_THAT(run.err, HasSubstr("500.0 MiB asked for, urgency 1 of 3"));
  EXPECT_EQ(seen_.get(), (Dictionary{{"SPACEKEEP_VOLUME", "/data"},
                                     {"SPACEKEEP_AMOUNT", 500 << 20},
                                     {"SPACEKEEP_FINISH_EARLY", true}}));
}

TEST_F(CommandTest, OneByteLessThanAskedExitsWithOne) {
  answerWith((500 << 20) - 1);
  const Finished run = ctlWithSocket("purge /data 500M");
  EXPECT_EQ(run.exit_code, 1);
  EXPECT_THAT(run.out, HasSubstr("result    not reached, 1 B missing\n"));
}

TEST_F(CommandTest, EveryOptionOfAPurgeReachesTheRequest) {
  answerWith(1);
  const Finished run =
      ctlWithSocket("purge /data 1.5MB --urgency 4 --timeout 7 --token mine --wait-all");
  EXPECT_EQ(run.exit_code, 1) << run.err;
  EXPECT_EQ(seen_.get(), (Dictionary{{"SPACEKEEP_VOLUME", "/data"},
                                     {"SPACEKEEP_AMOUNT", 1'500'000},
                                     {"SPACEKEEP_URGENCY", 4},
                                     {"SPACEKEEP_PURGE_TIMEOUT", 7},
                                     {"SPACEKEEP_TOKEN", "mine"}}));
}

TEST_F(CommandTest, JsonIsOneObjectOnStandardOutputAndNothingElse) {
  answerWith(2048);
  const Finished run = ctlWithSocket("purge /data 2K --json");
  EXPECT_EQ(run.exit_code, 0);
  EXPECT_EQ(run.out,
            R"({"asked_bytes":2048,"cancelled":false,"elapsed_seconds":0.5,"free_after_bytes":0,)"
            R"("free_before_bytes":0,"freed_bytes":2048,"reached":true,"reported_bytes":2048,)"
            R"("urgencies":[{"services":[{"id":"photos","reported_bytes":2048}],"unanswered":[],)"
            R"("urgency":1}],"volume":"/data"})"
            "\n");
  EXPECT_THAT(run.err, IsEmpty());
}

TEST_F(CommandTest, ARefusalExitsWithFour) {
  daemon_.on("clientPurge", [](const ipc::Arguments&, const ipc::Responder& responder) {
    responder.reply(sdk::noDictionary());
  });
  daemon_.start();
  const Finished run = ctlWithSocket("purge /data 1M");
  EXPECT_EQ(run.exit_code, 4);
  EXPECT_THAT(run.out, IsEmpty());
  EXPECT_THAT(run.err, AllOf(HasSubstr("\"PURGE_ENTITLEMENT\""), HasSubstr("/data")));
}

TEST_F(CommandTest, ADaemonThatTurnsTheUserAwayExitsWithFour) {
  daemon_.turnEverybodyAway();
  daemon_.start();
  const Finished run = ctlWithSocket("purge /data 1M");
  EXPECT_EQ(run.exit_code, 4) << run.err;
  EXPECT_THAT(run.err, HasSubstr("\"CLIENT_ENTITLEMENT\""));
}

TEST_F(CommandTest, WithoutADaemonTheExitIsThreeAndJsonStillIsJson) {
  const Finished run = ctlWithSocket("purge /data 1M --json");
  EXPECT_EQ(run.exit_code, 3);
  EXPECT_THAT(run.out, StartsWith(R"({"error":"cannot connect to the daemon at )"));
  EXPECT_THAT(run.err, HasSubstr(directory_.daemonSocket()));
}

TEST_F(CommandTest, ADaemonThatFailsExitsWithFive) {
  daemon_.start();  // it serves no purges
  EXPECT_EQ(ctlWithSocket("purge /data 1M").exit_code, 5);
}

struct UsageCase {
  const char* arguments;
  const char* complaint;
};

TEST_F(CommandTest, AWrongCommandLineExitsWithTwoAndSaysWhatIsWrong) {
  const UsageCase cases[] = {
      {"",
       "A command is required: status, explain, history, report, doctor, purge, query, state, "
       "volumes, "
       "cancel "
       "or check-service"},
      {"eat", "eat"},
      {"purge", "VOLUME"},
      {"purge /data", "AMOUNT"},
      {"purge /data 10%", "percentages are not known"},
      {"purge /data 5X", "the unit \"X\" is not known"},
      {"purge /data 0", "there is nothing to free"},
      {"purge /data 1M --urgency 5", "--urgency"},
      {"purge /data 1M --urgency 0", "--urgency"},
      {"purge /data 1M --timeout 301", "--timeout"},
      {"purge /data 1M --timeout soon", "--timeout"},
      {"purge /data 1M extra", "extra"},
      {"cancel", "TOKEN"},
  };
  for (const auto& c : cases) {
    const Finished run = ctlWithSocket(c.arguments);
    EXPECT_EQ(run.exit_code, 2) << c.arguments;
    EXPECT_THAT(run.err, HasSubstr(c.complaint)) << c.arguments;
    EXPECT_THAT(run.out, IsEmpty()) << c.arguments;
  }
}

TEST_F(CommandTest, ACancelRequestIsAcceptedAndTheToolDoesNotPromiseMore) {
  daemon_.on("clientCancelPurge",
             [this](const ipc::Arguments& in, const ipc::Responder& responder) {
               seen_.set(std::get<Dictionary>(in.at(0)));
               responder.reply({});
             });
  daemon_.start();
  const Finished run = ctlWithSocket("cancel mine");
  EXPECT_EQ(run.exit_code, 0) << run.err;
  EXPECT_THAT(run.out, HasSubstr("does not stop a purge"));
  EXPECT_EQ(seen_.get(), (Dictionary{{"SPACEKEEP_TOKEN", "mine"}}));
  EXPECT_EQ(ctlWithSocket("cancel mine --json").out, R"({"accepted":true,"token":"mine"})"
                                                     "\n");
}

TEST_F(CommandTest, HelpAndVersionExitWithZeroAndNeedNoDaemon) {
  const Finished help = ctl("--help");
  EXPECT_EQ(help.exit_code, 0);
  EXPECT_THAT(help.out,
              AllOf(HasSubstr("purge"), HasSubstr("cancel"), HasSubstr("Exit status: 0 done")));
  const Finished purge_help = ctl("purge --help");
  EXPECT_EQ(purge_help.exit_code, 0);
  EXPECT_THAT(purge_help.out, AllOf(HasSubstr("--wait-all"), HasSubstr("1.5GiB")));
  const Finished version = ctl("--version");
  EXPECT_EQ(version.exit_code, 0);
  EXPECT_THAT(version.out, StartsWith("spacekeepctl 0."));
}

TEST_F(CommandTest, ATrailingSlashOfTheVolumeDoesNotMatter) {
  answerWith(1 << 20);
  EXPECT_EQ(ctlWithSocket("purge /data// 1M").exit_code, 0);
  EXPECT_EQ(*stringAt(seen_.get(), "SPACEKEEP_VOLUME"), "/data");
  EXPECT_EQ(ctlWithSocket("purge / 1M").exit_code, 0);
  EXPECT_EQ(*stringAt(seen_.get(), "SPACEKEEP_VOLUME"), "/");
}

}  // namespace
}  // namespace spacekeep::ctl
