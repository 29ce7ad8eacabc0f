// The doctor on the daemon's state, its settings, the daily pass and the volumes.
#include "tests/linux/ctl/doctor_world.h"

namespace spacekeep::ctl::doctor {
namespace {

using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;

constexpr std::uint64_t kDay = 86'400;

class DoctorOnState : public DoctorTest {
 protected:
  [[nodiscard]] Group look(Contact::Outcome outcome = Contact::Outcome::kAnswers) const {
    return stateGroup(place(), contact(outcome));
  }
  [[nodiscard]] std::string directory() const { return path("var/lib/spacekeep"); }
};

TEST_F(DoctorOnState, AnOrdinaryOneIsFine) {
  const Group group = look();
  EXPECT_THAT(badNews(group), IsEmpty()) << allTexts(group);
}

TEST_F(DoctorOnState, AMissingOneIsAProblemOnceADaemonRuns) {
  std::filesystem::remove_all(directory());
  EXPECT_THAT(badNews(look()), ElementsAre("problem state-missing"));
  EXPECT_THAT(badNews(look(Contact::Outcome::kNone)), ElementsAre("advice state-missing"));
}

TEST_F(DoctorOnState, AFileInItsPlace) {
  std::filesystem::remove_all(directory());
  std::ofstream(directory()) << "";
  EXPECT_THAT(badNews(look()), ElementsAre("problem state-kind"));
}

TEST_F(DoctorOnState, ADirectoryOfSomebodyElse) {
  if (geteuid() != 0) GTEST_SKIP() << "only root can give a directory away";
  ASSERT_EQ(chown(directory().c_str(), 4242, 0), 0);
  const Group group = look();
  EXPECT_THAT(badNews(group), ElementsAre("problem state-owner"));
  EXPECT_THAT(allTexts(group), HasSubstr("belongs to user 4242"));
}

TEST_F(DoctorOnState, OneThatOthersMayLookInto) {
  chmod(directory().c_str(), 0755);
  EXPECT_THAT(badNews(look()), ElementsAre("advice state-mode"));
}

TEST_F(DoctorOnState, AReserveThatWasGivenBack) {
  std::filesystem::remove(directory() + "/reserve");
  EXPECT_THAT(badNews(look()), ElementsAre("advice state-reserve"));
}

TEST_F(DoctorOnState, SettingsThatWereDamaged) {
  for (const char* name : {"com.quorvel.spacekeep.corrupt-1700000000",
                           "com.quorvel.spacekeep.corrupt-1700000000-journal"}) {
    std::ofstream(directory() + "/" + name) << "";
  }
  const Group group = look();
  EXPECT_THAT(badNews(group), ElementsAre("advice state-damaged"));
  EXPECT_THAT(allTexts(group), HasSubstr("com.quorvel.spacekeep.corrupt-1700000000. "));
}

TEST_F(DoctorOnState, AVolumeWithoutRoomForIt) {
  if (geteuid() != 0) GTEST_SKIP() << "only root can mount";
  const std::string script = directory_.path() + "/script";
  std::ofstream(script) << "mount -t tmpfs -o size=100k,mode=0700 full " << directory() << "\n"
                        << "head -c 100k /dev/zero > " << directory() << "/all\n"
                        << toolPath() << " doctor --json --root " << root() << "\n";
  const Finished run = runShell("unshare --mount --propagation private bash " + script, errFile());
  std::remove(script.c_str());
  EXPECT_EQ(run.exit_code, 7) << run.err;
  EXPECT_THAT(run.out, HasSubstr("\"check\":\"state-room\""));
}

class DoctorOnSettings : public DoctorTest {
 protected:
  [[nodiscard]] Group look(Dictionary state = {}) const {
    return settingsGroup(place(), contact(Contact::Outcome::kAnswers, std::move(state)));
  }
  void setLevel(const std::string& value) const {
    write("etc/spacekeep/log.plist", dict(entry("LogLevel", value)));
  }
};

TEST_F(DoctorOnSettings, NoneAreFine) { EXPECT_THAT(badNews(look()), IsEmpty()); }

TEST_F(DoctorOnSettings, ALogLevelFileThatIsNotUsed) {
  setLevel(text("much"));
  EXPECT_THAT(badNews(look()), ElementsAre("problem log-file"));
  write("etc/spacekeep/log.plist", "LogLevel=5");
  EXPECT_THAT(badNews(look()), ElementsAre("problem log-file"));
}

TEST_F(DoctorOnSettings, LogLevelsThatSayNothingOrEverything) {
  setLevel("<integer>2</integer>");
  EXPECT_THAT(badNews(look()), ElementsAre("advice log-silent"));
  setLevel("<integer>3</integer>");
  EXPECT_THAT(badNews(look()), IsEmpty());
  setLevel("<integer>5</integer>");
  EXPECT_THAT(badNews(look()), ElementsAre("advice log-tracing"));
}

TEST_F(DoctorOnSettings, AThresholdThatTheDaemonDoesNotTake) {
  const Group group = look({{"SPACEKEEP_LOW_SPACE_PERCENT", "five"}});
  EXPECT_THAT(badNews(group), ElementsAre("advice low-space-setting"));
  EXPECT_THAT(allTexts(group), HasSubstr("SPACEKEEP_LOW_SPACE_PERCENT"));
}

class DoctorOnTheDailyPass : public DoctorTest {
 protected:
  [[nodiscard]] Group look(Contact::Outcome outcome = Contact::Outcome::kAnswers) const {
    return dailyGroup(place(), contact(outcome));
  }
  static constexpr const char* kLaunchFile =
      "usr/lib/spacekeep/launch.d/com.quorvel.Spacekeep.daily.plist";
  static constexpr const char* kRecord = "var/lib/spacekeep/com.quorvel.Spacekeep.daily.run";
};

TEST_F(DoctorOnTheDailyPass, OneThatIsDueNowAndThenIsFine) {
  ran(kDay);
  const Group group = look();
  EXPECT_THAT(badNews(group), IsEmpty()) << allTexts(group);
  EXPECT_THAT(allTexts(group), HasSubstr("due 24 h ago"));
}

TEST_F(DoctorOnTheDailyPass, OneThatIsOverdueIsAProblemOfADaemonThatRuns) {
  ran(5 * kDay);
  const Group group = look();
  EXPECT_THAT(badNews(group), ElementsAre("problem daily-overdue"));
  EXPECT_THAT(allTexts(group), HasSubstr("has not run for 5 days"));
  EXPECT_THAT(badNews(look(Contact::Outcome::kNone)), ElementsAre("advice daily-overdue"));
}

TEST_F(DoctorOnTheDailyPass, OneThatNeverWas) {
  std::filesystem::remove(path(kRecord));
  EXPECT_THAT(badNews(look()), ElementsAre("advice daily-never"));
}

TEST_F(DoctorOnTheDailyPass, AMemoryThatTellsNothing) {
  write(kRecord, dict(""));
  EXPECT_THAT(badNews(look()), ElementsAre("advice daily-record"));
}

TEST_F(DoctorOnTheDailyPass, ALaunchFileThatIsMissingOrBroken) {
  write(kLaunchFile, dict(entry("INTERVAL", "<integer>5</integer>")));
  EXPECT_THAT(badNews(look()), ElementsAre("problem launch-file"));
  std::filesystem::remove(path(kLaunchFile));
  EXPECT_THAT(badNews(look()), ElementsAre("problem launch-file-missing"));
}

TEST_F(DoctorOnTheDailyPass, ABrokenFileOfTheAdministratorHidesTheShippedOne) {
  write("etc/spacekeep/launch.d/com.quorvel.Spacekeep.daily.plist", "broken");
  const Group group = look();
  EXPECT_THAT(badNews(group), ElementsAre("problem launch-file"));
  EXPECT_THAT(allTexts(group), HasSubstr("etc/spacekeep/launch.d"));
}

VolumeSample sampleAt(SpaceLevel level) {
  return {.volume = "/data",
          .space = {.size_bytes = 1000, .available_bytes = 5},
          .thresholds = {.low_bytes = 50, .very_low_bytes = 10},
          .level = level};
}

TEST(DoctorOnVolumes, LowIsAdviceAndVeryLowAProblem) {
  EXPECT_THAT(badNews(volumesGroupOf({sampleAt(SpaceLevel::kEnough)})), IsEmpty());
  EXPECT_THAT(badNews(volumesGroupOf({sampleAt(SpaceLevel::kLow)})),
              ElementsAre("advice volume-low"));
  const Group group = volumesGroupOf({sampleAt(SpaceLevel::kVeryLow)});
  EXPECT_THAT(badNews(group), ElementsAre("problem volume-very-low"));
  EXPECT_THAT(allTexts(group), HasSubstr("/data is very low: less than 10 B free. "
                                         "spacekeepctl explain /data"));
}

TEST(DoctorOnVolumes, NoneIsAProblem) {
  EXPECT_THAT(badNews(volumesGroupOf({})), ElementsAre("problem no-volume"));
}

}  // namespace
}  // namespace spacekeep::ctl::doctor
