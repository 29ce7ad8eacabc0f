// "volumes" as a process: the volumes of this machine, the thresholds of the daemon.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <string>

#include "support/volumes/linux/linux_volumes.h"
#include "tests/linux/ctl/tool_test.h"

namespace spacekeep::ctl {
namespace {

using testing::HasSubstr;
using testing::IsEmpty;
using testing::StartsWith;

class VolumesCommand : public ToolTest {
 protected:
  ~VolumesCommand() override { daemon_.stop(); }

  void answerState(const Value& state) {
    daemon_.on("clientGetState", [state](const ipc::Arguments& in, const ipc::Responder& r) {
      EXPECT_EQ(std::get<std::string>(in.at(0)), "SPACEKEEP_USER_DEFAULTS");
      r.reply({ipc::OptionalValue(state)});
    });
    daemon_.start();
  }
};

std::string mountPoints() {
  LinuxVolumes volumes;
  std::string names;
  for (const auto& volume : volumes.getLocalVolumes()) names += volume + "\n";
  return names;
}

TEST_F(VolumesCommand, NamesAreTheMountPointsOfTheLocalVolumes) {
  const Finished run = ctlWithSocket("volumes --names");
  EXPECT_EQ(run.exit_code, 0);
  EXPECT_EQ(run.out, mountPoints());
  EXPECT_THAT(run.out, StartsWith("/"));
  EXPECT_THAT(run.err, IsEmpty());
}

TEST_F(VolumesCommand, WithoutADaemonTheThresholdsAreTheDefaultsAndItSaysSo) {
  const Finished run = ctlWithSocket("volumes");
  EXPECT_EQ(run.exit_code, 0);
  EXPECT_THAT(run.err, StartsWith("spacekeepctl: the thresholds are the defaults: cannot connect"));
  EXPECT_THAT(run.out, HasSubstr("  space   "));
  EXPECT_THAT(ctlWithSocket("volumes --json").out, StartsWith(R"({"default_thresholds":true,)"));
}

TEST_F(VolumesCommand, TheThresholdsAreThoseOfTheDaemon) {
  answerState(Dictionary{{"SPACEKEEP_LOW_SPACE_BYTES", 1'048'576},
                         {"SPACEKEEP_LOW_SPACE_INODES_PERCENT", 0}});
  const Finished run = ctlWithSocket("volumes --json");
  EXPECT_EQ(run.exit_code, 0);
  EXPECT_THAT(run.err, IsEmpty());
  EXPECT_THAT(run.out, StartsWith(R"({"default_thresholds":false,)"));
  // No volume of a machine that runs tests is smaller than 20 MiB, so 1 MiB it is.
  EXPECT_THAT(run.out, HasSubstr(R"("low_bytes":1048576,"low_inodes":0,)"));
  EXPECT_THAT(ctlWithSocket("volumes").out,
              HasSubstr("low below 1.0 MiB, very low below 341.3 KiB"));
}

TEST_F(VolumesCommand, ASettingThatTheDaemonDoesNotWorkWithIsNamed) {
  answerState(Dictionary{{"SPACEKEEP_LOW_SPACE_PERCENT", "much"}});
  const Finished run = ctlWithSocket("volumes");
  EXPECT_EQ(run.exit_code, 0);
  EXPECT_THAT(run.err,
              StartsWith("spacekeepctl: SPACEKEEP_LOW_SPACE_PERCENT is \"much\", but must be"));
}

}  // namespace
}  // namespace spacekeep::ctl
