// Units parse, each rule that ships has its unit, and none has more rights than it needs.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <regex>

#include "tests/linux/packaging/packaging_world.h"

namespace spacekeep::packaging {
namespace {

using testing::HasSubstr;
using testing::Not;

const fs::path kUnits = kSource / "packaging/units";
const fs::path kRules = kSource / "services/rules/system";

std::vector<std::string> ruleNames() {
  std::vector<std::string> names;
  for (const fs::path& rule : filesBelow(kRules, ".plist")) names.push_back(rule.stem().string());
  return names;
}

/// A system of units only: the shipped ones, those of the system that they stand on, and stand-ins
/// for the programs.
class UnitFiles : public testing::Test {
 protected:
  void SetUp() override {
    const fs::path units = root() / "lib/systemd/system";
    fs::create_directories(units);
    fs::copy(kUnits, units, fs::copy_options::recursive);
    for (const char* standing : {"sysinit.target", "basic.target", "sockets.target",
                                 "shutdown.target", "-.slice", "system.slice"}) {
      const fs::path file = fs::path("/lib/systemd/system") / standing;
      if (fs::exists(file)) fs::copy(file, units / standing);
    }
    for (const char* program : {"usr/sbin/spacekeepd", "usr/libexec/spacekeep/spacekeep-command"}) {
      fs::create_directories((root() / program).parent_path());
      fs::copy("/bin/true", root() / program);
    }
  }
  [[nodiscard]] const fs::path& root() const { return workshop_.path(); }

  Workshop workshop_;
};

TEST_F(UnitFiles, NoneHasAnythingToComplainOf) {
  std::string units = "spacekeepd.service spacekeepd.socket";
  for (const std::string& name : ruleNames()) {
    units += " spacekeep-service@" + name + ".service spacekeep-service@" + name + ".socket";
  }
  const Finished verified =
      run("systemd-analyze verify --man=no --recursive-errors=no --root=" + root().string() + " " +
          units);
  EXPECT_EQ(verified.exit_code, 0) << verified.out;
  EXPECT_THAT(verified.out, Not(HasSubstr("spacekeep")));
}

TEST_F(UnitFiles, AMistakeInOneOfThemWouldBeSeen) {
  std::ofstream(root() / "lib/systemd/system/spacekeepd.service", std::ios::app)
      << "[Service]\nProtectSytem=strict\n";
  const Finished verified =
      run("systemd-analyze verify --man=no --recursive-errors=no --root=" + root().string() +
          " spacekeepd.service");
  EXPECT_THAT(verified.out, HasSubstr("ProtectSytem"));
}

/// In tenths, as systemd-analyze rates it; none when it does not.
int exposureOf(const fs::path& root, const std::string& unit) {
  const Finished rated = run(
      "systemd-analyze security --no-pager --offline=true --root=" + root.string() + " " + unit);
  std::smatch found;
  if (!std::regex_search(rated.out, found,
                         std::regex("exposure level for .*: ([0-9]+)\\.([0-9])"))) {
    ADD_FAILURE() << rated.out;
    return 100;
  }
  return std::stoi(found[1]) * 10 + std::stoi(found[2]);
}

TEST_F(UnitFiles, TheDaemonIsExposedByAtMostOne) {
  EXPECT_LE(exposureOf(root(), "spacekeepd.service"), 10);
}

TEST_F(UnitFiles, AServiceIsExposedByAtMostTwoAndTheOneWithoutADaemonOfItsOwnHasReasons) {
  for (const std::string& name : ruleNames()) {
    const int exposure = exposureOf(root(), "spacekeep-service@" + name + ".service");
    EXPECT_LE(exposure, name == "podman-images" ? 25 : 20) << name;
  }
}

TEST(Units, EachRuleOfTheSystemHasRightsAndTheIdOfItsNameAndADescriptorWhenItIsOn) {
  const std::string links = contentOf(kSource / "packaging/tmpfiles/spacekeep-services.conf");
  const std::string build = contentOf(kSource / "packaging/CMakeLists.txt");
  std::string listening = build.substr(build.find("foreach(rule IN ITEMS"));
  listening = listening.substr(0, listening.find(')')) + " ";
  ASSERT_FALSE(ruleNames().empty());
  for (const std::string& name : ruleNames()) {
    EXPECT_TRUE(fs::exists(kUnits / ("spacekeep-service@" + name + ".service.d") / "rights.conf"))
        << name;
    const std::string text = contentOf(kRules / (name + ".plist"));
    EXPECT_THAT(text, HasSubstr("<string>com.quorvel.spacekeep." + name + "</string>"));
    const bool is_on = text.find("<key>ENABLED</key>") == std::string::npos;
    const std::string link = "L /System/Library/Spacekeep/com.quorvel.spacekeep." + name +
                             ".plist - - - - /usr/lib/spacekeep/rules/system/" + name + ".plist\n";
    EXPECT_EQ(links.find(link) != std::string::npos, is_on) << name;
    EXPECT_EQ(listening.find(" " + name + " ") != std::string::npos, is_on) << name;
  }
}

TEST(Units, TheServicesKeepTheCallByWhichTheyStayBeneathACacheDirectory) {
  // The option makes openat2(2) answer ENOSYS; then no cache can be opened at all.
  for (const char* unit :
       {"units/spacekeep-service@.service", "user-units/spacekeep-caches.service"}) {
    for (const std::string& line : linesOf(kSource / "packaging" / unit)) {
      EXPECT_FALSE(line.starts_with("RestrictSUIDSGID")) << unit;
    }
  }
}

TEST(Units, WhereOtherUsersLeaveFilesTheServiceCanTellWhetherTheyAreOpen) {
  EXPECT_THAT(linesOf(kUnits / "spacekeep-service@crash-reports.service.d/rights.conf"),
              testing::Contains("CapabilityBoundingSet=CAP_LEASE"));
}

TEST(Units, NoRightsAreGivenForARuleThatDoesNotShip) {
  for (const auto& entry : fs::directory_iterator(kUnits)) {
    if (!entry.is_directory()) continue;
    std::string name = entry.path().filename().string();
    name = name.substr(name.find('@') + 1);
    name = name.substr(0, name.rfind(".service.d"));
    EXPECT_TRUE(fs::exists(kRules / (name + ".plist"))) << entry.path();
  }
}

}  // namespace
}  // namespace spacekeep::packaging
