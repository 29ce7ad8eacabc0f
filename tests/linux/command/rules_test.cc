// Rule files: what is read, how files of one name add up, and what is said of bad ones.
#include <gtest/gtest.h>

#include <algorithm>
#include <fstream>
#include <map>

#include "services/command/base/path_patterns.h"
#include "services/command/engine/matches.h"
#include "tests/linux/command/command_world.h"

namespace spacekeep::command {
namespace {

const std::string kClean =
    "<key>MEASURE</key><array><string>/var/cache/x</string></array><key>CLEAN</key><dict>"
    "<key>2</key><dict><key>COMMAND</key><array><string>tool</string></array></dict></dict>";

TEST(Rules, AToolsRuleIsReadWithItsDefaults) {
  const Rule rule = ruleFrom(kClean);
  EXPECT_TRUE(rule.enabled);
  EXPECT_EQ(rule.service_id, "com.example.cache");
  EXPECT_TRUE(rule.purges);
  const auto& tool = std::get<ToolCache>(rule.cache);
  ASSERT_EQ(tool.measured.directories.size(), 1U);
  EXPECT_EQ(tool.measured.directories[0].path, "/var/cache/x");
  EXPECT_FALSE(tool.steps[0]);
  ASSERT_TRUE(tool.steps[1]);
  EXPECT_EQ(tool.steps[1]->command, Words{"tool"});
  EXPECT_EQ(tool.steps[1]->limit_ns, 60'000'000'000U);
  EXPECT_TRUE(std::holds_alternative<Unknown>(tool.steps[1]->preview));
}

std::string stepOf(const std::string& step) {
  return "<key>MEASURE</key><array><string>/a/b</string></array><key>CLEAN</key><dict><key>1</key>"
         "<dict>" +
         step + "</dict></dict>";
}

const std::string kCommand = "<key>COMMAND</key><array><string>t</string></array>";

/// What stands in the file, and what is said of it.
const std::map<std::string, std::string> kBadContents = {
    {"",
     "FILE: neither DIRECTORIES alone nor MEASURE with CLEAN; give DIRECTORIES for caches of "
     "files, or MEASURE and CLEAN for a tool"},
    {"<key>DIRECTORIES</key><array/>",
     "FILE: DIRECTORIES: not an array of dictionaries; describe each cache directory by a "
     "dictionary with a PATH"},
    {"<key>ENABLED</key><string>yes</string>" + kClean,
     "FILE: ENABLED: not a boolean; give true or false"},
    {"<key>MEASURE</key><array><string>cache</string></array><key>CLEAN</key><dict/>",
     "FILE: MEASURE: \"cache\" is not an absolute path without \".\" and \"..\"; begin it with a "
     "slash, ~/ or $XDG_CACHE_HOME/"},
    {"<key>MEASURE</key><array><string>~/x</string></array><key>CLEAN</key><dict/>",
     "FILE: MEASURE: \"~/x\" is a user's path; serve this file with --user, or write an absolute "
     "path"},
    {"<key>MEASURE</key><array><string>/usr</string></array><key>CLEAN</key><dict/>",
     "FILE: MEASURE[0] PATH: \"/usr\" is a system directory; name the cache below it"},
    {"<key>MEASURE</key><array><string>/a/b</string></array>",
     "FILE: CLEAN: missing, or not a dictionary; give a dictionary with a COMMAND under the keys "
     "1 "
     "to 4, the urgencies"},
    {"<key>MEASURE</key><array><string>/a/b</string></array><key>CLEAN</key><dict><key>5</key>"
     "<dict/></dict>",
     "FILE: CLEAN: unknown urgency \"5\"; the urgencies are 1 to 4"},
    {stepOf(""),
     "FILE: CLEAN 1 COMMAND: missing or empty; give the program and its arguments as an array of "
     "strings"},
    {stepOf("<key>COMMAND</key><array><string>t</string><string>{HOME}</string></array>"),
     "FILE: CLEAN 1 COMMAND: unknown placeholder \"{HOME}\"; use {AMOUNT}, the bytes to free, or "
     "{KEEP}, the bytes that may stay"},
    {stepOf(kCommand + "<key>TIMEOUT_SECONDS</key><integer>0</integer>"),
     "FILE: CLEAN 1 TIMEOUT_SECONDS: not a number from 1 to 600; give one, or leave the key out "
     "for 60"},
    {stepOf(kCommand + "<key>AMOUNT</key><dict>" + kCommand + "</dict>"),
     "FILE: CLEAN 1 AMOUNT: not told where the amount stands in the output; give one of AFTER, "
     "COLUMN and PATHS (PATHS may go with AFTER)"},
    {stepOf(kCommand + "<key>AMOUNT</key><dict><key>AGE</key><string>OLD</string></dict>"),
     "FILE: CLEAN 1 AMOUNT AGE: unknown age \"OLD\"; use MODIFIED, JOURNAL_NAME or TRASH_RECORD"},
    {stepOf(kCommand +
            "<key>AMOUNT</key><dict><key>OLDER_THAN_DAYS</key><integer>-1</integer></dict>"),
     "FILE: CLEAN 1 AMOUNT OLDER_THAN_DAYS: not a number of days from 0 to 36500; give one"},
    {"<key>NOT_WHILE</key><array><dict><key>PROCESS</key><string>a/b</string></dict></array>" +
         kClean,
     "FILE: NOT_WHILE[0] PROCESS: \"a/b\" holds a slash; give the executable's name without its "
     "directory"},
    {"<key>NOT_WHILE</key><array><dict><key>OPEN</key><string/></dict></array>" + kClean,
     "FILE: NOT_WHILE[0] OPEN: not a string, or empty; give a text, or leave the key out"},
    {"<key>DIRECTORIES</key><array><dict><key>PATH</key><string/></dict></array>",
     "FILE: DIRECTORIES[0] PATH: \"\" is not an absolute path without \".\" and \"..\"; begin it "
     "with a slash, ~/ or $XDG_CACHE_HOME/"},
    {"<key>NOT_WHILE</key><array><dict><key>PROCESS</key><string>/a\nb&#127;</string></dict>"
     "</array>" +
         kClean,
     "FILE: NOT_WHILE[0] PROCESS: \"/a\\nb\\x7f\" holds a slash; give the executable's name "
     "without its directory"},
    {"<key>NOT_WHILE</key><array><dict/></array>" + kClean,
     "FILE: NOT_WHILE[0]: not exactly one key; make one dictionary of each"},
    {"<key>OWNERS_LOCKS</key><array><dict><key>FLOCK</key><string>/a/l</string></dict></array>" +
         kClean,
     "FILE: OWNERS_LOCKS: not with CLEAN, because the tool takes its locks itself; use NOT_WHILE "
     "with LOCKED"},
    {"<key>DIRECTORIES</key><array><dict><key>PATH</key><string>/a/b</"
     "string><key>WHOLE_DIRECTORIES"
     "</key><integer>1</integer></dict></array>",
     "FILE: DIRECTORIES[0] WHOLE_DIRECTORIES: not a boolean; give true or false"},
    {"<key>DIRECTORIES</key><array><dict><key>PATH</key><string>/a/b</string></"
     "dict><dict><key>PATH"
     "</key><string>/a/b/c</string></dict></array>",
     "FILE: DIRECTORIES[1] PATH: \"/a/b/c\" overlaps \"/a/b\"; let each file stand under one "
     "directory only"}};

TEST(Rules, ABadFileIsToldInOneLineWithThePlaceAndTheWayOut) {
  for (const auto& [content, text] : kBadContents) EXPECT_EQ(errorOf(content), text);
  EXPECT_TRUE(errorOf("<key>CLAEN</key><dict/>" + kClean)
                  .starts_with("FILE: unknown key \"CLAEN\"; the keys are SPACEKEEP_ID, "));
}

class Layered : public testing::Test {
 protected:
  void write(const std::string& folder, const std::string& name, const std::string& content) {
    std::ofstream(folder + "/" + name)
        << "<plist version=\"1.0\"><dict>" << content << "</dict></plist>";
  }
  std::variant<std::vector<Rule>, cachedir::RuleError> read(std::vector<std::string> only = {}) {
    return readRules({.files = {}, .folders = {vendor_, admin_}, .only = std::move(only)}, nullptr);
  }
  const std::string id_ = "<key>SPACEKEEP_ID</key><string>com.example.a</string>";
  const std::string vendor_ = temporaryDirectory();
  const std::string admin_ = temporaryDirectory();
};

TEST_F(Layered, ALaterFileOfTheSameNameReplacesSingleKeys) {
  write(vendor_, "a.plist", id_ + kClean + "<key>ENABLED</key><false/>");
  write(vendor_, "b.plist", id_ + kClean);
  write(vendor_, "notes.txt", "not a rule");
  write(admin_, "a.plist", "<key>ENABLED</key><true/>");
  const auto rules = std::get<std::vector<Rule>>(read());
  ASSERT_EQ(rules.size(), 2U);
  EXPECT_EQ(rules[0].name, "a");
  EXPECT_TRUE(rules[0].enabled);
  EXPECT_EQ(rules[0].service_id, "com.example.a");
  EXPECT_EQ(rules[1].name, "b");
}

TEST_F(Layered, OneBadFileIsToldAndNothingElseIsTaken) {
  write(vendor_, "a.plist", id_ + kClean);
  write(admin_, "a.plist", "<key>ENABLED</key><integer>1</integer>");
  EXPECT_EQ(std::get<cachedir::RuleError>(read()).text,
            admin_ + "/a.plist: ENABLED: not a boolean; give true or false");
}

TEST_F(Layered, OneRuleCanBeTakenByItsName) {
  write(vendor_, "a.plist", id_ + kClean);
  write(vendor_, "b.plist", "broken");
  const auto rules = std::get<std::vector<Rule>>(read({"a"}));
  ASSERT_EQ(rules.size(), 1U);
  EXPECT_EQ(rules[0].name, "a");
  EXPECT_EQ(std::get<cachedir::RuleError>(read({"c"})).text,
            "c: no rule of this name; see the files in the rule directories");
}

TEST(Rules, UsersPathsAreFilledIn) {
  const UserFolders folders = homeAt(temporaryDirectory());
  const Rule rule = ruleFrom(
      "<key>MEASURE</key><array><string>$XDG_CACHE_HOME/x</string><string>~/y</string></array>"
      "<key>CLEAN</key><dict><key>1</key><dict><key>COMMAND</key><array><string>t</string><string>"
      "$XDG_DATA_HOME/z</string><string>--a=~/b</string></array></dict></dict>",
      &folders);
  const auto& tool = std::get<ToolCache>(rule.cache);
  EXPECT_EQ(tool.measured.directories[0].path, folders.home + "/.cache/x");
  EXPECT_EQ(tool.measured.directories[1].path, folders.home + "/y");
  EXPECT_EQ(tool.steps[0]->command, (Words{"t", folders.home + "/.local/share/z", "--a=~/b"}));
}

TEST(PathPatterns, ComponentsMatchRealDirectoriesOnly) {
  const std::string folder = temporaryDirectory();
  for (const char* name : {"/a1/x", "/a2/x", "/.a3/x", "/b/x"}) {
    cachedir::run("mkdir -p " + folder + name);
  }
  writeFile(folder + "/a4", 1);
  cachedir::run("ln -s a1 " + folder + "/a5");
  EXPECT_EQ(matchesOf(folder + "/a*/x"),
            (std::vector<std::string>{folder + "/a1/x", folder + "/a2/x"}));
  EXPECT_EQ(matchesOf(folder + "/nothing/x"), std::vector<std::string>{folder + "/nothing/x"});
  EXPECT_EQ(matchesOf(folder + "/z*/x"), std::vector<std::string>{});
}

std::vector<std::string> pathsOf(const cachedir::Rules& rules) {
  std::vector<std::string> paths;
  for (const auto& rule : rules.directories) paths.push_back(rule.path);
  return paths;
}

/// What the matches of these paths are, taken together.
cachedir::Rules matchesOfAll(const std::vector<std::string>& paths) {
  cachedir::Rules rules;
  for (const std::string& path : paths) rules.directories.push_back({.path = path});
  return matched(rules);
}

TEST(Matches, ASystemDirectoryIsNoneWhateverPatternFindsIt) {
  using Paths = std::vector<std::string>;
  for (const char* pattern : {"/[u]sr", "/v?r/lib", "/*/lib", "/va*", "/", "/et*"}) {
    const std::vector<std::string> paths = pathsOf(matchesOfAll({pattern}));
    for (const char* never : {"/usr", "/var", "/var/lib", "/etc", "/"}) {
      EXPECT_EQ(std::ranges::count(paths, never), 0) << pattern;
    }
  }
  for (const char* pattern : {"/*", "/?*", "/var/*", "/*/*"}) {
    const std::vector<std::string> paths = pathsOf(matchesOfAll({pattern}));
    EXPECT_EQ(std::ranges::count(paths, "/var/log"), 0) << pattern;
    EXPECT_EQ(std::ranges::count(paths, "/tmp"), 0) << pattern;
  }
  EXPECT_EQ(pathsOf(matchesOfAll({"/var/[l]og"})), Paths{"/var/log"});
  EXPECT_EQ(matchesOfAll({"/us[r]"}).problems,
            Paths{"/usr: left alone: it is a system directory; write PATH so that \"/us[r]\" does "
                  "not match it"});
}

TEST(Matches, DirectoriesThatLieInEachOtherAreLeftOutAllOfThem) {
  const std::string top = temporaryDirectory();
  for (const char* name : {"/a/x/y", "/a-b", "/c/x", "/d"}) {
    cachedir::run("mkdir -p " + top + name);
  }
  const auto found = matchesOfAll({top + "/*", top + "/a/x", top + "/a/x/y", top + "/[c]"});
  EXPECT_EQ(pathsOf(found), (std::vector<std::string>{top + "/a-b", top + "/d"}));
  EXPECT_EQ(found.problems.size(), 4U);
  EXPECT_EQ(pathsOf(matchesOfAll({top + "/c", top + "/a*"})),
            (std::vector<std::string>{top + "/c", top + "/a", top + "/a-b"}));
}

}  // namespace
}  // namespace spacekeep::command
