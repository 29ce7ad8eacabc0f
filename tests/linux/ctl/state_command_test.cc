// "state" as a process, in front of a daemon that keeps what it is told.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <string>

#include "tests/linux/ctl/tool_test.h"

namespace spacekeep::ctl {
namespace {

using testing::AllOf;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::StartsWith;

class StateCommand : public ToolTest {
 protected:
  void serveState() {
    daemon_.on("clientSetState", [this](const ipc::Arguments& in, const ipc::Responder& r) {
      const auto& value = std::get<ipc::OptionalValue>(in.at(0));
      const auto& key = std::get<std::string>(in.at(1));
      seen_.update([&](Dictionary& state) {
        if (value) {
          state.set(key, *value);
        } else {
          state.remove(key);
        }
      });
      r.reply({});
    });
    daemon_.on("clientGetState", [this](const ipc::Arguments& in, const ipc::Responder& r) {
      const auto& key = std::get<std::string>(in.at(0));
      const Dictionary state = seen_.get();
      if (key == "SPACEKEEP_USER_DEFAULTS") return r.reply({ipc::OptionalValue(Value(state))});
      const Value* value = state.find(key);
      r.reply({value == nullptr ? ipc::OptionalValue() : ipc::OptionalValue(*value)});
    });
    daemon_.start();
  }
  ~StateCommand() override { daemon_.stop(); }

  void expectSet(const std::string& arguments, const std::string& key, const Value& value) {
    const Finished run = ctlWithSocket("state set " + arguments);
    EXPECT_EQ(run.exit_code, 0) << arguments << ": " << run.err;
    const Dictionary state = seen_.get();
    const Value* stored = state.find(key);
    ASSERT_NE(stored, nullptr) << arguments;
    EXPECT_EQ(*stored, value) << arguments;
  }
};

TEST_F(StateCommand, AValueIsStoredAsWhatItLooksLike) {
  serveState();
  expectSet("SPACEKEEP_CACHE_ENABLED false", "SPACEKEEP_CACHE_ENABLED", false);
  expectSet("SPACEKEEP_LOW_SPACE_BYTES 250M", "SPACEKEEP_LOW_SPACE_BYTES", 262'144'000);
  expectSet("SPACEKEEP_LOW_SPACE_PERCENT 2.5", "SPACEKEEP_LOW_SPACE_PERCENT", 2.5);
  expectSet("mine -5", "mine", -5);
  expectSet("mine \"two words\"", "mine", "two words");
  expectSet("mine 5 --type string", "mine", "5");
  expectSet("mine -- -v", "mine", "-v");
  expectSet("mine --type json \"[1,{\\\"a\\\":true}]\"", "mine", Array{1, Dictionary{{"a", true}}});
}

TEST_F(StateCommand, ASetSaysWhatStandsThereNow) {
  serveState();
  EXPECT_EQ(ctlWithSocket("state set SPACEKEEP_LOW_SPACE_BYTES 250M").out,
            "SPACEKEEP_LOW_SPACE_BYTES is now 262144000 (250.0 MiB), a number\n");
  EXPECT_EQ(ctlWithSocket("state set mine 250M --type string").out, "mine is now 250M, a string\n");
  EXPECT_EQ(ctlWithSocket("state set mine true --json").out, R"({"key":"mine","value":true})"
                                                             "\n");
}

TEST_F(StateCommand, AValueThatTheDaemonWouldNotWorkWithIsSentOnlyByForce) {
  serveState();
  const Finished kept = ctlWithSocket("state set SPACEKEEP_LOW_SPACE_PERCENT 60");
  EXPECT_EQ(kept.exit_code, 2);
  EXPECT_EQ(kept.err,
            "spacekeepctl: SPACEKEEP_LOW_SPACE_PERCENT is 60, but must be a number from 0 to 50 "
            "(percent); the default, 5, holds instead. Nothing was sent; --force sends it all the "
            "same\n");
  EXPECT_TRUE(seen_.get().empty());
  const Finished forced = ctlWithSocket("state set SPACEKEEP_LOW_SPACE_PERCENT 60 --force");
  EXPECT_EQ(forced.exit_code, 0);
  EXPECT_THAT(forced.err, StartsWith("spacekeepctl: warning: SPACEKEEP_LOW_SPACE_PERCENT is 60"));
  EXPECT_EQ(seen_.get(), (Dictionary{{"SPACEKEEP_LOW_SPACE_PERCENT", 60}}));
}

TEST_F(StateCommand, AWrongValueIsAnErrorOfTheArgument) {
  serveState();
  const Finished number = ctlWithSocket("state set mine many --type number");
  EXPECT_EQ(number.exit_code, 2);
  EXPECT_THAT(number.err, HasSubstr("\"many\" is no number"));
  const Finished type = ctlWithSocket("state set mine 1 --type int");
  EXPECT_EQ(type.exit_code, 2);
  EXPECT_THAT(type.err, HasSubstr("a type is string, number, bool, size or json, not \"int\""));
  EXPECT_TRUE(seen_.get().empty());
}

TEST_F(StateCommand, GetPrintsTheValueAlone) {
  seen_.set(Dictionary{{"a", 12}, {"b", "text"}, {"c", Data{{1, 2}}}, {"d", Array{"x"}}});
  serveState();
  EXPECT_EQ(ctlWithSocket("state get a").out, "12\n");
  EXPECT_EQ(ctlWithSocket("state get b").out, "text\n");
  EXPECT_EQ(ctlWithSocket("state get c").out, "<2 bytes>\n");
  EXPECT_EQ(ctlWithSocket("state get d").out, "[\"x\"]\n");
  EXPECT_EQ(ctlWithSocket("state get c --json").out, R"({"key":"c","value":[1,2]})"
                                                     "\n");
}

TEST_F(StateCommand, AKeyWithoutAValueHasAnExitCodeOfItsOwn) {
  serveState();
  const Finished unknown = ctlWithSocket("state get mine");
  EXPECT_EQ(unknown.exit_code, 6);
  EXPECT_EQ(unknown.err, "spacekeepctl: mine has no value\n");
  EXPECT_THAT(unknown.out, IsEmpty());
  const Finished known = ctlWithSocket("state get SPACEKEEP_LOW_SPACE_BYTES --json");
  EXPECT_EQ(known.exit_code, 6);
  EXPECT_EQ(known.out,
            R"({"error":"SPACEKEEP_LOW_SPACE_BYTES has no value, so its default 500.0 MiB holds"})"
            "\n");
}

TEST_F(StateCommand, UnsetTakesTheValueAway) {
  seen_.set(Dictionary{{"SPACEKEEP_CACHE_ENABLED", false}, {"mine", 1}});
  serveState();
  const Finished known = ctlWithSocket("state unset SPACEKEEP_CACHE_ENABLED");
  EXPECT_EQ(known.exit_code, 0);
  EXPECT_EQ(known.out, "SPACEKEEP_CACHE_ENABLED has no value, so its default true holds\n");
  EXPECT_EQ(ctlWithSocket("state unset mine --json").out, "{\"key\":\"mine\"}\n");
  EXPECT_TRUE(seen_.get().empty());
}

TEST_F(StateCommand, WhatCouldNotBeStoredIsToldWithTheDaemonsReason) {
  daemon_.on("clientSetState", [](const ipc::Arguments&, const ipc::Responder& responder) {
    responder.fail({"com.quorvel.Spacekeep.Error.NotStored", "no space left on the device"});
  });
  daemon_.start();
  const Finished set = ctlWithSocket("state set mine 1");
  EXPECT_EQ(set.exit_code, 5);
  EXPECT_EQ(set.err,
            "spacekeepctl: mine was not set: clientSetState failed: no space left on the device "
            "(com.quorvel.Spacekeep.Error.NotStored)\n");
  EXPECT_THAT(set.out, IsEmpty());
  const Finished unset = ctlWithSocket("state unset mine");
  EXPECT_EQ(unset.exit_code, 5);
  EXPECT_THAT(unset.err, StartsWith("spacekeepctl: mine was not unset: clientSetState failed"));
}

TEST_F(StateCommand, ListShowsStoredKeysAndTheDefaultsOfTheOthers) {
  seen_.set(Dictionary{{"SPACEKEEP_CACHE_ENABLED", true},
                       {"SPACEKEEP_RECENT_SERVICE_STATS", Data{{1, 2, 3}}},
                       {"mine", "x"}});
  serveState();
  const Finished run = ctlWithSocket("state list");
  EXPECT_EQ(run.exit_code, 0) << run.err;
  EXPECT_THAT(run.out, AllOf(HasSubstr("SPACEKEEP_CACHE_ENABLED             true\n"),
                             HasSubstr("SPACEKEEP_RECENT_SERVICE_STATS      <3 bytes>\n"),
                             HasSubstr("SPACEKEEP_FINISH_EARLY              (false)\n"),
                             HasSubstr("mine                                x\n")));
  EXPECT_EQ(ctlWithSocket("state list --json").out,
            R"({"state":{"SPACEKEEP_CACHE_ENABLED":true,"SPACEKEEP_RECENT_SERVICE_STATS":[1,2,3],)"
            R"("mine":"x"}})"
            "\n");
}

TEST_F(StateCommand, AStateThatNobodyEverStoredIsEmpty) {
  daemon_.on("clientGetState", [](const ipc::Arguments&, const ipc::Responder& responder) {
    responder.reply({ipc::OptionalValue()});
  });
  daemon_.start();
  EXPECT_EQ(ctlWithSocket("state list --json").out, "{\"state\":{}}\n");
  EXPECT_THAT(ctlWithSocket("state list").out,
              HasSubstr("SPACEKEEP_CACHE_ENABLED             (true)\n"));
}

TEST_F(StateCommand, NamesAreForCompletionsAndNeedNoDaemon) {
  const std::string known =
      "SPACEKEEP_CACHE_ENABLED\nSPACEKEEP_FINISH_EARLY\nSPACEKEEP_LOW_SPACE_BYTES\n"
      "SPACEKEEP_LOW_SPACE_INODES_PERCENT\nSPACEKEEP_LOW_SPACE_PERCENT\n";
  const Finished alone = ctlWithSocket("state list --names");
  EXPECT_EQ(alone.exit_code, 3);
  EXPECT_EQ(alone.out, known);
  EXPECT_EQ(ctlWithSocket("state list --names --json").out, known);
  seen_.set(Dictionary{{"mine", "x"}});
  serveState();
  const Finished run = ctlWithSocket("state list --names");
  EXPECT_EQ(run.exit_code, 0);
  EXPECT_EQ(run.out, known + "mine\n");
}

TEST_F(StateCommand, WithoutADaemonEveryCommandExitsWithThree) {
  for (const char* command : {"state get a", "state set a 1", "state unset a", "state list"}) {
    EXPECT_EQ(ctlWithSocket(command).exit_code, 3) << command;
  }
}

}  // namespace
}  // namespace spacekeep::ctl
