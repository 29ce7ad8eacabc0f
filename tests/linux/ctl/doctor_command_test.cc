// "doctor" as a process, and how it presents what it has found.
#include "ctl/doctor/doctor_report.h"
#include "tests/linux/ctl/doctor_world.h"

namespace spacekeep::ctl::doctor {
namespace {

using testing::AllOf;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::Not;

std::vector<Group> twoGroups() {
  Group daemon{.name = "daemon"};
  daemon.problem("socket-missing", "the socket is missing", "start the daemon");
  daemon.unseen("state", "the state cannot be listed");
  Group log{.name = "settings"};
  log.advice("log-tracing", "everything is logged", "set it to 4");
  log.ok("log", "it is there");
  return {daemon, Group{.name = "empty"}, log};
}

TEST(DoctorReport, ALinePerFindingUnderItsGroup) {
  EXPECT_EQ(textOf(twoGroups(), {}),
            "daemon\n"
            "  problem   the socket is missing. To do: start the daemon\n"
            "  not seen  the state cannot be listed\n"
            "settings\n"
            "  advice    everything is logged. To do: set it to 4\n"
            "  ok        it is there\n"
            "\n"
            "1 problem, 1 piece of advice; 1 thing could not be looked at (root sees more)\n");
}

TEST(DoctorReport, OnATerminalLinesAreBrokenUnderTheirText) {
  EXPECT_EQ(textOf({twoGroups()[0]}, {.columns = 34, .terminal = true, .colour = true}),
            "daemon\n"
            "  \x1b[31mproblem\x1b[0m   the socket is missing.\n"
            "            To do: start the\n"
            "            daemon\n"
            "  \x1b[2mnot seen\x1b[0m  the state cannot be\n"
            "            listed\n"
            "\n"
            "1 problem; 1 thing could not be\n"
            "looked at (root sees more)\n");
}

TEST(DoctorReport, NothingBadIsSaidInOneLine) {
  Group fine{.name = "daemon"};
  fine.ok("answers", "the daemon answers");
  EXPECT_EQ(textOf({fine}, {}), "daemon\n  ok        the daemon answers\n\nno problem\n");
}

TEST(DoctorReport, TheJsonNamesEachCheck) {
  EXPECT_EQ(jsonOf({twoGroups()[0]}),
            R"({"advice":0,"findings":[{"advice":"start the daemon","check":"socket-missing",)"
            R"("group":"daemon","severity":"problem","text":"the socket is missing"},)"
            R"({"check":"state","group":"daemon","severity":"not seen",)"
            R"("text":"the state cannot be listed"}],"not_seen":1,"problems":1})");
}

class DoctorCommand : public DoctorTest {
 protected:
  Finished doctor(const std::string& more = "") {
    return ctlWithSocket("doctor --root " + root() + " " + more);
  }
};

TEST_F(DoctorCommand, AHealthyRootHasNoProblem) {
  if (geteuid() != 0) GTEST_SKIP() << "the shipped rules grant nothing to this user";
  descriptor("a.plist", entry("SPACEKEEP_ID", text("a")));
  listenFor("a");
  startDaemon({"a"});
  const Finished run = doctor("--json");
  EXPECT_THAT(run.err, IsEmpty());
  // Whether a volume of this machine is short is not for the test to say.
  std::string report = run.out;
  if (report.find("volume-very-low") == std::string::npos) {
    EXPECT_EQ(run.exit_code, 0) << report;
    EXPECT_THAT(report, HasSubstr("\"problems\":0"));
  }
  for (const char* group :
       {"daemon", "rights", "descriptors", "services", "state", "settings", "daily pass"}) {
    EXPECT_THAT(report, HasSubstr(std::string("\"group\":\"") + group + "\"")) << group;
  }
}

TEST_F(DoctorCommand, WorksWithoutADaemonAndSaysSoByItsStatus) {
  const Finished run = doctor();
  EXPECT_EQ(run.exit_code, 7);
  EXPECT_THAT(run.err, IsEmpty());
  EXPECT_THAT(run.out, HasSubstr("  problem   " + directory_.daemonSocket() + " is missing"));
  EXPECT_THAT(run.out, HasSubstr("  not seen  whether services answer"));
}

TEST_F(DoctorCommand, ChangesNothing) {
  descriptor("a.plist", entry("SPACEKEEP_ID", text("a")));
  chmod(path("etc/spacekeep/entitlements.d").c_str(), 0777);
  std::filesystem::remove(path("var/lib/spacekeep/reserve"));
  const std::string list = "find " + root() + " -printf \"%p %m %s %T@ %C@\\n\" | sort";
  const std::string before = runShell(list, errFile()).out;
  EXPECT_EQ(doctor().exit_code, 7);
  EXPECT_EQ(runShell(list, errFile()).out, before);
  EXPECT_THAT(before, HasSubstr("a.plist"));
}

TEST_F(DoctorCommand, ARootThatIsNoneIsWrongUsage) {
  const Finished run = ctl("doctor --root /nowhere/at/all");
  EXPECT_EQ(run.exit_code, 2);
  EXPECT_THAT(run.err, HasSubstr("--root"));
}

TEST_F(DoctorCommand, AnOrdinaryUserIsToldWhatCouldNotBeLookedAt) {
  if (geteuid() != 0) GTEST_SKIP() << "only root can become another user";
  chmod(directory_.path().c_str(), 0755);
  const Finished run = runShell(
      "setpriv --reuid 4242 --regid 4242 --clear-groups " + toolPath() + " doctor --root " + root(),
      errFile());
  EXPECT_EQ(run.exit_code, 7) << run.out << run.err;
  EXPECT_THAT(run.out, AllOf(HasSubstr("  not seen  " + path("var/lib/spacekeep")),
                             HasSubstr("  advice    this user (user 4242) may not connect"),
                             HasSubstr("root sees more"), Not(HasSubstr("state-missing"))));
}

}  // namespace
}  // namespace spacekeep::ctl::doctor
