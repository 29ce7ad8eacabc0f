// The doctor on the daemon's socket, and on who may do what.
#include "tests/linux/ctl/doctor_world.h"

namespace spacekeep::ctl::doctor {
namespace {

using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;

class DoctorOnTheDaemon : public DoctorTest {
 protected:
  Group look() { return daemonGroup(place(), contact_); }
  Contact contact_ = noDaemon();
};

TEST_F(DoctorOnTheDaemon, ADaemonThatAnswersIsFine) {
  startDaemon();
  const Group group = look();
  EXPECT_THAT(badNews(group), IsEmpty()) << allTexts(group);
  EXPECT_TRUE(contact_.answers());
}

TEST_F(DoctorOnTheDaemon, AMissingSocket) {
  const Group group = look();
  EXPECT_THAT(badNews(group), ElementsAre("problem socket-missing"));
  EXPECT_THAT(allTexts(group), HasSubstr("systemctl enable --now spacekeepd.socket"));
}

TEST_F(DoctorOnTheDaemon, SomethingElseInThePlaceOfTheSocket) {
  std::ofstream(directory_.daemonSocket()) << "";
  EXPECT_THAT(badNews(look()), ElementsAre("problem socket-kind"));
}

TEST_F(DoctorOnTheDaemon, ASocketThatADaemonLeftBehind) {
  std::string why;
  ASSERT_NE(ipc::bindListeningSocket(directory_.daemonSocket(), 0666, why), nullptr) << why;
  EXPECT_THAT(badNews(look()), ElementsAre("problem socket-stale"));
}

TEST_F(DoctorOnTheDaemon, ASocketThatNotEverybodyMayUse) {
  startDaemon();
  chmod(directory_.daemonSocket().c_str(), 0660);
  const Group group = look();
  EXPECT_THAT(badNews(group), ElementsAre("advice socket-mode"));
  EXPECT_THAT(allTexts(group), HasSubstr("mode 0660"));
}

TEST_F(DoctorOnTheDaemon, ADirectoryInWhichOthersCouldTakeTheDaemonsPlace) {
  startDaemon();
  chmod(directory_.path().c_str(), 0777);
  EXPECT_THAT(badNews(look()), ElementsAre("problem socket-directory"));
}

TEST_F(DoctorOnTheDaemon, ASocketOfSomebodyElse) {
  if (geteuid() != 0) GTEST_SKIP() << "only root can give a file away";
  startDaemon();
  ASSERT_EQ(chown(directory_.daemonSocket().c_str(), 4242, 0), 0);
  EXPECT_THAT(badNews(look()), ElementsAre("problem socket-owner"));
}

TEST_F(DoctorOnTheDaemon, ADaemonThatTakesTheConnectionAndSaysNothing) {
  std::string why;
  listening_.push_back(ipc::bindListeningSocket(directory_.daemonSocket(), 0666, why));
  const Group group = look();
  EXPECT_THAT(badNews(group), ElementsAre("problem silent")) << allTexts(group);
  EXPECT_EQ(contact_.outcome, Contact::Outcome::kSilent);
}

TEST_F(DoctorOnTheDaemon, ADaemonThatTurnsThisUserAwayIsThere) {
  daemon_.turnEverybodyAway();
  daemon_.start();
  EXPECT_THAT(badNews(look()), IsEmpty());
  EXPECT_EQ(contact_.outcome, Contact::Outcome::kRefused);
}

class DoctorOnRights : public DoctorTest {
 protected:
  [[nodiscard]] Group look() const { return rightsGroup(place(), noDaemon()); }
  /// What root finds where the daemon runs as somebody else.
  [[nodiscard]] Group lookForAnotherUser() const {
    chmod(directory_.path().c_str(), 0755);  // it was made for its owner alone
    Place another = place();
    another.own_user = 4242;
    return rightsGroup(another, noDaemon());
  }
  static constexpr const char* kVendor = "usr/lib/spacekeep/entitlements.d/";
  static constexpr const char* kOwn = "etc/spacekeep/entitlements.d/";
};

/// The groups of the shipped rules need not be on the machine that runs the tests.
std::vector<std::string> withoutUnknownGroups(const Group& group) {
  Group rest{.name = group.name};
  for (const auto& finding : group.findings) {
    if (finding.check != "rule-remark" || finding.text.find("spacekeep") == std::string::npos) {
      rest.findings.push_back(finding);
    }
  }
  return badNews(rest);
}

TEST_F(DoctorOnRights, TheShippedRulesAreFine) {
  if (geteuid() != 0) GTEST_SKIP() << "the shipped rules grant nothing to this user";
  const Group group = look();
  EXPECT_THAT(withoutUnknownGroups(group), IsEmpty()) << allTexts(group);
  EXPECT_THAT(allTexts(group), HasSubstr("holds CLIENT_ENTITLEMENT (10-root.plist)"));
}

TEST_F(DoctorOnRights, ABrokenRuleFile) {
  write(kVendor + std::string("40-bad.plist"), "no property list");
  EXPECT_THAT(withoutUnknownGroups(look()), testing::Contains("problem rule-file"));
}

TEST_F(DoctorOnRights, AKeyThatNobodyKnowsTakesTheWholeFileOut) {
  write(kVendor + std::string("40-odd.plist"), dict(entry("MATCH_USERS", text("root"))));
  const Group group = look();
  EXPECT_THAT(withoutUnknownGroups(group), testing::Contains("problem rule-file"));
  EXPECT_THAT(allTexts(group), HasSubstr("40-odd.plist grants nothing"));
}

TEST_F(DoctorOnRights, ARuleFileThatOthersMayWrite) {
  chmod(path(kVendor + std::string("20-spacekeep.plist")).c_str(), 0666);
  const Group group = look();
  EXPECT_THAT(withoutUnknownGroups(group), testing::Contains("problem rule-file"));
  EXPECT_THAT(allTexts(group), HasSubstr("can be written by others"));
}

TEST_F(DoctorOnRights, ARuleFileOfSomebodyElse) {
  if (geteuid() != 0) GTEST_SKIP() << "only root can give a file away";
  ASSERT_EQ(chown(path(kVendor + std::string("20-spacekeep.plist")).c_str(), 4242, 0), 0);
  const Group group = look();
  EXPECT_THAT(withoutUnknownGroups(group), testing::Contains("problem rule-file"));
  EXPECT_THAT(allTexts(group), HasSubstr("is owned by user 4242"));
}

TEST_F(DoctorOnRights, ADirectoryThatOthersMayWrite) {
  chmod(path(kVendor).c_str(), 0777);
  const auto bad = withoutUnknownGroups(look());
  EXPECT_THAT(bad, testing::IsSupersetOf({"problem rule-directory", "problem nobody"}));
}

TEST_F(DoctorOnRights, AnAdministratorsDirectoryThatOthersMayWriteShutsEverybodyOut) {
  chmod(path(kOwn).c_str(), 0775);
  const Group group = look();
  EXPECT_THAT(withoutUnknownGroups(group),
              ElementsAre("problem rule-directory", "problem nobody", "advice user"));
  EXPECT_THAT(allTexts(group), HasSubstr("so no rule of any directory holds"));
  EXPECT_THAT(allTexts(group), testing::Not(HasSubstr("the shipped rules belong into")));
}

TEST_F(DoctorOnRights, ADirectoryThatRootCanReadAndTheDaemonCannot) {
  if (geteuid() != 0) GTEST_SKIP() << "the rules have to be root's";
  EXPECT_THAT(withoutUnknownGroups(lookForAnotherUser()), IsEmpty());
  chmod(path(kOwn).c_str(), 0700);
  const Group group = lookForAnotherUser();
  EXPECT_THAT(badNews(group), ElementsAre("problem rule-directory"));
  EXPECT_THAT(allTexts(group), HasSubstr("is closed to the daemon (0700)"));
}

TEST_F(DoctorOnRights, ADirectoryAboveTheRulesThatTheDaemonCannotPass) {
  if (geteuid() != 0) GTEST_SKIP() << "the rules have to be root's";
  const std::string above = std::filesystem::path(path(kOwn)).parent_path().parent_path();
  chmod(above.c_str(), 0710);
  const Group group = lookForAnotherUser();
  EXPECT_THAT(badNews(group), ElementsAre("problem rule-directory"));
  EXPECT_THAT(allTexts(group), HasSubstr(above + " is closed to the daemon (0710)"));
}

TEST_F(DoctorOnRights, ARuleFileThatRootCanReadAndTheDaemonCannot) {
  if (geteuid() != 0) GTEST_SKIP() << "the rules have to be root's";
  const std::string file = path(kVendor + std::string("20-spacekeep.plist"));
  chmod(file.c_str(), 0640);
  const Group group = lookForAnotherUser();
  EXPECT_THAT(withoutUnknownGroups(group), ElementsAre("problem rule-file"));
  EXPECT_THAT(allTexts(group), HasSubstr(file + " is closed to the daemon (0640)"));
}

TEST_F(DoctorOnRights, AFileThatTakesThePlaceOfAnotherIsNamedAndNoProblem) {
  write(kOwn + std::string("20-spacekeep.plist"),
        contentOf(path(kVendor + std::string("20-spacekeep.plist"))));
  const Group group = look();
  EXPECT_THAT(allTexts(group),
              HasSubstr("etc/spacekeep/entitlements.d/20-spacekeep.plist takes the "
                        "place of " +
                        path(kVendor + std::string("20-spacekeep.plist"))));
  EXPECT_THAT(withoutUnknownGroups(group), testing::Not(testing::Contains("problem rule-file")));
}

TEST_F(DoctorOnRights, ABrokenFileThatTakesThePlaceOfAnotherTakesItsRightsAway) {
  write(kOwn + std::string("10-root.plist"), "broken");
  write(kOwn + std::string("20-spacekeep.plist"), "broken");
  write(kOwn + std::string("30-spacekeep-services.plist"), "broken");
  const auto bad = withoutUnknownGroups(look());
  EXPECT_THAT(bad, ElementsAre("problem rule-file", "problem rule-file", "problem rule-file",
                               "problem nobody", "advice user"));
}

TEST_F(DoctorOnRights, AUserThatNoRuleIsAboutIsToldHowToGetIn) {
  std::filesystem::remove(path(kVendor + std::string("10-root.plist")));
  const Group group = look();
  EXPECT_THAT(badNews(group), testing::Contains("advice user"));
  EXPECT_THAT(allTexts(group), HasSubstr("adduser " + userText(geteuid()) + " spacekeep"));
}

}  // namespace
}  // namespace spacekeep::ctl::doctor
