// The bounded memory of a walk.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "services/cachedir/engine/candidates.h"
#include "services/cachedir/engine/link_groups.h"

namespace spacekeep::cachedir {
namespace {

const std::shared_ptr<const Folder> kFolder = std::make_shared<const Folder>(Folder{0, "folder"});

Candidate candidate(std::int64_t used_ns, const std::string& name = "name") {
  return {.turn = {used_ns, {1, static_cast<std::uint64_t>(used_ns)}},
          .bytes = 1,
          .first = {kFolder, name},
          .others = {},
          .level = 0};
}

std::vector<std::int64_t> times(OldestFiles& files) {
  std::vector<std::int64_t> result;
  for (const Candidate& each : files.takeInOrder()) result.push_back(each.turn.used_ns);
  return result;
}

TEST(OldestFiles, KeepsTheOldestInOrderAndTellsThatSomeDidNotFit) {
  OldestFiles files(3, 10000);
  for (const int used : {5, 2, 9, 1}) files.offer(candidate(used));
  EXPECT_TRUE(files.overflowed());
  EXPECT_THAT(times(files), testing::ElementsAre(1, 2, 5));
}

TEST(OldestFiles, ExactlyAsManyAsFitAreNoOverflow) {
  OldestFiles files(3, 10000);
  for (const int used : {5, 2, 9}) files.offer(candidate(used));
  EXPECT_FALSE(files.overflowed());
}

TEST(OldestFiles, NothingYoungerThanWhatWasLeftOutIsEverKept) {
  // A long name drives out two; a younger short one must not slip in behind them.
  OldestFiles files(100, 60);
  files.offer(candidate(10));
  files.offer(candidate(30));
  files.offer(candidate(40));
  files.offer(candidate(5, std::string(35, 'x')));
  EXPECT_TRUE(files.overflowed());
  EXPECT_FALSE(files.wants(candidate(50).turn));
  files.offer(candidate(50, ""));
  EXPECT_THAT(times(files), testing::ElementsAre(5, 10));
}

TEST(OldestFiles, OneFileIsKeptHoweverLongItsName) {
  OldestFiles files(1, 1);
  files.offer(candidate(1, std::string(255, 'x')));
  EXPECT_THAT(times(files), testing::ElementsAre(1));
}

FoundFile linked(std::uint64_t inode, std::string_view name, std::uint64_t links,
                 std::int64_t used_ns = 1) {
  return {.folder = kFolder,
          .name = name,
          .inode = {1, inode},
          .used_ns = used_ns,
          .bytes = 4096,
          .links = links};
}

TEST(LinkGroups, AFileIsWholeOnceAllItsNamesWereMet) {
  LinkGroups groups;
  EXPECT_FALSE(groups.offer(linked(7, "a", 3), 1));
  EXPECT_FALSE(groups.offer(linked(7, "b", 3, 5), 4));
  EXPECT_EQ(groups.incomplete(), 1U);
  const auto whole = groups.offer(linked(7, "c", 3), 2);
  ASSERT_TRUE(whole);
  EXPECT_EQ(whole->others.size(), 2U);
  EXPECT_EQ(whole->turn.used_ns, 5);
  EXPECT_EQ(whole->level, 4);
  EXPECT_EQ(groups.incomplete(), 0U);
}

TEST(LinkGroups, FilesBeyondTheBoundsAreCountedAndNotKept) {
  LinkGroups groups;
  for (std::uint64_t i = 0; i < kMaxLinkGroups; ++i) {
    EXPECT_FALSE(groups.offer(linked(i, "a", 2), 0));
  }
  EXPECT_FALSE(groups.offer(linked(kMaxLinkGroups, "a", 2), 0));
  EXPECT_FALSE(groups.offer(linked(kMaxLinkGroups, "b", 2), 0)) << "its first name was not kept";
  EXPECT_TRUE(groups.offer(linked(0, "b", 2), 0)) << "those that are known can still be completed";
  EXPECT_FALSE(groups.offer(linked(1, "x", kMaxLinksOfAFile + 1), 0));
  EXPECT_EQ(groups.incomplete(), kMaxLinkGroups - 1 + 3);
}

TEST(LinkGroups, NamesTakeABoundedAmountOfText) {
  LinkGroups groups;
  const std::string name(250, 'x');
  for (std::uint64_t i = 0; i < kMaxLinkGroups; ++i) {
    EXPECT_FALSE(groups.offer(linked(i, name, 2), 0));
  }
  EXPECT_GT(groups.incomplete(), 0U);
  // 256 bytes each: all 32768 fill the 8 MiB to the last byte, and one more does not fit.
  EXPECT_FALSE(groups.offer(linked(0, name, 2), 0));
}

}  // namespace
}  // namespace spacekeep::cachedir
