// Rule files: what is read, and what is said about a bad one.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <fstream>

#include "services/cachedir/engine/rules.h"
#include "tests/linux/cachedir/cache_world.h"

namespace spacekeep::cachedir {
namespace {

using testing::AllOf;
using testing::ElementsAre;
using testing::HasSubstr;

Dictionary directory(const std::string& path) { return {{"PATH", path}}; }

Dictionary withDirectory(Dictionary entry) {
  return {{"SPACEKEEP_ID", "com.example.cache"}, {"DIRECTORIES", Array{std::move(entry)}}};
}

Rules good(const Dictionary& document) {
  auto read = rulesOf(document, "rules.plist");
  if (const auto* error = std::get_if<RuleError>(&read)) ADD_FAILURE() << error->text;
  return std::holds_alternative<Rules>(read) ? std::get<Rules>(read) : Rules{};
}

std::string errorOf(const Value& document) {
  const auto read = rulesOf(document, "rules.plist");
  const auto* error = std::get_if<RuleError>(&read);
  return error == nullptr ? "(no error)" : error->text;
}

TEST(Rules, TheDefaultsAreThirtyDaysSevenOneAndNone) {
  const Rules rules = good(withDirectory(directory("/data/cache/")));
  EXPECT_EQ(rules.service_id, "com.example.cache");
  EXPECT_TRUE(rules.purges);
  EXPECT_FALSE(rules.periodic);
  ASSERT_EQ(rules.directories.size(), 1U);
  EXPECT_EQ(rules.directories[0].path, "/data/cache");
  EXPECT_THAT(rules.directories[0].unused_seconds, ElementsAre(2592000, 604800, 86400, 0));
  EXPECT_FALSE(rules.directories[0].periodic_unused_seconds);
  EXPECT_FALSE(rules.directories[0].remove_empty_directories);
}

TEST(Rules, EveryKeyIsRead) {
  Dictionary entry = directory("/data/cache");
  entry.set("UNUSED_DAYS", Dictionary{{"1", 10}, {"2", 0.5}, {"3", 0.25}});
  entry.set("PERIODIC_UNUSED_DAYS", 90);
  entry.set("KEEP", Array{"*.db", "models/*"});
  entry.set("REMOVE_EMPTY_DIRECTORIES", true);
  Dictionary document = withDirectory(entry);
  document.set("SPACEKEEP_SERVICES", Array{"PERIODIC"});
  document.set("SPACEKEEP_NOTIFICATIONS", Array{"com.example.done"});
  document.set("SPACEKEEP_DO_NOT_QUERY", true);
  const Rules rules = good(document);
  EXPECT_FALSE(rules.purges);
  EXPECT_TRUE(rules.periodic);
  EXPECT_THAT(rules.notifications, ElementsAre("com.example.done"));
  const DirectoryRule& rule = rules.directories[0];
  EXPECT_THAT(rule.unused_seconds, ElementsAre(864000, 43200, 21600, 0));
  EXPECT_EQ(rule.periodic_unused_seconds, 90 * kSecondsPerDay);
  EXPECT_THAT(rule.keep, ElementsAre("*.db", "models/*"));
  EXPECT_TRUE(rule.remove_empty_directories);
}

TEST(Rules, APatternWithoutASlashMatchesANameAnywhereOneWithASlashTheWholePath) {
  DirectoryRule rule;
  rule.keep = {"*.db", "models/*/weights"};
  EXPECT_TRUE(isKept(rule, "index.db"));
  EXPECT_TRUE(isKept(rule, "a/b/index.db"));
  EXPECT_TRUE(isKept(rule, "models/x/weights"));
  EXPECT_FALSE(isKept(rule, "models/x/y/weights"));
  EXPECT_FALSE(isKept(rule, "other/models/x/weights"));
  EXPECT_FALSE(isKept(rule, "index.db/file"));
}

struct Bad {
  const char* key;
  Value value;
  const char* where;
};

TEST(Rules, EachMistakeInADirectoryIsNamedWithItsPlace) {
  const std::vector<Bad> mistakes = {
      {"PATH", 5, "DIRECTORIES[0] PATH: missing, or not a string"},
      {"PATH", "", "is not an absolute path"},
      {"PATH", "cache", "\"cache\" is not an absolute path"},
      {"PATH", "a\nb\x1b", "\"a\\nb\\x1b\" is not an absolute path"},
      {"PATH", "/data/../etc", "holds an empty, \".\" or \"..\" component"},
      {"PATH", "/data//cache", "holds an empty"},
      {"PATH", "/data/.", "holds an empty"},
      {"PATH", "/", "is a system directory"},
      {"PATH", "/usr/", "is a system directory"},
      {"UNUSED_DAYS", 5, "DIRECTORIES[0] UNUSED_DAYS: not a dictionary"},
      {"UNUSED_DAYS", Dictionary{{"5", 1}}, "unknown urgency \"5\""},
      {"UNUSED_DAYS", Dictionary{{"1", "week"}}, "UNUSED_DAYS 1: not a number of days"},
      {"UNUSED_DAYS", Dictionary{{"1", -1}}, "not a number of days"},
      {"UNUSED_DAYS", Dictionary{{"1", 1e9}}, "not a number of days"},
      {"UNUSED_DAYS", Dictionary{{"1", true}}, "not a number of days"},
      {"UNUSED_DAYS", Dictionary{{"1", 2}}, "a higher urgency spares younger files"},
      {"PERIODIC_UNUSED_DAYS", "x", "DIRECTORIES[0] PERIODIC_UNUSED_DAYS: not a number"},
      {"KEEP", "*.db", "DIRECTORIES[0] KEEP: not an array"},
      {"KEEP", Array{5}, "an entry is not a string"},
      {"KEEP", Array{"/data/cache/x"}, "cannot match"},
      {"KEEP", Array{std::string(kMaxPatternBytes + 1, 'x')}, "cannot match"},
      {"KEEP", Array(kMaxPatterns + 1, "x"), "too many entries; give at most 256"},
      {"REMOVE_EMPTY_DIRECTORIES", 1, "not a boolean"},
      {"KEPT", Array{}, "DIRECTORIES[0]: unknown key \"KEPT\"; the keys are PATH"},
  };
  for (const Bad& bad : mistakes) {
    Dictionary entry = directory("/data/cache");
    entry.set(bad.key, bad.value);
    EXPECT_THAT(errorOf(withDirectory(entry)),
                AllOf(HasSubstr("rules.plist: "), HasSubstr(bad.where)))
        << bad.key;
  }
}

TEST(Rules, EachMistakeAtTheTopIsNamed) {
  const std::vector<Bad> mistakes = {
      {"SPACEKEEP_ID", 5, "SPACEKEEP_ID: missing, or not a string"},
      {"SPACEKEEP_ID", "", "name the service"},
      {"SPACEKEEP_SERVICES", "PURGE", "SPACEKEEP_SERVICES: not an array"},
      {"SPACEKEEP_SERVICES", Array{"PURGES"}, "unknown role \"PURGES\""},
      {"SPACEKEEP_NOTIFICATIONS", Array{5}, "SPACEKEEP_NOTIFICATIONS: an entry is not a string"},
      {"DIRECTORIES", Array{}, "DIRECTORIES: not an array of 1 to 64"},
      {"DIRECTORIES", 5, "DIRECTORIES: not an array of 1 to 64"},
      {"DIRECTORIES", Array{5}, "DIRECTORIES[0]: not a dictionary"},
      {"DIRECTORIES", Array(kMaxDirectories + 1, Value(directory("/a/b"))),
       "not an array of 1 to 64"},
      {"DIRECTORIES", Array{directory("/a/b"), directory("/a/b/c")},
       "\"/a/b/c\" overlaps \"/a/b\""},
      {"DIRECTORIES", Array{directory("/a/b"), directory("/a/b/")}, "overlaps"},
      {"DIRECTORY", "/a/b", "unknown key \"DIRECTORY\""},
  };
  for (const Bad& bad : mistakes) {
    Dictionary document = withDirectory(directory("/data/cache"));
    document.set(bad.key, bad.value);
    EXPECT_THAT(errorOf(document), AllOf(HasSubstr("rules.plist: "), HasSubstr(bad.where)))
        << bad.key;
  }
  EXPECT_THAT(errorOf(Array{}), HasSubstr("the top level is not a dictionary"));
}

TEST(Rules, AFileIsReadAndABadOneNamed) {
  const std::string folder = temporaryDirectory();
  std::ofstream(folder + "/good") << R"(<?xml version="1.0"?><plist version="1.0"><dict>
    <key>SPACEKEEP_ID</key><string>com.example.cache</string>
    <key>DIRECTORIES</key><array><dict><key>PATH</key><string>/data/cache</string>
    <key>UNUSED_DAYS</key><dict><key>1</key><integer>14</integer></dict></dict></array>
    </dict></plist>)";
  std::ofstream(folder + "/text") << "not a property list";
  std::ofstream(folder + "/large") << std::string(5 * kMiB, ' ');
  const auto read = readRules(folder + "/good");
  ASSERT_TRUE(std::holds_alternative<Rules>(read));
  EXPECT_EQ(std::get<Rules>(read).directories[0].unused_seconds[0], 14 * kSecondsPerDay);
  const auto error = [&](const std::string& name) {
    const auto bad = readRules(folder + name);
    return std::holds_alternative<RuleError>(bad) ? std::get<RuleError>(bad).text : "(none)";
  };
  EXPECT_THAT(error("/text"), AllOf(HasSubstr(folder + "/text"), HasSubstr("not a property list")));
  EXPECT_THAT(error("/large"), HasSubstr("larger than 4 MiB"));
  EXPECT_THAT(error("/absent"), HasSubstr("No such file or directory (ENOENT)"));
  EXPECT_THAT(error(""), HasSubstr("not a file"));
}

}  // namespace
}  // namespace spacekeep::cachedir
