// The program from outside: what it prints, what it deletes, and its exit codes.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <csignal>

#include "tests/linux/cachedir/cache_world.h"
#include "tests/linux/cachedir/program_world.h"

namespace spacekeep::cachedir {
namespace {

using testing::AllOf;
using testing::HasSubstr;

class ProgramTest : public testing::Test {
 protected:
  void SetUp() override {
    for (int i = 1; i <= 5; ++i) {
      writeFile(volume_ / ("cache/f" + std::to_string(i)), kMiB, 10.5 * i);
    }
  }
  [[nodiscard]] int left() const {
    int count = 0;
    for (int i = 1; i <= 5; ++i) count += exists(volume_ / ("cache/f" + std::to_string(i))) ? 1 : 0;
    return count;
  }
  [[nodiscard]] std::string line(int number) const {
    return "1048576\t" + (volume_ / ("cache/f" + std::to_string(number))) + "\n";
  }

  Volume volume_{"tmpfs"};
  const std::string rules_ = ruleFileFor(volume_ / "cache");
};

TEST_F(ProgramTest, ADryRunPrintsWhatOnceThenTakes) {
  const Ended dry =
      runProgram({"--rules", rules_, "--dry-run", "--urgency", "2", "--amount", "1.5M"});
  EXPECT_EQ(dry.status, 0);
  EXPECT_EQ(dry.out, line(5) + line(4));
  EXPECT_EQ(dry.err, "would free 2097152 bytes (2.0 MiB) in 2 files\n");
  EXPECT_EQ(left(), 5);
  const Ended once =
      runProgram({"--rules", rules_, "--once", "--urgency", "2", "--amount", "1.5M"});
  EXPECT_EQ(once.status, 0);
  EXPECT_EQ(once.out, dry.out);
  EXPECT_EQ(once.err, "freed 2097152 bytes (2.0 MiB) in 2 files\n");
  EXPECT_EQ(left(), 3);
}

TEST_F(ProgramTest, LessThanAskedIsAnExitCodeOfItsOwn) {
  const Ended once = runProgram({"--rules", rules_, "--once", "--urgency", "1", "--amount", "1G"});
  EXPECT_EQ(once.status, 1);
  EXPECT_EQ(once.out, line(5) + line(4) + line(3));
}

TEST_F(ProgramTest, NothingAskedIsDoneAtOnce) {
  const Ended once = runProgram({"--rules", rules_, "--once", "--urgency", "4", "--amount", "0"});
  EXPECT_EQ(once.status, 0);
  EXPECT_EQ(left(), 5);
}

TEST_F(ProgramTest, AnotherVolumeIsNotTouched) {
  const Volume other("tmpfs");
  const Ended once = runProgram(
      {"--rules", rules_, "--once", "--urgency", "4", "--amount", "1M", "--volume", other.path()});
  EXPECT_EQ(once.status, 1);
  EXPECT_EQ(left(), 5);
}

TEST_F(ProgramTest, WhyFilesWereLeftIsSaid) {
  const Holder holder([this] { return ::fopen((volume_ / "cache/f5").c_str(), "r") != nullptr; });
  const Ended once = runProgram({"--rules", rules_, "--once", "--urgency", "1", "--amount", "1G"});
  EXPECT_THAT(once.err, HasSubstr("left, open: 1\n"));
  EXPECT_TRUE(exists(volume_ / "cache/f5"));
}

TEST_F(ProgramTest, TheEstimateTellsEachUrgency) {
  const Ended estimate = runProgram({"--rules", rules_, "--estimate"});
  EXPECT_EQ(estimate.status, 0);
  EXPECT_EQ(estimate.out,
            "urgency 1: 3145728 bytes (3.0 MiB) in 3 files\n"
            "urgency 2: 5242880 bytes (5.0 MiB) in 5 files\n"
            "urgency 3: 5242880 bytes (5.0 MiB) in 5 files\n"
            "urgency 4: 5242880 bytes (5.0 MiB) in 5 files\n");
}

TEST_F(ProgramTest, ABadRuleFileIsSaidAndNothingDeleted) {
  const std::string bad = ruleFile(
      "<key>SPACEKEEP_ID</key><string>com.example.cache</string><key>DIRECTORIES</key><array>"
      "<dict><key>PATH</key><string>" +
      (volume_ / "cache") +
      "</string></dict><dict><key>PATH</key><string>cache</string></dict></array>");
  const Ended once = runProgram({"--rules", bad, "--once", "--urgency", "4", "--amount", "1G"});
  EXPECT_EQ(once.status, 3);
  EXPECT_EQ(once.err, bad +
                          ": DIRECTORIES[1] PATH: \"cache\" is not an absolute path; begin it "
                          "with a slash\n");
  EXPECT_EQ(left(), 5);
  EXPECT_EQ(runProgram({"--rules", "/nowhere", "--check-in"}).status, 3);
}

TEST_F(ProgramTest, MistakesOnTheCommandLineAreUsage) {
  for (const std::vector<std::string>& wrong : std::vector<std::vector<std::string>>{
           {},
           {"--rules", rules_, "--once"},
           {"--rules", rules_, "--once", "--amount", "much"},
           {"--rules", rules_, "--once", "--amount", "1M", "--urgency", "5"},
           {"--rules", rules_, "--once", "--amount", "1M", "--check-in"},
           {"--rules", rules_, "--estimate", "--dry-run", "--amount", "1M"},
           {"--rules", rules_, "--whatever"}}) {
    EXPECT_EQ(runProgram(wrong).status, 2);
  }
  EXPECT_EQ(left(), 5);
  const Ended help = runProgram({"--help"});
  EXPECT_EQ(help.status, 0);
  EXPECT_THAT(help.out, AllOf(HasSubstr("--rules"), HasSubstr("Exit status: 0 done")));
}

TEST_F(ProgramTest, WithoutASocketItCannotServeAndSaysWhatToDo) {
  const Ended served = runProgram({"--rules", rules_});
  EXPECT_EQ(served.status, 4);
  EXPECT_THAT(served.err, HasSubstr("--check-in"));
}

TEST_F(ProgramTest, AServiceEndsAsUsualWhereNobodyReadsWhatItSays) {
  EXPECT_EQ(statusWithoutAReader(kCachedir, {"--rules", rules_}), 4);
}

TEST_F(ProgramTest, OneLineOfOutputHoldsOneFileWhateverItsName) {
  const Volume volume("tmpfs");
  writeFile(volume / "a\nb\x1b", kMiB);
  const Ended dry = runProgram(
      {"--rules", ruleFileFor(volume.path()), "--dry-run", "--urgency", "1", "--amount", "1M"});
  EXPECT_EQ(dry.out, "1048576\t" + (volume / "a\\x0ab\\x1b") + "\n");
}

}  // namespace
}  // namespace spacekeep::cachedir
