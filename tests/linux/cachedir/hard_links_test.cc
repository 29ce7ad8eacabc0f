// Claimed bytes must come back: hard links, and blocks shared without links.
#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include "tests/linux/cachedir/cache_world.h"

namespace spacekeep::cachedir {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;

class HardLinks : public testing::TestWithParam<const char*> {
 protected:
  Volume volume_{GetParam()};
  const std::string cache_ = volume_ / "cache";
};
INSTANTIATE_TEST_SUITE_P(On, HardLinks, testing::Values("ext4", "xfs", "btrfs", "tmpfs"),
                         [](const auto& about) { return about.param; });

TEST_P(HardLinks, AFileWithALinkOutsideStaysAndCountsNothing) {
  writeFile(cache_ + "/inside", kMiB);
  ASSERT_EQ(::link((cache_ + "/inside").c_str(), (volume_ / "outside").c_str()), 0);
  volume_.settle();
  const Observed seen = freeIn(cache_, kMiB);
  EXPECT_THAT(seen.paths, IsEmpty());
  EXPECT_EQ(seen.result.bytes, 0U);
  EXPECT_EQ(seen.result.left.of(Left::kLinked), 1U);
  EXPECT_TRUE(exists(cache_ + "/inside"));
  EXPECT_THAT(CacheCleaner(rulesFor(cache_)).estimate({}).bytes, ElementsAre(0, 0, 0, 0));
}

TEST_P(HardLinks, AFileWithAllLinksInsideGoesWholeAndCountsOnce) {
  writeFile(cache_ + "/a/one", kMiB);
  writeFile(cache_ + "/b/other", kMiB, 99);
  ASSERT_EQ(::link((cache_ + "/a/one").c_str(), (cache_ + "/b/two").c_str()), 0);
  ASSERT_EQ(::link((cache_ + "/a/one").c_str(), (cache_ + "/three").c_str()), 0);
  volume_.settle();
  EXPECT_EQ(CacheCleaner(rulesFor(cache_)).estimate({}).bytes[3], 2 * kMiB);
  const std::uint64_t before = volume_.freeBytes();
  const Observed seen = freeIn(cache_, kMiB);
  EXPECT_EQ(seen.result.files, 1U);
  EXPECT_EQ(seen.result.bytes, kMiB);
  EXPECT_EQ(volume_.freeBytes() - before, kMiB);
  for (const char* name : {"/a/one", "/b/two", "/three"}) EXPECT_FALSE(exists(cache_ + name));
  EXPECT_TRUE(exists(cache_ + "/b/other"));
}

TEST_P(HardLinks, ALinkThatAPatternKeepsKeepsTheFile) {
  writeFile(cache_ + "/one", kMiB);
  ASSERT_EQ(::link((cache_ + "/one").c_str(), (cache_ + "/one.keep").c_str()), 0);
  Rules rules = rulesFor(cache_);
  rules.directories[0].keep = {"*.keep"};
  CacheCleaner cleaner(rules);
  EXPECT_THAT(freeWith(cleaner, {.amount = kMiB, .urgency = 4}).paths, IsEmpty());
  EXPECT_TRUE(exists(cache_ + "/one"));
}

TEST_P(HardLinks, LinksInTwoDirectoriesOfOneRuleFileAreBothInside) {
  const std::string second = volume_ / "second";
  writeFile(cache_ + "/one", kMiB);
  writeFile(second + "/small", 4096, 0);
  ASSERT_EQ(::link((cache_ + "/one").c_str(), (second + "/two").c_str()), 0);
  volume_.settle();
  Rules rules = rulesFor(cache_);
  rules.directories.push_back(rulesFor(second).directories[0]);
  CacheCleaner cleaner(rules);
  EXPECT_EQ(freeWith(cleaner, {.amount = kMiB, .urgency = 1}).result.bytes, kMiB);
  EXPECT_FALSE(exists(second + "/two"));
}

TEST_P(HardLinks, OneDirectoryMountedTwiceDoesNotPassForTwoLinks) {
  // The true second link is outside; the same name seen through a second mount must not stand in.
  const std::string top = volume_ / "top";
  writeFile(top + "/sub/one", kMiB);
  ASSERT_EQ(::link((top + "/sub/one").c_str(), (volume_ / "outside").c_str()), 0);
  const std::string alias = temporaryDirectory();
  run("mount --bind " + top + "/sub " + alias);
  Rules rules = rulesFor(top);
  rules.directories.push_back(rulesFor(alias).directories[0]);
  CacheCleaner cleaner(rules);
  EXPECT_EQ(freeWith(cleaner, {.amount = kMiB, .urgency = 4}).result.bytes, 0U);
  EXPECT_TRUE(exists(top + "/sub/one"));
  run("umount " + alias);
}

class SharedBlocks : public testing::TestWithParam<const char*> {
 protected:
  Volume volume_{GetParam()};
};
INSTANTIATE_TEST_SUITE_P(On, SharedBlocks, testing::Values("xfs", "btrfs"),
                         [](const auto& about) { return about.param; });

TEST_P(SharedBlocks, AFileThatSharesAllItsBlocksStays) {
  writeFile(volume_ / "original", kMiB);
  run("mkdir " + volume_ / "cache");
  run("cp --reflink=always " + volume_ / "original" + " " + volume_ / "cache/copy");
  setAge(volume_ / "cache/copy", 50);
  volume_.settle();
  const Observed seen = freeIn(volume_ / "cache", kMiB);
  EXPECT_EQ(seen.result.bytes, 0U);
  EXPECT_EQ(seen.result.left.of(Left::kNothingBack), 1U);
  EXPECT_TRUE(exists(volume_ / "cache/copy"));
}

TEST_P(SharedBlocks, OfAFileThatSharesHalfOnlyTheOtherHalfCounts) {
  writeFile(volume_ / "original", kMiB);
  run("mkdir " + volume_ / "cache");
  run("cp --reflink=always " + volume_ / "original" + " " + volume_ / "cache/copy");
  run("head -c 1048576 /dev/urandom >> " + volume_ / "cache/copy");
  setAge(volume_ / "cache/copy", 50);
  volume_.settle();
  const std::uint64_t before = volume_.freeBytes();
  EXPECT_EQ(freeIn(volume_ / "cache", 2 * kMiB).result.bytes, kMiB);
  EXPECT_NEAR(static_cast<double>(volume_.freeBytes() - before), static_cast<double>(kMiB), 65536);
}

TEST_P(SharedBlocks, AFileInManyPiecesCountsForThosePiecesThatAreItsOwn) {
  constexpr int kPieces = 300;  // more than one question to the file system
  constexpr std::uint64_t kPiece = 16 * 1024;
  writeFile(volume_ / "original", kPieces * kPiece);
  run("mkdir " + volume_ / "cache");
  run("cp --reflink=always " + volume_ / "original" + " " + volume_ / "cache/copy");
  {
    const UniqueFd fd(::open((volume_ / "cache/copy").c_str(), O_WRONLY));
    const std::string piece(kPiece, 'y');
    for (int i = 0; i < kPieces; i += 2) {
      const auto place = static_cast<off_t>(i) * static_cast<off_t>(kPiece);
      ASSERT_EQ(::pwrite(fd.get(), piece.data(), kPiece, place), static_cast<ssize_t>(kPiece));
    }
  }
  setAge(volume_ / "cache/copy", 50);
  volume_.settle();
  EXPECT_EQ(freeIn(volume_ / "cache", kPieces * kPiece).result.bytes, kPieces / 2 * kPiece);
}

}  // namespace
}  // namespace spacekeep::cachedir
