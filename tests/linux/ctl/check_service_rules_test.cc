// The service for caches by rules passes, whatever way its caches go.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <fstream>
#include <string>

#include "tests/linux/ctl/check_service_world.h"

namespace spacekeep::ctl {
namespace {

using testing::IsEmpty;
using testing::IsSupersetOf;

class CheckServiceOfRules : public CheckServiceTest {
 protected:
  [[nodiscard]] std::string service(const std::string& content) const {
    const std::string path = directory_.path() + "/rules.plist";
    std::ofstream(path) << "<plist version=\"1.0\"><dict><key>SPACEKEEP_ID</key>"
                           "<string>com.example.cache</string>"
                        << content << "</dict></plist>\n";
    return "-- " + program("services/spacekeep-command") + " --rules " + path + " --check-in";
  }
  [[nodiscard]] std::string withItsFiles() const {
    return checking("--yes --data " + cache() + " --in-use " + cache());
  }
  static void expectWell(const Finished& run) {
    EXPECT_EQ(run.exit_code, 0) << run.out << run.err;
    EXPECT_THAT(checksThatWere("FAILED", run.out), IsEmpty());
    EXPECT_THAT(checksThatWere("ok", run.out),
                IsSupersetOf({"reached", "ping", "query-frees-nothing", "purge-nothing",
                              "purge-share", "purge-limit", "purge-everything", "in-use",
                              "answers-once", "honest-amounts"}))
        << run.out;
  }
};

TEST_F(CheckServiceOfRules, FilesByAge) {
  expectWell(onVolume(
      4000, withItsFiles() + service("<key>DIRECTORIES</key><array><dict><key>PATH</key><string>" +
                                     cache() + "</string></dict></array>")));
}

/// Of a size that the check takes for one item.
TEST_F(CheckServiceOfRules, WholeDirectories) {
  const std::string sort = "for i in $(seq 0 249); do mkdir " + cache() + "/d$i; done\nfor i in " +
                           cache() + "/item-*; do mv $i " + cache() +
                           "/d$((10#${i##*-} % 250))/; done\n";
  expectWell(onVolume(
      2000, sort + withItsFiles() +
                service("<key>DIRECTORIES</key><array><dict><key>PATH</key><string>" + cache() +
                        "/*</string><key>WHOLE_DIRECTORIES</key><true/><key>UNUSED_DAYS</key>"
                        "<dict><key>4</key><integer>0</integer></dict></dict></array>")));
}

/// A tool that takes all or nothing.
TEST_F(CheckServiceOfRules, AToolThatGivesAllAtOncePassesWhenTheItemIsToldToBeSoLarge) {
  const std::string tool = volume() + "/tool";
  const std::string write =
      "printf '#!/bin/sh\\nrm -f " + cache() + "/*\\n' >" + tool + "\nchmod +x " + tool + "\n";
  const std::string rule =
      "<key>MEASURE</key><array><string>" + cache() +
      "</string></array><key>CLEAN</key><dict><key>4</key><dict><key>COMMAND</key><array><string>" +
      tool + "</string></array><key>AMOUNT</key><dict/></dict></dict>";
  const std::string files = "--yes --data " + cache();
  const Finished untold = onVolume(300, write + checking(files) + service(rule));
  EXPECT_THAT(checksThatWere("FAILED", untold.out), testing::ElementsAre("purge-limit"))
      << untold.out;
  const Finished told = onVolume(300, write + checking(files + " --item 10M") + service(rule));
  EXPECT_EQ(told.exit_code, 0) << told.out << told.err;
}

/// A tool that removes item after item until only so many bytes are left.
TEST_F(CheckServiceOfRules, AToolThatIsToldHowMuchMayStay) {
  const std::string tool = volume() + "/tool";
  const std::string write = "cat >" + tool + " <<'TOOL'\n#!/usr/bin/python3\nimport os, sys\n" +
                            "items = list(os.scandir('" + cache() + "'))\n" +
                            "have = sum(item.stat().st_blocks * 512 for item in items)\n" +
                            "for item in items:\n" + "    if have <= int(sys.argv[1]): break\n" +
                            "    have -= item.stat().st_blocks * 512\n" +
                            "    os.unlink(item.path)\nTOOL\nchmod +x " + tool + "\n";
  const std::string rule =
      "<key>MEASURE</key><array><string>" + cache() +
      "</string></array><key>CLEAN</key><dict><key>1</key><dict><key>COMMAND</key><array><string>" +
      tool + "</string><string>{KEEP}</string></array><key>AMOUNT</key><dict/></dict></dict>";
  const Finished run = onVolume(300, write + checking("--yes --data " + cache()) + service(rule));
  EXPECT_EQ(run.exit_code, 0) << run.out << run.err;
  EXPECT_THAT(checksThatWere("FAILED", run.out), IsEmpty());
  EXPECT_THAT(checksThatWere("ok", run.out),
              IsSupersetOf({"purge-share", "purge-limit", "honest-amounts"}))
      << run.out;
}

}  // namespace
}  // namespace spacekeep::ctl
