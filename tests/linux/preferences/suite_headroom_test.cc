#include "support/preferences/linux/suite_headroom.h"

#include <gtest/gtest.h>

#include "support/preferences/linux/sqlite_suite.h"
#include "tests/helpers/temporary_directory.h"

namespace spacekeep {
namespace {

using test::TemporaryDirectory;

constexpr const char* kName = "com.quorvel.spacekeep";

struct Sizes {
  std::uint64_t file = 0;
  std::uint64_t journal = 0;
  bool operator==(const Sizes&) const = default;
};

Sizes sizesIn(const TemporaryDirectory& directory) {
  const std::string path = directory / std::string(kName) + ".sqlite";
  return {std::filesystem::file_size(path), std::filesystem::file_size(path + "-journal")};
}

std::int64_t ask(const TemporaryDirectory& directory, const char* sql) {
  sqlite3* raw = nullptr;
  EXPECT_EQ(sqlite3_open((directory / std::string(kName) + ".sqlite").c_str(), &raw), SQLITE_OK);
  const Database database(raw);
  int code = 0;
  return queryInteger(database.get(), sql, code);
}

Value bytes(std::size_t count, std::uint8_t content) {
  return Data{std::vector<std::uint8_t>(count, content)};
}

TEST(SuiteHeadroom, AFreshSuiteHasRoomOfItsOwnInTheFileAndInTheJournal) {
  const TemporaryDirectory directory;
  auto suite = SqliteSuite::open(directory.path(), kName);
  ASSERT_NE(suite, nullptr);
  EXPECT_GE(ask(directory, "PRAGMA freelist_count"), 64);
  EXPECT_GE(sizesIn(directory).journal, 64u * 4104);
  EXPECT_EQ(ask(directory, "SELECT count(*) FROM spare"), 0);
}

TEST(SuiteHeadroom, IsTakenOnceAndNotAtEveryStart) {
  const TemporaryDirectory directory;
  ASSERT_NE(SqliteSuite::open(directory.path(), kName), nullptr);
  const Sizes first = sizesIn(directory);
  const std::int64_t schema = ask(directory, "PRAGMA schema_version");
  const std::string content = test::contentOf(directory / std::string(kName) + ".sqlite");
  ASSERT_NE(SqliteSuite::open(directory.path(), kName), nullptr);
  EXPECT_EQ(sizesIn(directory), first);
  EXPECT_EQ(ask(directory, "PRAGMA schema_version"), schema);
  EXPECT_EQ(test::contentOf(directory / std::string(kName) + ".sqlite"), content);
}

TEST(SuiteHeadroom, ReplacingAValueByOneOfSimilarSizeGrowsNeitherFile) {
  const TemporaryDirectory directory;
  auto suite = SqliteSuite::open(directory.path(), kName);
  for (const std::size_t size : {100U, 50'000U, 3'000'000U}) {
    suite->set("k", bytes(size, 1));
    ASSERT_EQ(suite->synchronize(), std::nullopt);
    const Sizes before = sizesIn(directory);
    for (std::uint8_t round = 2; round < 12; ++round) {
      suite->set("k", bytes(size + 300U * round, round));
      ASSERT_EQ(suite->synchronize(), std::nullopt);
      EXPECT_EQ(sizesIn(directory), before) << size << " bytes, round " << int{round};
    }
  }
}

TEST(SuiteHeadroom, GrowsWithTheStateAndRarely) {
  const TemporaryDirectory directory;
  auto suite = SqliteSuite::open(directory.path(), kName);
  int grown = 0;
  Sizes last = sizesIn(directory);
  for (std::size_t size = 0; size < 4'000'000; size += 40'000) {
    suite->set("k", bytes(size, 1));
    ASSERT_EQ(suite->synchronize(), std::nullopt);
    if (const Sizes now = sizesIn(directory); now != last) {
      ++grown;
      last = now;
    }
  }
  EXPECT_GE(grown, 3);
  EXPECT_LE(grown, 8);
  EXPECT_GE(ask(directory, "PRAGMA freelist_count"), 500);
}

TEST(SuiteHeadroom, StaysWithinTheBoundOfTheFile) {
  const TemporaryDirectory directory;
  auto suite = SqliteSuite::open(directory.path(), kName, {.max_pages = 40});
  suite->set("k", bytes(100'000, 1));
  EXPECT_EQ(suite->synchronize(), std::nullopt);
  EXPECT_LE(sizesIn(directory).file, 40u * 4096);
  suite->set("k", bytes(200'000, 3));
  EXPECT_NE(suite->synchronize(), std::nullopt);
}

TEST(SuiteHeadroom, WhatABrokenOffGrowthLeftIsGivenBackToTheState) {
  const TemporaryDirectory directory;
  ASSERT_NE(SqliteSuite::open(directory.path(), kName), nullptr);
  const Sizes before = sizesIn(directory);
  // Also takes the journal away, as other programs do that write to the file.
  ASSERT_EQ(ask(directory, "INSERT INTO spare VALUES (1, zeroblob(270000))"), 0);
  ASSERT_LT(ask(directory, "PRAGMA freelist_count"), 10);
  ASSERT_NE(SqliteSuite::open(directory.path(), kName), nullptr);
  EXPECT_EQ(ask(directory, "SELECT count(*) FROM spare"), 0);
  EXPECT_GE(ask(directory, "PRAGMA freelist_count"), 60);
  EXPECT_EQ(sizesIn(directory).file, before.file);
  EXPECT_GE(sizesIn(directory).journal, 64u * 4104);
}

}  // namespace
}  // namespace spacekeep
