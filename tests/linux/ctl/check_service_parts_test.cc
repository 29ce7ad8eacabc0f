// The parts of the check that need no service.
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <fstream>
#include <string>

#include "ctl/check_service/check_report.h"
#include "ctl/check_service/data_files.h"
#include "ctl/check_service/held_files.h"
#include "ctl/check_service/launched_service.h"
#include "ctl/check_service/ledger.h"
#include "ctl/check_service/space_meter.h"
#include "tests/linux/ctl/tool_test.h"

namespace spacekeep::ctl {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;
using testing::SizeIs;

class CheckServiceParts : public testing::Test {
 protected:
  ~CheckServiceParts() override {
    for (const auto& [path, file] : dataFilesBelow(directory_.path())) unlink(path.c_str());
  }
  std::string write(const std::string& name) {
    std::string path = directory_.path() + "/" + name;
    std::ofstream(path) << std::string(10'000, 'x');
    return path;
  }

  sdk::SocketDirectory directory_;
};

TEST_F(CheckServiceParts, WhatVanishedIsToldByPathAndByBytes) {
  const std::string one = write("one");
  write("two");
  const DataFiles before = dataFilesBelow(directory_.path());
  ASSERT_THAT(before, SizeIs(2));
  unlink(one.c_str());
  const Vanished vanished = vanishedBetween(before, dataFilesBelow(directory_.path()));
  EXPECT_THAT(vanished.paths, ElementsAre(one));
  EXPECT_EQ(vanished.occupied_bytes, before.at(one).occupied_bytes);
  EXPECT_GE(vanished.occupied_bytes, 10'000U);
}

TEST_F(CheckServiceParts, AFileThatWasRenamedVanishedButItsBytesDidNot) {
  const std::string one = write("one");
  const DataFiles before = dataFilesBelow(directory_.path());
  ASSERT_EQ(rename(one.c_str(), (directory_.path() + "/other").c_str()), 0);
  const Vanished vanished = vanishedBetween(before, dataFilesBelow(directory_.path()));
  EXPECT_THAT(vanished.paths, SizeIs(1));
  EXPECT_EQ(vanished.occupied_bytes, 0U);
}

TEST_F(CheckServiceParts, AHeldFileThatIsRemovedIsToldWithHowItWasHeld) {
  const std::string one = write("one");
  write("three");
  const std::string two = write("two");
  HeldFiles held(directory_.path());
  EXPECT_EQ(held.size(), 3U);
  held.releaseRemoved();
  EXPECT_THAT(held.losses(), IsEmpty());
  unlink(one.c_str());
  unlink(two.c_str());
  held.releaseRemoved();
  EXPECT_THAT(held.losses(),
              ElementsAre(one + ", which was open", two + ", which was mapped into memory"));
  EXPECT_EQ(held.size(), 1U);
}

TEST_F(CheckServiceParts, ASingleFileIsHeldInEveryWay) {
  const std::string one = write("one");
  HeldFiles held(one);
  unlink(one.c_str());
  held.releaseRemoved();
  EXPECT_THAT(held.losses(), SizeIs(3));
  EXPECT_TRUE(held.empty());
}

TEST_F(CheckServiceParts, AnAmountIsAPlainNumberFromZero) {
  EXPECT_EQ(Ledger::problemOfAmount({{"SPACEKEEP_AMOUNT", 0}}), "");
  EXPECT_EQ(Ledger::problemOfAmount({{"SPACEKEEP_AMOUNT", 1.5}}), "");
  EXPECT_EQ(Ledger::problemOfAmount({{"SPACEKEEP_AMOUNT", -1}}),
            "has a \"SPACEKEEP_AMOUNT\" below 0");
  EXPECT_EQ(Ledger::problemOfAmount({{"SPACEKEEP_AMOUNT", true}}),
            "has a \"SPACEKEEP_AMOUNT\" that is not a number");
  EXPECT_EQ(Ledger::problemOfAmount({}), "has no \"SPACEKEEP_AMOUNT\"");
}

TEST_F(CheckServiceParts, TheSlackIsAFixedPartAndASixteenth) {
  const SpaceMeter space("/", std::nullopt);
  EXPECT_EQ(space.slackFor(0), 256U * 1024);
  EXPECT_EQ(space.slackFor(16 << 20), 256U * 1024 + (1 << 20));
}

TEST_F(CheckServiceParts, AFailureOnATerminalIsWrappedBesideItsName) {
  const CheckResult result{"ping", failed("It was not answered within 3 s. Answer it at once.")};
  EXPECT_EQ(lineOf(result, {}),
            "ping                  FAILED: It was not answered within 3 s. Answer it at once.\n");
  EXPECT_EQ(lineOf(result, {.columns = 60, .terminal = true}),
            "ping                  FAILED: It was not answered within 3\n"
            "                      s. Answer it at once.\n");
  EXPECT_EQ(lineOf(result, {.columns = 40, .terminal = true}),
            "ping\n  FAILED: It was not answered within 3\n  s. Answer it at once.\n");
  EXPECT_EQ(lineOf({"ping", fine()}, {}), "ping                  ok\n");
}

TEST_F(CheckServiceParts, TheSummaryCountsEachOutcome) {
  CheckReport report;
  report.results = {{"a", fine()}, {"b", failed("x")}, {"c", notApplicable("y")}, {"d", fine()}};
  EXPECT_EQ(summaryOf(report), "4 checks: 2 ok, 1 failed, 1 not applicable");
  report.results.resize(1);
  EXPECT_EQ(summaryOf(report), "1 check: 1 ok, 0 failed, 0 not applicable");
}

TEST_F(CheckServiceParts, TheEndOfAProcessIsToldInWords) {
  EXPECT_EQ(textOfEnd(1 << 8), "ended with status 1");
  EXPECT_EQ(textOfEnd(9), "was ended by signal 9 (Killed)");
}

}  // namespace
}  // namespace spacekeep::ctl
