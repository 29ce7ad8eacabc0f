// "status" as a process: what it asks the daemon, and what it does without an answer.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <atomic>
#include <string>

#include "support/volumes/linux/linux_volumes.h"
#include "tests/linux/ctl/tool_test.h"

namespace spacekeep::ctl {
namespace {

using testing::AllOf;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::Not;

class StatusCommand : public ToolTest {
 protected:
  StatusCommand() { answerWithEmptyState(); }
  ~StatusCommand() override { daemon_.stop(); }

  /// A MiB more at each urgency, from one service.
  void answer(const char* operation) {
    daemon_.on(operation, [this](const ipc::Arguments& in, const ipc::Responder& responder) {
      const auto& request = std::get<Dictionary>(in.at(0));
      asked_.update([&](auto& list) { list.push_back(request); });
      const std::int64_t bytes = request.find("SPACEKEEP_URGENCY")->asSigned().value_or(0) << 20;
      responder.reply(sdk::outcome({{"com.example.photos", bytes},
                                    {"SPACEKEEP_TOTAL_AVAILABLE", bytes},
                                    {"SPACEKEEP_VOLUME", *request.find("SPACEKEEP_VOLUME")}}));
    });
  }
  void refuse(const char* operation) {
    daemon_.on(operation, [](const ipc::Arguments&, const ipc::Responder& responder) {
      responder.reply(sdk::noDictionary());
    });
  }

  static std::string someVolume() { return LinuxVolumes().getLocalVolumes().at(0); }
  [[nodiscard]] Finished status(const std::string& more = "") {
    return ctlWithSocket("status --volume " + someVolume() + " " + more);
  }

  rt::Guarded<std::vector<Dictionary>> asked_;
};

TEST_F(StatusCommand, AsksAtEveryUrgencyByItself) {
  answer(kItemized);
  daemon_.start();
  const Finished run = status();
  EXPECT_EQ(run.exit_code, 0) << run.err;
  EXPECT_THAT(run.err, IsEmpty());
  EXPECT_THAT(run.out, HasSubstr("    com.example.photos     1.0 MiB     2.0 MiB     3.0 MiB     "
                                 "4.0 MiB\n"));
  EXPECT_THAT(run.out, HasSubstr("3.0 MiB could be freed at urgency 3, the default"));
  const auto asked = asked_.get();
  ASSERT_EQ(asked.size(), 4U);
  for (int i = 0; i < 4; ++i) {
    EXPECT_EQ(asked[static_cast<std::size_t>(i)], (Dictionary{{"SPACEKEEP_VOLUME", someVolume()},
                                                              {"SPACEKEEP_URGENCY", i + 1},
                                                              {"SPACEKEEP_EXACT_URGENCY", true}}));
  }
}

TEST_F(StatusCommand, AUserWithoutTheItemizedRightGetsTheTotals) {
  refuse(kItemized);
  answer(kPlain);
  daemon_.start();
  const Finished run = status();
  EXPECT_EQ(run.exit_code, 0) << run.err;
  EXPECT_THAT(run.out, HasSubstr("    in total         1.0 MiB     2.0 MiB     3.0 MiB"));
  EXPECT_THAT(run.out, Not(HasSubstr("com.example.photos")));
}

TEST_F(StatusCommand, AUserWithoutAnyRightGetsTheVolumesAndAHint) {
  refuse(kItemized);
  refuse(kPlain);
  daemon_.start();
  const Finished run = status();
  EXPECT_EQ(run.exit_code, 4);
  EXPECT_THAT(run.out, HasSubstr("  space   "));
  EXPECT_THAT(run.out, Not(HasSubstr("could be freed")));
  EXPECT_THAT(run.err, AllOf(HasSubstr("\"PURGEABLE_ENTITLEMENT\""),
                             HasSubstr("members of the group spacekeep")));
}

TEST_F(StatusCommand, AUserWhoMayNotConnectIsToldWhereToLook) {
  daemon_.turnEverybodyAway();
  daemon_.start();
  const Finished run = status();
  EXPECT_EQ(run.exit_code, 4);
  EXPECT_THAT(run.out, HasSubstr("  space   "));
  EXPECT_THAT(run.err, AllOf(HasSubstr("CLIENT_ENTITLEMENT"), HasSubstr("spacekeepctl doctor")));
}

TEST_F(StatusCommand, WithoutADaemonThereAreTheVolumesByTheDefaultThresholds) {
  const Finished run = status();
  EXPECT_EQ(run.exit_code, 3);
  EXPECT_THAT(run.out, HasSubstr("  space   "));
  EXPECT_THAT(run.err, AllOf(HasSubstr("the thresholds are the defaults"),
                             HasSubstr("what could be freed is not known")));
}

TEST_F(StatusCommand, AVolumeThatIsNoneIsRefused) {
  const Finished run = ctlWithSocket("status --volume /proc");
  EXPECT_EQ(run.exit_code, 4);
  EXPECT_THAT(run.err, HasSubstr("/proc is not the mount point of a local volume"));
  EXPECT_THAT(run.out, IsEmpty());
}

TEST_F(StatusCommand, JsonTellsTheSame) {
  answer(kItemized);
  daemon_.start();
  const Finished run = status("--json");
  EXPECT_EQ(run.exit_code, 0) << run.err;
  EXPECT_THAT(run.out, AllOf(HasSubstr(R"("offers":{"detail":"services")"),
                             HasSubstr(R"({"bytes":4194304,"id":"com.example.photos"})")));
  EXPECT_THAT(run.out, Not(HasSubstr("why_incomplete")));
}

TEST_F(StatusCommand, WhoeverWasLateIsAskedOnceMore) {
  std::atomic<int> asked_at_two = 0;
  daemon_.on(kItemized, [&](const ipc::Arguments& in, const ipc::Responder& responder) {
    const auto& request = std::get<Dictionary>(in.at(0));
    Dictionary answer{{"SPACEKEEP_TOTAL_AVAILABLE", 0}};
    if (request.find("SPACEKEEP_URGENCY")->asSigned() == 2) {
      if (asked_at_two++ == 0) rt::sleepNs(300'000'000);  // the daemon waits, in vain
      if (asked_at_two == 2) answer = {{"late", 5}, {"SPACEKEEP_TOTAL_AVAILABLE", 5}};
    }
    responder.reply(sdk::outcome(answer));
  });
  const auto running = daemon_.run();
  const Finished run = status();
  EXPECT_EQ(run.exit_code, 0) << run.err;
  EXPECT_EQ(asked_at_two, 2);
  EXPECT_THAT(run.out, HasSubstr("    late                   ?         5 B           ?"));
}

TEST_F(StatusCommand, OnATerminalWhatTakesLongerThanASecondSaysSo) {
  daemon_.on(kItemized, [this](const ipc::Arguments&, const ipc::Responder& responder) {
    EXPECT_TRUE(sdk::eventually([this] {
      return onTerminalSoFar().find("1 s, asking the services about") != std::string::npos;
    }));
    responder.reply(sdk::outcome({{"SPACEKEEP_TOTAL_AVAILABLE", 0}}));
  });
  daemon_.start();
  const Finished run = ctlOnTerminal(80, "status --volume " + someVolume());
  EXPECT_EQ(run.exit_code, 0) << run.out;
  EXPECT_THAT(run.out, HasSubstr("(urgency 1 of 4)"));
  EXPECT_THAT(run.out, HasSubstr("\r\x1b[K" + someVolume() + "  "));
}

TEST_F(StatusCommand, TellsWhatWasDoneLastWhereTheDaemonRemembers) {
  answer(kItemized);
  daemon_.on("clientHistory", [this](const ipc::Arguments& in, const ipc::Responder& responder) {
    seen_.set(std::get<Dictionary>(in.at(0)));
    responder.reply(
        sdk::outcome({{"SPACEKEEP_ENTRIES",
                       Array{Dictionary{{"SPACEKEEP_KIND", "low space"},
                                        {"SPACEKEEP_AMOUNT", 2 << 20},
                                        {"SPACEKEEP_AMOUNT_FREED", 1 << 20},
                                        {"SPACEKEEP_WHY_SHORT", "nothing more to give"}}}}}));
  });
  daemon_.start();
  EXPECT_THAT(status().out,
              HasSubstr("\n  once the daemon, short of space, asked for 2.0 MiB and got 1.0 MiB: "
                        "nothing more to give\n"));
  EXPECT_EQ(seen_.get(), (Dictionary{{"SPACEKEEP_VOLUME", someVolume()}, {"SPACEKEEP_LIMIT", 4}}));
  EXPECT_THAT(status("--json").out, HasSubstr("\"past\":[{\"asked_bytes\":2097152"));
  const Finished explained = ctlWithSocket("explain " + someVolume());
  EXPECT_THAT(explained.out, HasSubstr("What the daemon did here last:"));
  EXPECT_THAT(explained.out, HasSubstr("more to give at any urgency"));
}

TEST_F(StatusCommand, IsTheSameWhereTheDaemonKeepsNoHistory) {
  answer(kItemized);
  daemon_.start();
  const Finished run = status("--json");
  EXPECT_EQ(run.exit_code, 0) << run.err;
  EXPECT_THAT(run.err, IsEmpty());
  EXPECT_EQ(run.out.find("past"), std::string::npos);
}

}  // namespace
}  // namespace spacekeep::ctl
