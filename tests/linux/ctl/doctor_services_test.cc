// The doctor on descriptor files, and on the services that they declare.
#include <sys/socket.h>

#include "ctl/doctor/listening_sockets.h"
#include "tests/linux/ctl/doctor_world.h"

namespace spacekeep::ctl::doctor {
namespace {

using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;

class DoctorOnDescriptors : public DoctorTest {
 protected:
  [[nodiscard]] Group look() const { return descriptorsGroup(place(), readDeclarations(root())); }
};

TEST_F(DoctorOnDescriptors, NoneIsFine) { EXPECT_THAT(badNews(look()), IsEmpty()); }

TEST_F(DoctorOnDescriptors, WellFormedOnesAreFineAlsoInDirectoriesBelow) {
  std::filesystem::create_directory(path("System/Library/Spacekeep/more"));
  chmod(path("System/Library/Spacekeep/more").c_str(), 0755);
  descriptor("a.plist", entry("SPACEKEEP_ID", text("a")) + entry("TITLE", text("anything")));
  descriptor("more/b", entry("SPACEKEEP_ID", text("b")) +
                           entry("SPACEKEEP_SERVICES", "<array>" + text("PERIODIC") + "</array>") +
                           entry("SPACEKEEP_NOTIFICATIONS", "<array/>"));
  const Group group = look();
  EXPECT_THAT(badNews(group), IsEmpty()) << allTexts(group);
  EXPECT_THAT(allTexts(group), HasSubstr("2 services are declared"));
}

TEST_F(DoctorOnDescriptors, AFileThatIsNoPropertyList) {
  write("System/Library/Spacekeep/notes.txt", "call anna");
  const Group group = look();
  EXPECT_THAT(badNews(group), ElementsAre("problem descriptor-unused"));
  EXPECT_THAT(allTexts(group), HasSubstr("notes.txt declares no service"));
}

TEST_F(DoctorOnDescriptors, APropertyListThatIsNoDictionary) {
  write("System/Library/Spacekeep/list.plist", plist("<array/>"));
  const Group group = look();
  EXPECT_THAT(badNews(group), ElementsAre("problem descriptor-unused"));
  EXPECT_THAT(allTexts(group), HasSubstr("it holds no dictionary"));
}

TEST_F(DoctorOnDescriptors, ALinkToNowhere) {
  std::filesystem::create_symlink("/nowhere/at/all", path("System/Library/Spacekeep/x.plist"));
  EXPECT_THAT(badNews(look()), ElementsAre("problem descriptor-unused"));
}

TEST_F(DoctorOnDescriptors, AMissingIdIsWhatTheDaemonDoesNotTell) {
  descriptor("a.plist", entry("SPACEKEEP_SERVICES", "<array/>"));
  descriptor("b.plist", entry("SPACEKEEP_ID", "<integer>5</integer>"));
  const Group group = look();
  EXPECT_THAT(badNews(group),
              ElementsAre("problem descriptor-unused", "problem descriptor-unused"));
  EXPECT_THAT(allTexts(group), HasSubstr("it has no SPACEKEEP_ID"));
}

TEST_F(DoctorOnDescriptors, AnIdThatIsNoSafeFileName) {
  descriptor("a.plist", entry("SPACEKEEP_ID", text("../etc/passwd")));
  EXPECT_THAT(badNews(look()), ElementsAre("problem descriptor-id"));
}

TEST_F(DoctorOnDescriptors, OneIdInTwoFiles) {
  descriptor("a.plist", entry("SPACEKEEP_ID", text("twin")));
  write("QuorvelInternal/Library/Spacekeep/b.plist", dict(entry("SPACEKEEP_ID", text("twin"))));
  const Group group = look();
  EXPECT_THAT(badNews(group), ElementsAre("problem descriptor-twice"));
  EXPECT_THAT(allTexts(group), HasSubstr("System/Library/Spacekeep/a.plist and by " +
                                         path("QuorvelInternal/Library/Spacekeep/b.plist")));
}

TEST_F(DoctorOnDescriptors, RolesThatAreNoArrayNoneAndUnknown) {
  descriptor("a.plist",
             entry("SPACEKEEP_ID", text("a")) + entry("SPACEKEEP_SERVICES", text("PURGE")));
  EXPECT_THAT(badNews(look()), ElementsAre("problem descriptor-roles"));
  descriptor("a.plist", entry("SPACEKEEP_ID", text("a")) + entry("SPACEKEEP_SERVICES", "<array/>"));
  EXPECT_THAT(badNews(look()), ElementsAre("advice descriptor-roles"));
  descriptor("a.plist", entry("SPACEKEEP_ID", text("a")) +
                            entry("SPACEKEEP_SERVICES",
                                  "<array>" + text("PURGE") + text("Periodic") + "</array>"));
  const Group group = look();
  EXPECT_THAT(badNews(group), ElementsAre("advice descriptor-role"));
  EXPECT_THAT(allTexts(group), HasSubstr("(\"Periodic\")"));
}

TEST_F(DoctorOnDescriptors, AFalseThatCountsAsTrue) {
  descriptor("a.plist",
             entry("SPACEKEEP_ID", text("a")) + entry("SPACEKEEP_DO_NOT_QUERY", "<false/>"));
  EXPECT_THAT(badNews(look()), ElementsAre("advice descriptor-query"));
  descriptor("a.plist",
             entry("SPACEKEEP_ID", text("a")) + entry("SPACEKEEP_DO_NOT_QUERY", "<true/>"));
  EXPECT_THAT(badNews(look()), IsEmpty());
}

TEST_F(DoctorOnDescriptors, NotificationsThatAreNoArray) {
  descriptor("a.plist", entry("SPACEKEEP_ID", text("a")) +
                            entry("SPACEKEEP_NOTIFICATIONS", text("SPACEKEEP_CACHE_ENABLED")));
  EXPECT_THAT(badNews(look()), ElementsAre("advice descriptor-notifications"));
}

TEST_F(DoctorOnDescriptors, AMisspeltKey) {
  descriptor("a.plist", entry("SPACEKEEP_ID", text("a")) +
                            entry("SPACEKEEP_SERVICE", "<array>" + text("PERIODIC") + "</array>"));
  const Group group = look();
  EXPECT_THAT(badNews(group), ElementsAre("advice descriptor-key"));
  EXPECT_THAT(allTexts(group), HasSubstr("the key SPACEKEEP_SERVICE, which nobody reads"));
}

TEST_F(DoctorOnDescriptors, FilesAndDirectoriesThatOthersMayWrite) {
  descriptor("a.plist", entry("SPACEKEEP_ID", text("a")));
  chmod(path("System/Library/Spacekeep/a.plist").c_str(), 0646);
  chmod(path("QuorvelInternal/Library/Spacekeep").c_str(), 0777);
  EXPECT_THAT(badNews(look()), ElementsAre("problem descriptor-trust", "problem descriptor-trust"));
}

class DoctorOnServices : public DoctorTest {
 protected:
  [[nodiscard]] Group look(const Contact& contact) const {
    return servicesGroup(place(), readDeclarations(root()), contact);
  }
  [[nodiscard]] Group look() const { return look(contact(Contact::Outcome::kAnswers)); }
  void declare(const std::string& id, const std::string& more = "") const {
    descriptor(id + ".plist", entry("SPACEKEEP_ID", text(id)) + more);
  }
};

TEST_F(DoctorOnServices, OnesThatListenAndAnswerAreFine) {
  declare("cache");
  listenFor("cache");
  startDaemon({"cache", "checked.in"});
  const Group group = look();
  EXPECT_THAT(badNews(group), IsEmpty()) << allTexts(group);
  EXPECT_THAT(allTexts(group), HasSubstr("these answer: cache, checked.in"));
}

TEST_F(DoctorOnServices, AMissingSocketNamesTheUnitOfAShippedService) {
  declare("com.quorvel.spacekeep.apt");
  startDaemon();
  const Group group = look();
  EXPECT_THAT(badNews(group), ElementsAre("problem service-socket-missing"));
  EXPECT_THAT(allTexts(group), HasSubstr("systemctl enable --now spacekeep-service@apt.socket"));
}

TEST_F(DoctorOnServices, AFileInThePlaceOfASocket) {
  declare("cache");
  write("run/spacekeep/services/cache.sock", "");
  startDaemon();
  EXPECT_THAT(badNews(look()), ElementsAre("problem service-socket-kind"));
}

TEST_F(DoctorOnServices, ASocketThatItsServiceLeftBehind) {
  declare("doctor-left-behind");
  listenFor("doctor-left-behind");
  listening_.clear();
  startDaemon();
  EXPECT_THAT(badNews(look()), ElementsAre("problem service-socket-stale"));
}

TEST_F(DoctorOnServices, ASocketThatTheDaemonsUserMayNotUse) {
  if (geteuid() != 0) GTEST_SKIP() << "only root is trusted besides another user";
  declare("cache");
  listenFor("cache");
  startDaemon({"cache"});
  Place unprivileged = place();
  unprivileged.own_user = 4242;
  const Group group =
      servicesGroup(unprivileged, readDeclarations(root()), contact(Contact::Outcome::kAnswers));
  EXPECT_THAT(badNews(group), ElementsAre("problem service-socket-rights"));
}

TEST_F(DoctorOnServices, AServiceThatDoesNotAnswerTheDaemon) {
  declare("silent");
  declare("hidden", entry("SPACEKEEP_DO_NOT_QUERY", "<true/>"));
  declare("periodic", entry("SPACEKEEP_SERVICES", "<array>" + text("PERIODIC") + "</array>"));
  for (const char* id : {"silent", "hidden", "periodic"}) listenFor(id);
  startDaemon({"other"});
  const Group group = look();
  EXPECT_THAT(badNews(group), ElementsAre("problem service-silent"));
  EXPECT_THAT(allTexts(group), HasSubstr("silent has not told the daemon"));
}

TEST_F(DoctorOnServices, ADirectoryOfSocketsThatIsMissingOrOpenToOthers) {
  declare("cache");
  startDaemon();
  chmod(path("run/spacekeep/services").c_str(), 0777);
  EXPECT_THAT(badNews(look()),
              ElementsAre("problem services-directory", "problem service-socket-missing"));
  std::filesystem::remove(path("run/spacekeep/services"));
  EXPECT_THAT(badNews(look()),
              ElementsAre("problem services-directory", "problem service-socket-missing"));
}

TEST_F(DoctorOnServices, WithoutADaemonOrTheRightItSaysThatItCouldNotAsk) {
  EXPECT_THAT(badNews(look(noDaemon())), ElementsAre("unseen service-answers"));
  daemon_.on("clientItemizedPurgeableSpace",
             [](const ipc::Arguments&, const ipc::Responder& responder) {
               responder.reply(sdk::noDictionary());
             });
  daemon_.start();
  const Group group = look();
  EXPECT_THAT(badNews(group), ElementsAre("unseen service-answers"));
  EXPECT_THAT(allTexts(group), HasSubstr("ITEMIZED_PURGEABLE_ENTITLEMENT"));
}

TEST(ListeningSockets, AreThoseOfTheTableThatListenAndHaveAPath) {
  EXPECT_EQ(listeningPathsIn(
                "Num       RefCount Protocol Flags    Type St Inode Path\n"
                "0000000000000000: 00000002 00000000 00010000 0001 01 20000 /run/a.sock\n"
                "0000000000000000: 00000003 00000000 00000000 0001 03 20001 /run/connected.sock\n"
                "0000000000000000: 00000002 00000000 00010000 0001 01 20002 @abstract\n"
                "0000000000000000: 00000002 00000000 00010000 0001 01 20003\n"
                "0000000000000000: 00000002 00000000 00010000 0001 01 20004 /run/with space\n"),
            (std::set<std::string>{"/run/a.sock", "@abstract", "/run/with space"}));
  EXPECT_TRUE(listeningPathsIn("").empty());
}

}  // namespace
}  // namespace spacekeep::ctl::doctor
