// The manual page tells of everything that the tool has, and is well formed.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <regex>
#include <string>

#include "ctl/check_service/checks.h"
#include "ctl/complaint.h"
#include "ctl/known_keys.h"
#include "tests/linux/ctl/tool_test.h"

namespace spacekeep::ctl {
namespace {

using testing::ContainsRegex;
using testing::HasSubstr;
using testing::IsEmpty;

constexpr const char* kCommands[] = {
    "status",    "explain",   "history",     "report",     "doctor",  "purge",  "query",
    "state get", "state set", "state unset", "state list", "volumes", "cancel", "check-service"};

class Manual : public ToolTest {
 protected:
  static std::string path() {
    return std::string(SPACEKEEP_SOURCE_DIR) + "/packaging/man/spacekeepctl.1";
  }
  /// As a person reads it: bold and underlined letters come as a letter over another.
  std::string text() {
    const Finished run = runShell("mandoc -T ascii -O width=400 " + path(), errFile());
    EXPECT_EQ(run.exit_code, 0) << run.err;
    return std::regex_replace(run.out, std::regex(".\x08"), "");
  }
};

TEST_F(Manual, HasNothingToWarnOf) {
  const Finished run = runShell("mandoc -T lint -W warning " + path(), errFile());
  EXPECT_EQ(run.exit_code, 0);
  EXPECT_THAT(run.out, IsEmpty());
  EXPECT_THAT(run.err, IsEmpty());
}

TEST_F(Manual, TellsOfEveryCommandAndEveryOption) {
  const std::string page = text();
  const std::regex option("--[a-z-]+");
  for (const std::string command : kCommands) {
    EXPECT_THAT(page, HasSubstr(command));
    const std::string help = ctl(command + " --help").out;
    const std::sregex_iterator end;
    std::sregex_iterator found(help.begin(), help.end(), option);
    ASSERT_NE(found, end) << command;
    for (; found != end; ++found) EXPECT_THAT(page, HasSubstr(found->str())) << command;
  }
}

TEST_F(Manual, TellsOfEveryKeyAndEveryExitStatus) {
  const std::string page = text();
  for (const auto& key : settableKeys()) EXPECT_THAT(page, HasSubstr(std::string(key.name)));
  EXPECT_THAT(page, HasSubstr(kRecentStatsKey));
  EXPECT_THAT(page, HasSubstr(kWholeStateKey));
  ASSERT_THAT(page, HasSubstr("\nEXIT STATUS\n"));
  const std::string table = page.substr(page.find("\nEXIT STATUS\n"));
  for (int code = 0; code <= static_cast<int>(ExitCode::kChecksFailed); ++code) {
    EXPECT_THAT(table, HasSubstr("\n     " + std::to_string(code) + " ")) << table;
  }
}

TEST_F(Manual, TellsWhatEveryCheckOfAServiceIsAbout) {
  const std::string page = text();
  ASSERT_THAT(page, HasSubstr("Checks\n"));
  for (const auto& check : allChecks()) {
    EXPECT_THAT(page, ContainsRegex(std::string(check.name) + " +" + check.meaning));
  }
}

TEST_F(Manual, TheHelpOfEveryCommandFitsItsTerminal) {
  for (const std::string command : kCommands) {
    for (const int columns : {40, 80}) {
      const Finished run = runShell(
          "COLUMNS=" + std::to_string(columns) + " " + toolPath() + " " + command + " --help",
          errFile());
      EXPECT_EQ(run.exit_code, 0) << command;
      std::istringstream lines(run.out);
      for (std::string line; std::getline(lines, line);) {
        EXPECT_LE(line.size(), static_cast<std::size_t>(columns)) << command << ": " << line;
      }
    }
  }
}

}  // namespace
}  // namespace spacekeep::ctl
