// Getting from a name to a sound file, whatever stands in its place.
#include <gtest/gtest.h>
#include <sys/stat.h>

#include <algorithm>

#include "support/preferences/linux/sqlite_suite.h"
#include "tests/linux/preferences/suite_world.h"

namespace spacekeep {
namespace {

using test::contentOf;
using test::fetch;
using test::fileOf;
using test::kName;
using test::LogCapture;
using test::modeOf;
using test::open;
using test::outside;
using test::setAsideFiles;
using test::store;
using test::TemporaryDirectory;

TEST(SuiteFile, AFileThatIsNoDatabaseIsSetAsideUnchanged) {
  const TemporaryDirectory directory;
  const std::string junk =
      "this is no database, but somebody may want it back" + std::string(5000, '!');
  directory.write(std::string(kName) + ".sqlite", junk);
  // A journal as a finished commit leaves it: the library plays back any other before all else.
  const std::string journal(512, '\0');
  directory.write(std::string(kName) + ".sqlite-journal", journal);
  LogCapture log;
  store(directory, "k", 1);
  EXPECT_EQ(log.count(kLogProblem, "It was set aside as " + directory.path()), 1u);
  const auto aside = setAsideFiles(directory);
  ASSERT_EQ(aside.size(), 2u);
  const std::string main = std::min(aside[0], aside[1]);
  EXPECT_EQ(contentOf(main), junk);
  EXPECT_EQ(contentOf(main + "-journal"), journal);
  EXPECT_EQ(fetch(directory, "k"), Value(1));
}

TEST(SuiteFile, EachDamagedFileIsKeptUnderANameOfItsOwn) {
  const TemporaryDirectory directory;
  for (int round = 0; round < 3; ++round) {
    directory.write(std::string(kName) + ".sqlite",
                    std::string(2000, static_cast<char>('a' + round)));
    EXPECT_NE(open(directory), nullptr);
  }
  EXPECT_EQ(setAsideFiles(directory).size(), 5u);  // the second and the third with their journals
}

TEST(SuiteFile, ADatabaseOfAnotherProgramIsSetAside) {
  const TemporaryDirectory directory;
  ASSERT_EQ(execute(outside(fileOf(directory)).get(),
                    "CREATE TABLE theirs (a); INSERT INTO theirs VALUES (42)"),
            SQLITE_OK);
  LogCapture log;
  EXPECT_EQ(fetch(directory, "k"), std::nullopt);
  EXPECT_TRUE(log.contains(kLogProblem, "it is the database of another program"));
  const auto aside = setAsideFiles(directory);
  ASSERT_EQ(aside.size(), 1u);
  int code = 0;
  EXPECT_EQ(queryInteger(outside(aside[0]).get(), "SELECT a FROM theirs", code), 42);
}

TEST(SuiteFile, ADatabaseDamagedInTheMiddleIsSetAside) {
  const TemporaryDirectory directory;
  store(directory, "k", Data{std::vector<std::uint8_t>(50'000, 1)});
  std::string content = contentOf(fileOf(directory));
  ASSERT_GT(content.size(), 8192u);
  content.replace(4096, 4096, std::string(4096, '\xa5'));
  directory.write(std::string(kName) + ".sqlite", content);
  LogCapture log;
  EXPECT_EQ(fetch(directory, "k"), std::nullopt);
  EXPECT_EQ(setAsideFiles(directory).size(), 2u);  // with its journal
  EXPECT_EQ(log.count(kLogProblem, "It was set aside as"), 1u);
}

TEST(SuiteFile, ADatabaseWhoseKeysAreOutOfOrderIsSetAsideAndWhatIsStoredThenIsKept) {
  const TemporaryDirectory directory;
  for (const char* key : {"key-a", "key-b", "key-c"}) store(directory, key, 1);
  std::string content = contentOf(fileOf(directory));
  const std::size_t first = content.find("key-a");
  ASSERT_NE(first, std::string::npos);
  content[first] = 'z';
  directory.write(std::string(kName) + ".sqlite", content);
  store(directory, "key-m", 2);
  EXPECT_EQ(fetch(directory, "key-m"), Value(2));
  const auto aside = setAsideFiles(directory);
  ASSERT_EQ(aside.size(), 2u);
  EXPECT_EQ(contentOf(std::min(aside[0], aside[1])), content);
}

TEST(SuiteFile, ATableThatIsNotAsThisProgramMakesItIsSetAsideAndWhatIsStoredThenIsKept) {
  const TemporaryDirectory directory;
  store(directory, "k", 1);
  std::string content = contentOf(fileOf(directory));
  const std::size_t at = content.find("key TEXT PRIMARY KEY NOT NULL");
  ASSERT_NE(at, std::string::npos);
  content.replace(at, 3, "KEY");  // a key all the same, but nobody here has written that
  directory.write(std::string(kName) + ".sqlite", content);
  LogCapture log;
  store(directory, "k", 2);
  EXPECT_EQ(log.count(kLogProblem, "its table is not as this program makes it"), 1U);
  EXPECT_FALSE(setAsideFiles(directory).empty());
  EXPECT_EQ(fetch(directory, "k"), Value(2));
}

TEST(SuiteFile, ADatabaseOfItsOwnWithoutItsTableIsSetAside) {
  const TemporaryDirectory directory;
  store(directory, "k", 1);
  ASSERT_EQ(execute(outside(fileOf(directory)).get(), "DROP TABLE preferences"), SQLITE_OK);
  store(directory, "k", 2);
  EXPECT_FALSE(setAsideFiles(directory).empty());
  EXPECT_EQ(fetch(directory, "k"), Value(2));
}

TEST(SuiteFile, ATruncatedDatabaseIsSetAside) {
  const TemporaryDirectory directory;
  store(directory, "k", Data{std::vector<std::uint8_t>(50'000, 1)});
  std::filesystem::resize_file(fileOf(directory), 5000);
  LogCapture log;
  EXPECT_EQ(fetch(directory, "k"), std::nullopt);
  EXPECT_EQ(setAsideFiles(directory).size(), 2u);  // with its journal
}

TEST(SuiteFile, AnEmptyFileIsAFreshSuite) {
  const TemporaryDirectory directory;
  directory.write(std::string(kName) + ".sqlite", "");
  LogCapture log;
  store(directory, "k", 1);
  EXPECT_TRUE(log.texts(kLogProblem).empty());
  EXPECT_EQ(fetch(directory, "k"), Value(1));
}

TEST(SuiteFile, AFileOfANewerVersionIsRefusedAndLeftAlone) {
  const TemporaryDirectory directory;
  store(directory, "k", 1);
  ASSERT_EQ(execute(outside(fileOf(directory)).get(), "PRAGMA user_version = 2"), SQLITE_OK);
  const std::string before = contentOf(fileOf(directory));
  LogCapture log;
  EXPECT_EQ(open(directory), nullptr);
  EXPECT_TRUE(log.contains(kLogProblem, "it was written by a newer version of this program"));
  EXPECT_EQ(contentOf(fileOf(directory)), before);
  EXPECT_TRUE(setAsideFiles(directory).empty());
}

TEST(SuiteFile, WhatIsNoRegularFileIsRefusedAndLeftAlone) {
  LogCapture log;
  const TemporaryDirectory directory;
  std::filesystem::create_directory(fileOf(directory));
  EXPECT_EQ(open(directory), nullptr);
  std::filesystem::remove(fileOf(directory));
  ASSERT_EQ(mkfifo(fileOf(directory).c_str(), 0600), 0);
  EXPECT_EQ(open(directory), nullptr);
  std::filesystem::remove(fileOf(directory));
  directory.write("victim", "untouched");
  std::filesystem::create_symlink("victim", fileOf(directory));
  EXPECT_EQ(open(directory), nullptr);
  EXPECT_EQ(contentOf(directory / "victim"), "untouched");
  EXPECT_EQ(log.count(kLogProblem, "cannot be opened"), 3u);
}

TEST(SuiteFile, UnsafeNamesAndImpossibleDirectoriesAreRefused) {
  LogCapture log;
  const TemporaryDirectory directory;
  for (const std::string& name :
       {std::string(), std::string("../x"), std::string("a/b"), std::string(".hidden"),
        std::string("a\0b", 3), std::string(201, 'n')}) {
    EXPECT_EQ(SqliteSuite::open(directory.path(), name), nullptr) << name;
  }
  EXPECT_EQ(log.count(kLogProblem, "its name is no safe file name"), 6u);
  directory.write("file", "");
  EXPECT_EQ(SqliteSuite::open(directory / "file", kName), nullptr);
  EXPECT_EQ(SqliteSuite::open(directory / "file/below", kName), nullptr);
  EXPECT_EQ(log.count(kLogProblem, "is not a directory"), 2u);
}

}  // namespace
}  // namespace spacekeep
