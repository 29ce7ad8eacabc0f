#include "support/access/linux/load_rules.h"

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cstdlib>
#include <filesystem>
#include <fstream>

#include "support/access/entitlements.h"
#include "tests/helpers/log_capture.h"

namespace spacekeep::access {
namespace {

namespace fs = std::filesystem;
using test::LogCapture;

class LoadRules : public ::testing::Test {
 protected:
  LoadRules() {
    std::string path = (fs::temp_directory_path() / "rules.XXXXXX").string();
    EXPECT_NE(::mkdtemp(path.data()), nullptr);
    root_ = path;
    fs::create_directory(vendor());
    fs::create_directory(administrator());
  }
  ~LoadRules() override { fs::remove_all(root_); }

  [[nodiscard]] fs::path vendor() const { return root_ / "vendor"; }
  [[nodiscard]] fs::path administrator() const { return root_ / "administrator"; }

  static void write(const fs::path& path, const std::string& body) {
    std::ofstream(path) << "<plist version=\"1.0\">" << body << "</plist>\n";
    fs::permissions(path, fs::perms(0644));
  }
  /// Grants one entitlement to one user.
  static void writeGrant(const fs::path& path, int uid, const std::string& entitlement) {
    write(path, "<dict><key>MATCH_USER</key><integer>" + std::to_string(uid) +
                    "</integer><key>GRANT</key><array><string>" + entitlement +
                    "</string></array></dict>");
  }
  [[nodiscard]] std::vector<Rule> load() const {
    return loadRules(vendor().string(), administrator().string(), systemNameLookup());
  }
  [[nodiscard]] bool granted(std::uint32_t uid, const std::string& entitlement) const {
    return judge(load(), PeerIdentity({.uid = uid, .gid = 9999}), entitlement).granted();
  }

  static constexpr int kToldHowToMendIt = 100;

  /// How many rules hold when another user than root reads them, and kToldHowToMendIt more when a
  /// finding says how that user gets to read them; -1 when that could not be tried.
  [[nodiscard]] int countForAnotherUser() const {
    fs::permissions(root_, fs::perms(0755));  // it was made for its owner alone
    const pid_t child = ::fork();
    if (child == 0) {
      constexpr uid_t kAnother = 4711;
      if (::setuid(kAnother) != 0) ::_exit(255);
      const auto read = readRules(vendor().string(), administrator().string(), {}, kAnother);
      const bool told =
          std::any_of(read.findings.begin(), read.findings.end(), [](const auto& finding) {
            return finding.text.ends_with("; let the daemon's user read it (chmod go+rx)");
          });
      ::_exit(static_cast<int>(read.rules.size()) + (told ? kToldHowToMendIt : 0));
    }
    int status = -1;
    EXPECT_EQ(::waitpid(child, &status, 0), child);
    return WIFEXITED(status) && WEXITSTATUS(status) != 255 ? WEXITSTATUS(status) : -1;
  }

  fs::path root_;
};

TEST_F(LoadRules, MissingDirectoriesGiveNoRulesAndNoComplaint) {
  const LogCapture log;
  EXPECT_TRUE(loadRules("/nowhere/a", "/nowhere/b", systemNameLookup()).empty());
  EXPECT_TRUE(log.texts(kLogProblem).empty());
}

TEST_F(LoadRules, FilesOfBothDirectoriesCountInTheOrderOfTheirNames) {
  writeGrant(vendor() / "20.plist", 1, "CLIENT_ENTITLEMENT");
  writeGrant(administrator() / "10.plist", 2, "PURGE_ENTITLEMENT");
  write(vendor() / "notes.txt", "<dict/>");
  write(vendor() / ".hidden.plist", "<dict/>");
  const auto rules = load();
  ASSERT_EQ(rules.size(), 2U);
  EXPECT_EQ(rules[0].name, "10.plist");
  EXPECT_EQ(rules[1].name, "20.plist");
}

TEST_F(LoadRules, TheAdministratorsFileReplacesTheVendorsOfTheSameName) {
  writeGrant(vendor() / "20.plist", 1, "CLIENT_ENTITLEMENT");
  writeGrant(administrator() / "20.plist", 2, "CLIENT_ENTITLEMENT");
  EXPECT_FALSE(granted(1, "CLIENT_ENTITLEMENT"));
  EXPECT_TRUE(granted(2, "CLIENT_ENTITLEMENT"));
}

TEST_F(LoadRules, ABrokenFileGrantsNothingIsLoggedAndStillHidesTheVendors) {
  writeGrant(vendor() / "20.plist", 1, "CLIENT_ENTITLEMENT");
  writeGrant(vendor() / "30.plist", 1, "PURGE_ENTITLEMENT");
  write(administrator() / "20.plist", "<dict><key>GRANTS</key><array/></dict>");
  const LogCapture log;
  EXPECT_FALSE(granted(1, "CLIENT_ENTITLEMENT"));
  EXPECT_EQ(log.texts(kLogProblem),
            (std::vector<std::string>{"loadRules rule file " + administrator().string() +
                                      "/20.plist grants nothing: unknown key GRANTS"}));
  EXPECT_TRUE(granted(1, "PURGE_ENTITLEMENT"));
}

TEST_F(LoadRules, ANullDeviceTakesTheVendorsFileAway) {
  writeGrant(vendor() / "20.plist", 1, "CLIENT_ENTITLEMENT");
  fs::create_symlink("/dev/null", administrator() / "20.plist");
  EXPECT_FALSE(granted(1, "CLIENT_ENTITLEMENT"));
}

TEST_F(LoadRules, GarbageIsBroken) {
  std::ofstream(vendor() / "20.plist") << "no property list at all";
  const LogCapture log;
  EXPECT_TRUE(load().empty());
  EXPECT_EQ(log.count(kLogProblem, "20.plist grants nothing: "), 1U);
}

TEST_F(LoadRules, AFileThatOthersCanWriteIsRefused) {
  for (const int mode : {0664, 0646, 0666}) {
    writeGrant(vendor() / "20.plist", 1, "CLIENT_ENTITLEMENT");
    ASSERT_EQ(::chmod((vendor() / "20.plist").c_str(), static_cast<mode_t>(mode)), 0);
    const LogCapture log;
    EXPECT_FALSE(granted(1, "CLIENT_ENTITLEMENT")) << mode;
    EXPECT_EQ(log.count(kLogProblem, "can be written by others than its owner"), 1U);
  }
}

TEST_F(LoadRules, AFileOfAnotherUserIsRefused) {
  ASSERT_EQ(::geteuid(), 0U) << "this test gives files away and has to run as root";
  writeGrant(vendor() / "20.plist", 1, "CLIENT_ENTITLEMENT");
  ASSERT_EQ(::chown((vendor() / "20.plist").c_str(), 4711, 4711), 0);
  const LogCapture log;
  EXPECT_FALSE(granted(1, "CLIENT_ENTITLEMENT"));
  EXPECT_EQ(log.count(kLogProblem, "is owned by user 4711, must be root's"), 1U);
}

TEST_F(LoadRules, ADirectoryThatOthersCanWriteIsNotUsed) {
  writeGrant(vendor() / "20.plist", 1, "CLIENT_ENTITLEMENT");
  ASSERT_EQ(::chmod(vendor().c_str(), 01777), 0);
  const LogCapture log;
  EXPECT_FALSE(granted(1, "CLIENT_ENTITLEMENT"));
  EXPECT_EQ(log.count(kLogProblem, "rule directory " + vendor().string() + " is not used: "), 1U);
}

TEST_F(LoadRules, NothingIsGrantedWhileOthersCanWriteTheAdministratorsDirectory) {
  for (const int mode : {0775, 0757, 01777}) {
    writeGrant(vendor() / "20.plist", 1, "CLIENT_ENTITLEMENT");
    writeGrant(administrator() / "30.plist", 1, "PURGE_ENTITLEMENT");
    ASSERT_EQ(::chmod(administrator().c_str(), static_cast<mode_t>(mode)), 0);
    const LogCapture log;
    EXPECT_FALSE(granted(1, "CLIENT_ENTITLEMENT")) << mode;
    EXPECT_FALSE(granted(1, "PURGE_ENTITLEMENT")) << mode;
    EXPECT_EQ(log.texts(kLogProblem).front(),
              "loadRules rule directory " + administrator().string() +
                  " is not used: can be written by others than its owner; take that right away "
                  "(chmod go-w). What it denies is not known, so nobody is granted anything; mend "
                  "it, then start the daemon anew");
  }
}

TEST_F(LoadRules, ADirectoryThatOthersCanWriteTakesTheAdministratorsGrantsAlongToo) {
  writeGrant(administrator() / "20.plist", 1, "CLIENT_ENTITLEMENT");
  EXPECT_TRUE(granted(1, "CLIENT_ENTITLEMENT"));
  ASSERT_EQ(::chmod(vendor().c_str(), 0777), 0);
  EXPECT_FALSE(granted(1, "CLIENT_ENTITLEMENT"));
}

TEST_F(LoadRules, NothingIsGrantedWhileTheAdministratorsDirectoryCannotBeReadOrSearched) {
  ASSERT_EQ(::geteuid(), 0U) << "this test changes users and has to run as root";
  writeGrant(vendor() / "20.plist", 1, "CLIENT_ENTITLEMENT");
  writeGrant(administrator() / "30.plist", 1, "PURGE_ENTITLEMENT");
  EXPECT_EQ(countForAnotherUser(), 2);
  for (const int mode : {0700, 0744, 0711}) {
    ASSERT_EQ(::chmod(administrator().c_str(), static_cast<mode_t>(mode)), 0);
    EXPECT_EQ(countForAnotherUser(), kToldHowToMendIt) << mode;
  }
}

TEST_F(LoadRules, NothingIsGrantedWhileSomethingElseStandsInTheAdministratorsPlace) {
  writeGrant(vendor() / "20.plist", 1, "CLIENT_ENTITLEMENT");
  fs::remove(administrator());
  EXPECT_TRUE(granted(1, "CLIENT_ENTITLEMENT"));
  std::ofstream(administrator()) << "a file";
  EXPECT_FALSE(granted(1, "CLIENT_ENTITLEMENT"));
  fs::remove(administrator());
  fs::create_symlink("not-mounted-yet", administrator());
  EXPECT_FALSE(granted(1, "CLIENT_ENTITLEMENT"));
}

TEST_F(LoadRules, AFifoIsNotWaitedFor) {
  ASSERT_EQ(::mkfifo((vendor() / "20.plist").c_str(), 0644), 0);
  const LogCapture log;
  EXPECT_TRUE(load().empty());
  EXPECT_EQ(log.count(kLogProblem, "is no regular file"), 1U);
}

TEST_F(LoadRules, AFileIsBoundedInSize) {
  const std::string padding(kMaxRuleFileBytes, ' ');
  write(vendor() / "20.plist", padding + "<dict/>");
  const LogCapture log;
  EXPECT_TRUE(load().empty());
  EXPECT_EQ(log.count(kLogProblem, "is larger than 65536 bytes"), 1U);
}

TEST_F(LoadRules, TheNumberOfFilesIsBounded) {
  for (std::size_t i = 0; i < kMaxRuleFiles; ++i) {
    writeGrant(vendor() / (std::to_string(i) + ".plist"), 1, "CLIENT_ENTITLEMENT");
  }
  EXPECT_EQ(load().size(), kMaxRuleFiles);
  writeGrant(vendor() / "one-more.plist", 1, "CLIENT_ENTITLEMENT");
  const LogCapture log;
  EXPECT_TRUE(load().empty());
  EXPECT_EQ(log.count(kLogProblem, "holds more than 256 rule files"), 1U);
}

TEST(SystemNames, AreLookedUp) {
  const NameLookup lookup = systemNameLookup();
  EXPECT_EQ(lookup.user("root").number, 0U);
  EXPECT_EQ(lookup.group("root").number, 0U);
  EXPECT_EQ(lookup.user("no-such-user-here").number, std::nullopt);
  EXPECT_EQ(lookup.user("no-such-user-here").failure, "") << "it is known that there is none";
  EXPECT_EQ(lookup.group("no-such-group-here").number, std::nullopt);
}

TEST(ShippedRules, GrantWhatTheyPromise) {
  const NameLookup lookup{
      .user = [](const std::string&) -> std::optional<std::uint32_t> { return std::nullopt; },
      .group = [](const std::string& name) -> std::optional<std::uint32_t> {
        if (name == "spacekeep") return 400;
        if (name == "spacekeep-services") return 401;
        return std::nullopt;
      }};
  const LogCapture log;
  const auto rules =
      loadRules(SPACEKEEP_SOURCE_DIR "/packaging/entitlements.d", "/nowhere", lookup);
  EXPECT_EQ(log.texts(kLogProblem), std::vector<std::string>{});
  const auto held = [&](std::uint32_t uid, std::uint32_t gid) {
    const PeerIdentity peer({.uid = uid, .gid = gid});
    std::vector<std::string_view> entitlements;
    for (const std::string_view entitlement : kAllEntitlements) {
      if (judge(rules, peer, entitlement).granted()) entitlements.push_back(entitlement);
    }
    return entitlements;
  };
  using List = std::vector<std::string_view>;
  EXPECT_EQ(held(0, 0), List(kAllEntitlements.begin(), kAllEntitlements.end()));
  EXPECT_EQ(held(1000, 400), (List{"CLIENT_ENTITLEMENT", "PURGEABLE_ENTITLEMENT"}));
  EXPECT_EQ(held(1000, 401),
            (List{"CLIENT_ENTITLEMENT", "PURGEABLE_ENTITLEMENT", "SERVICE_ENTITLEMENT"}));
  EXPECT_EQ(held(1000, 1000), List{});
}

}  // namespace
}  // namespace spacekeep::access
