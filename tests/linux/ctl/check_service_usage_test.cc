// How the check is asked for, and what it does not do without being told to.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <string>

#include "tests/linux/ctl/check_service_world.h"

namespace spacekeep::ctl {
namespace {

using testing::AllOf;
using testing::EndsWith;
using testing::HasSubstr;
using testing::IsEmpty;

using CheckServiceUsage = CheckServiceTest;

TEST_F(CheckServiceUsage, WithoutAYesOrATerminalNothingIsStarted) {
  const Finished run = ctl("check-service --volume /tmp -- /bin/false");
  EXPECT_EQ(run.exit_code, 2);
  EXPECT_THAT(run.out, IsEmpty());
  EXPECT_THAT(run.err, AllOf(HasSubstr("--yes"), HasSubstr("--no-purge")));
}

TEST_F(CheckServiceUsage, ACommandAndASocketTogetherAreOneTooMany) {
  EXPECT_EQ(ctl("check-service --yes --volume /tmp").exit_code, 2);
  const Finished run = ctl("check-service --yes --volume /tmp --endpoint /tmp/s -- /bin/true");
  EXPECT_EQ(run.exit_code, 2);
  EXPECT_THAT(run.err, HasSubstr("either the command of the service after --, or its socket"));
}

TEST_F(CheckServiceUsage, AMissingVolumeIsNamed) {
  const Finished run = ctl("check-service --yes --volume /no/such -- /bin/true");
  EXPECT_EQ(run.exit_code, 2);
  EXPECT_THAT(run.err, HasSubstr("/no/such is no volume"));
  EXPECT_EQ(ctl("check-service --yes -- /bin/true").exit_code, 2);
}

TEST_F(CheckServiceUsage, DataThatLiesElsewhereIsRefused) {
  const Finished run = ctl("check-service --yes --volume /tmp --data /proc -- /bin/true");
  EXPECT_EQ(run.exit_code, 2);
  EXPECT_THAT(run.err, HasSubstr("/proc is not on the volume /tmp"));
  EXPECT_THAT(ctl("check-service --yes --volume /tmp --in-use /no/such -- /bin/true").err,
              HasSubstr("/no/such does not exist"));
}

TEST_F(CheckServiceUsage, AProgramThatCannotBeStartedExitsWithThree) {
  const Finished run = ctl("check-service --yes --volume /tmp -- /no/such/service");
  EXPECT_EQ(run.exit_code, 3);
  EXPECT_THAT(run.err, HasSubstr("cannot start /no/such/service: No such file or directory"));
}

TEST_F(CheckServiceUsage, ASocketThatNobodyServesExitsWithThree) {
  const Finished run =
      ctl("check-service --yes --json --volume /tmp --endpoint /tmp/no-such-socket");
  EXPECT_EQ(run.exit_code, 3);
  EXPECT_THAT(run.err, HasSubstr("nobody listens at /tmp/no-such-socket"));
  EXPECT_EQ(run.out, "{\"error\":\"nobody listens at /tmp/no-such-socket\"}\n");
}

TEST_F(CheckServiceUsage, OptionsOfTheServiceAreTheService) {
  const Finished run = ctl("check-service --no-purge --volume /tmp -- /bin/sh -c \"exit 9\"");
  EXPECT_EQ(run.exit_code, 7);
  EXPECT_THAT(run.out, HasSubstr("its process ended with status 9 before it was reached"));
}

/// On a terminal a person is asked; what they answer comes from a script here.
TEST_F(CheckServiceUsage, ANoOnTheTerminalLeavesEverythingAsItIs) {
  const Finished run = onVolume(5, "echo n | script -qec \"" + checking("") + badService("none") +
                                       "\" /dev/null || true\nls " + cache() + " | wc -l");
  EXPECT_THAT(run.out, HasSubstr("all the data that it can give up on " + volume()));
  EXPECT_THAT(run.out, HasSubstr("Go on? [y/N]"));
  EXPECT_THAT(run.out, EndsWith("5\n"));
}

TEST_F(CheckServiceUsage, AYesOnTheTerminalStartsTheCheck) {
  const Finished run = onVolume(100, "echo y | script -qec \"" + checking("") + badService("none") +
                                         "\" /dev/null\nls " + cache() + " | wc -l");
  EXPECT_THAT(run.out, HasSubstr("checks: "));
  EXPECT_THAT(run.out, EndsWith("\n0\n"));
}

TEST_F(CheckServiceUsage, AnInterruptionTakesTheServiceAndTheFolderAlong) {
  const Finished run = onVolume(
      1, "export TMPDIR=" + volume() + "\n" + checking("--yes") +
             "-- /bin/sleep 1000 &\ntool=$!\n" +
             "until pgrep -P $tool >/dev/null; do sleep 0.01; done\nservice=$(pgrep -P $tool)\n" +
             "kill -TERM $tool\nwait $tool || echo ended with $?\n" +
             "while kill -0 $service 2>/dev/null; do sleep 0.01; done\nls " + volume());
  EXPECT_EQ(run.out, "ended with 143\ncache\n");
}

}  // namespace
}  // namespace spacekeep::ctl
