// Services with one planted fault each: the check that is about it fails, and no other.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <string>

#include "tests/linux/ctl/check_service_world.h"

namespace spacekeep::ctl {
namespace {

using testing::ElementsAre;
using testing::HasSubstr;

struct Planted {
  const char* fault;
  const char* check;   ///< that fails
  const char* reason;  ///< some of what it says
  const char* patience = "3";
};

std::ostream& operator<<(std::ostream& stream, const Planted& planted) {
  return stream << planted.fault;
}

class PlantedFault : public CheckServiceTest, public testing::WithParamInterface<Planted> {};

TEST_P(PlantedFault, FailsTheCheckThatIsAboutItAndNoOther) {
  const Planted& planted = GetParam();
  const Finished run = onVolume(300, checking(std::string("--yes --patience ") + planted.patience +
                                              " --data " + cache() + " --in-use " + cache()) +
                                         badService(planted.fault));
  EXPECT_EQ(run.exit_code, 7) << run.err;
  EXPECT_THAT(checksThatWere("FAILED", run.out), ElementsAre(planted.check)) << run.out;
  EXPECT_THAT(run.out, HasSubstr(planted.reason));
}

std::string nameOf(const testing::TestParamInfo<Planted>& planted) {
  std::string name = planted.param.fault;
  for (char& letter : name) letter = letter == '-' ? '_' : letter;
  return name;
}

INSTANTIATE_TEST_SUITE_P(
    CheckService, PlantedFault,
    testing::Values(
        Planted{"silent-ping", "ping", "servicePing was not answered within 3 s."},
        Planted{"frees-on-query", "query-frees-nothing", " vanished."},
        Planted{"boasts-at-first", "query-amounts", "It says that it could free 1.0 PiB"},
        Planted{"offers-less-at-higher-urgency", "query-urgencies",
                "at urgency 3, and only 2.9 MiB"},
        Planted{"offers-on-every-volume", "unknown-volume", "it offers 5.8 MiB"},
        Planted{"silent-notify", "other-members", "serviceNotify was not answered"},
        Planted{"drops-what-comes-together", "back-to-back", "Of 8 queries"},
        Planted{"dies-of-odd-requests", "odd-requests",
                "When it was sent an amount below 0, its process was ended by signal 6 (Aborted)."},
        Planted{"leaks-descriptors", "upkeep", "200 more open descriptors"},
        Planted{"leaks-memory", "upkeep", " more memory than before"},
        Planted{"frees-for-nothing", "purge-nothing", "Asked for 0 bytes it gave up 20.0 KiB"},
        Planted{"frees-for-every-volume", "purge-other-volume", "a volume that does not exist"},
        Planted{"stingy", "purge-share", "and gave up 380.0 KiB"},
        Planted{"greedy", "purge-limit", "it gave up 4.3 MiB"},
        Planted{"ignores-cancel", "cancel", "The purge went on for "},
        Planted{"silent-after-cancel", "cancel", "The purge was not answered within 3 s"},
        Planted{"dies-with-the-daemon", "daemon-gone", "was ended by signal 6 (Aborted)"},
        Planted{"never-comes-back", "daemon-gone", "it did not check in again"},
        Planted{"keeps-some", "purge-everything", "was asked for more than it has"},
        Planted{"takes-files-in-use", "in-use", "which was mapped into memory"},
        Planted{"silent-purge", "answers", "servicePurge at urgency 4 was not answered"},
        Planted{"fails-purges", "answers", "answered with an error: not now"},
        Planted{"answers-twice", "answers-once", "servicePurgeable was answered 2 times"},
        Planted{"answers-with-text", "answer-form", "\"SPACEKEEP_AMOUNT\" that is not a number"},
        Planted{"lies", "honest-amounts", "it said that it had freed 2.9 MiB"},
        Planted{"slow", "in-time", "the daemon waits 8 s", "20"},
        Planted{"ends-at-once", "reached", "its process ended with status 3"}),
    nameOf);

using CheckServiceFault = CheckServiceTest;

TEST_F(CheckServiceFault, WithoutTheNamesOfItsFilesALieIsSeenOnTheVolume) {
  const Finished run = onVolume(300, checking("--yes --patience 3") + badService("lies"));
  EXPECT_EQ(run.exit_code, 7) << run.err;
  EXPECT_THAT(checksThatWere("FAILED", run.out), ElementsAre("honest-amounts")) << run.out;
  EXPECT_THAT(checksThatWere("not applicable", run.out), ElementsAre("in-use"));
}

TEST_F(CheckServiceFault, WithoutTheNamesOfItsFilesThreeTimesTheShareIsSeenOnTheVolume) {
  const Finished run = onVolume(300, checking("--yes --patience 3") + badService("greedy"));
  EXPECT_THAT(checksThatWere("FAILED", run.out), ElementsAre("purge-limit")) << run.out;
  EXPECT_THAT(run.out, HasSubstr("is not known without --data"));
}

TEST_F(CheckServiceFault, WhatTheServiceWroteLastIsShownWhenSomethingFailed) {
  const Finished run = onVolume(
      1, checking("--yes --patience 3") + "-- " + program("tests/bad-service") + " nonsense");
  EXPECT_EQ(run.exit_code, 7);
  EXPECT_THAT(run.err, HasSubstr("The last that the service wrote:\n  usage: bad-service"));
}

}  // namespace
}  // namespace spacekeep::ctl
