// "report" as a process: what it writes, and when it writes nothing.
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/stat.h>

#include <filesystem>
#include <fstream>
#include <string>
#include <vector>

#include "ctl/json_parse.h"
#include "support/volumes/linux/linux_volumes.h"
#include "tests/helpers/temporary_directory.h"
#include "tests/linux/ctl/tool_test.h"

namespace spacekeep::ctl {
namespace {

using testing::AllOf;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::Not;
using testing::StartsWith;

constexpr const char* kHostile = "</script><script>alert(\"'&\")</script>\u202E";

class ReportCommand : public ToolTest {
 protected:
  ReportCommand() { answerWithEmptyState(); }
  ~ReportCommand() override { daemon_.stop(); }

  void offer(const char* operation) {
    daemon_.on(operation, [](const ipc::Arguments&, const ipc::Responder& responder) {
      responder.reply(sdk::outcome({{kHostile, 4096}, {"SPACEKEEP_TOTAL_AVAILABLE", 4096}}));
    });
  }
  void refuse(const char* operation) {
    daemon_.on(operation, [](const ipc::Arguments&, const ipc::Responder& responder) {
      responder.reply(sdk::noDictionary());
    });
  }

  static std::string someVolume() { return LinuxVolumes().getLocalVolumes().at(0); }
  [[nodiscard]] std::string file() const { return folder_ / "report.html"; }
  Finished report(const std::string& more = "") {
    return ctlWithSocket("report --html " + file() + " --volume " + someVolume() + " " + more);
  }
  static void put(const std::string& path, const std::string& text) { std::ofstream(path) << text; }
  [[nodiscard]] std::vector<std::string> filesInFolder() const {
    std::vector<std::string> names;
    for (const auto& entry : std::filesystem::directory_iterator(folder_.path())) {
      names.push_back(entry.path().filename());
    }
    return names;
  }

  /// What the page tells, read as a browser does: the text of the element with the data.
  static Dictionary dataIn(const std::string& page) {
    const std::string begin = "<script type=\"application/json\" id=\"data\">";
    const std::size_t from = page.find(begin) + begin.size();
    const auto parsed = parseJson(page.substr(from, page.find('<', from) - from));
    const auto* value = std::get_if<Value>(&parsed);
    EXPECT_NE(value, nullptr) << std::get<JsonError>(parsed).text;
    return value == nullptr ? Dictionary() : *value->dictionary();
  }

  spacekeep::test::TemporaryDirectory folder_;
};

TEST_F(ReportCommand, WritesAPageWithWhatCouldBeFreed) {
  offer(kItemized);
  daemon_.start();
  const Finished run = report();
  EXPECT_EQ(run.exit_code, 0) << run.err;
  EXPECT_THAT(run.out, StartsWith(file() + ": 1 volume, 0 entries of the history\n"));
  const std::string page = contentOf(file());
  EXPECT_THAT(page, StartsWith("<!DOCTYPE html>\n"));
  EXPECT_THAT(page, Not(HasSubstr(kHostile)));
  const Dictionary data = dataIn(page);
  const Dictionary& volume = *data.find("volumes")->array()->at(0).dictionary();
  EXPECT_EQ(*volume.find("volume"), Value(someVolume()));
  const Dictionary& urgency =
      *volume.find("offers")->dictionary()->find("urgencies")->array()->at(2).dictionary();
  EXPECT_EQ(*urgency.find("services"), Value(Array{Dictionary{{"id", kHostile}, {"bytes", 4096}}}));
  EXPECT_THAT(filesInFolder(), testing::ElementsAre("report.html"));
}

TEST_F(ReportCommand, StandardOutputIsThePageAlone) {
  offer(kItemized);
  daemon_.start();
  const Finished run = ctlWithSocket("report --html - --volume " + someVolume());
  EXPECT_EQ(run.exit_code, 0) << run.err;
  EXPECT_THAT(run.out, StartsWith("<!DOCTYPE html>\n"));
  EXPECT_THAT(run.out, testing::EndsWith("</html>\n"));
}

TEST_F(ReportCommand, APageThatCannotBeWrittenToTheEndIsAFailure) {
  offer(kItemized);
  daemon_.start();
  const Finished run = ctlWithSocket("report --html - --volume " + someVolume() + " >/dev/full");
  EXPECT_EQ(run.exit_code, 5);
  EXPECT_THAT(run.err, HasSubstr("standard output cannot be written: No space left on device"));
}

TEST_F(ReportCommand, AReportOfBeforeIsReplacedWithItsModeKept) {
  offer(kItemized);
  daemon_.start();
  put(file(), "old");
  chmod(file().c_str(), 0600);
  EXPECT_EQ(report().exit_code, 0);
  struct stat facts = {};
  ASSERT_EQ(stat(file().c_str(), &facts), 0);
  EXPECT_EQ(facts.st_mode & 0777U, 0600U);
  EXPECT_THAT(contentOf(file()), StartsWith("<!DOCTYPE html>"));
}

TEST_F(ReportCommand, ANewFileIsAsTheUmaskSays) {
  offer(kItemized);
  daemon_.start();
  const Finished run =
      runShell("umask 027; " + toolPath() + " --socket " + directory_.daemonSocket() +
                   " report --html " + file() + " --volume " + someVolume(),
               errFile());
  EXPECT_EQ(run.exit_code, 0) << run.err;
  struct stat facts = {};
  ASSERT_EQ(stat(file().c_str(), &facts), 0);
  EXPECT_EQ(facts.st_mode & 0777U, 0640U);
}

TEST_F(ReportCommand, ASymbolicLinkStaysOne) {
  offer(kItemized);
  daemon_.start();
  put(folder_ / "real.html", "old");
  std::filesystem::create_symlink("real.html", file());
  EXPECT_EQ(report().exit_code, 0);
  EXPECT_TRUE(std::filesystem::is_symlink(file()));
  EXPECT_THAT(contentOf(folder_ / "real.html"), StartsWith("<!DOCTYPE html>"));
}

TEST_F(ReportCommand, WhatIsNoFileIsRefusedBeforeAnybodyIsAsked) {
  const auto refusal = [this](const std::string& path) {
    const Finished run = ctlWithSocket("report --html " + path);
    EXPECT_EQ(run.exit_code, 2) << path;
    EXPECT_THAT(run.out, IsEmpty());
    return run.err;
  };
  EXPECT_THAT(refusal(folder_.path()), HasSubstr("is a directory; name a file in it"));
  EXPECT_THAT(refusal("/dev/null"), HasSubstr("is no plain file; standard output is \"-\""));
  EXPECT_THAT(refusal(folder_ / "missing/x.html"), HasSubstr("No such file or directory"));
  EXPECT_THAT(refusal(file() + "/x"), HasSubstr("cannot be written to"));
  EXPECT_THAT(refusal("\"\""), HasSubstr("names no file"));
  put(file(), "a file");
  EXPECT_THAT(refusal(file() + "/x"), HasSubstr("Not a directory"));
}

TEST_F(ReportCommand, JsonSaysWhatWasWritten) {
  offer(kItemized);
  daemon_.start();
  const Finished run = report("--json");
  EXPECT_EQ(run.out, "{\"entries\":0,\"file\":\"" + file() + "\",\"volumes\":1}\n");
  EXPECT_EQ(ctlWithSocket("report --json --html -").exit_code, 2);
}

TEST_F(ReportCommand, AFileIsRequired) {
  const Finished run = ctlWithSocket("report");
  EXPECT_EQ(run.exit_code, 2);
  EXPECT_THAT(run.err, HasSubstr("--html is required"));
}

TEST_F(ReportCommand, SinceWhenIsChecked) {
  const Finished run = ctlWithSocket("report --html - --since tomorrow");
  EXPECT_EQ(run.exit_code, 2);
  EXPECT_THAT(run.err, HasSubstr("not \"tomorrow\""));
}

TEST_F(ReportCommand, WithoutADaemonAReportOfBeforeStays) {
  put(file(), "old");
  const Finished run = report();
  EXPECT_EQ(run.exit_code, 3);
  EXPECT_EQ(contentOf(file()), "old");
}

TEST_F(ReportCommand, WithoutAnyRightAReportOfBeforeStays) {
  refuse(kItemized);
  refuse(kPlain);
  daemon_.start();
  put(file(), "old");
  const Finished run = report();
  EXPECT_EQ(run.exit_code, 4);
  EXPECT_EQ(contentOf(file()), "old");
  EXPECT_THAT(run.err,
              AllOf(HasSubstr("\"PURGEABLE_ENTITLEMENT\""), HasSubstr("nothing was written")));
}

TEST_F(ReportCommand, WhoMayNotConnectIsToldWhereToLook) {
  daemon_.turnEverybodyAway();
  daemon_.start();
  const Finished run = report();
  EXPECT_EQ(run.exit_code, 4);
  EXPECT_FALSE(std::filesystem::exists(file()));
  EXPECT_THAT(run.err, HasSubstr("CLIENT_ENTITLEMENT"));
}

TEST_F(ReportCommand, AVolumeThatIsNoneIsRefused) {
  daemon_.start();
  const Finished run = ctlWithSocket("report --html " + file() + " --volume /proc");
  EXPECT_EQ(run.exit_code, 4);
  EXPECT_THAT(run.err, HasSubstr("/proc is not the mount point of a local volume"));
  EXPECT_FALSE(std::filesystem::exists(file()));
}

}  // namespace
}  // namespace spacekeep::ctl
