// What the index has to notice, one by one.
#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/mman.h>
#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>

#include "services/cachedir/engine/unique_fd.h"
#include "tests/linux/cachedir/cache_world.h"
#include "tests/linux/cachedir/index_world.h"

namespace spacekeep::cachedir {
namespace {

using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::SizeIs;

namespace fs = std::filesystem;

class Index : public testing::Test {
 protected:
  Index() {
    fs::create_directories(cache_);
    fs::create_directories(outside_);
  }
  /// Makes the world over the files that are there, and lets it index them.
  void begin(const CacheIndex::Settings& settings = withoutThread()) {
    world_ = std::make_unique<IndexWorld>(rules_, settings);
    world_->compared();
  }
  std::string operator/(const std::string& name) const { return cache_ + "/" + name; }
  std::uint64_t built() { return world_->index().history().built; }

  const Volume volume_{"tmpfs"};
  const std::string cache_ = volume_ / "cache";
  const std::string outside_ = volume_ / "outside";
  Rules rules_ = rulesFor(cache_);
  std::unique_ptr<IndexWorld> world_;
};

TEST_F(Index, FilesMadeChangedAndRemovedAreNoticedWithoutAWalk) {
  writeFile(*this / "a/one", kMiB);
  begin();
  EXPECT_EQ(world_->bytes(), kMiB);
  writeFile(*this / "a/two", 2 * kMiB);
  writeFile(*this / "b/c/three", 4 * kMiB);
  EXPECT_EQ(world_->bytes(), 7 * kMiB);
  ASSERT_EQ(::truncate((*this / "a/two").c_str(), static_cast<off_t>(kMiB)), 0);
  EXPECT_EQ(world_->bytes(), 6 * kMiB);
  fs::remove(*this / "a/one");
  fs::remove_all(*this / "b");
  EXPECT_EQ(world_->bytes(), kMiB);
  EXPECT_EQ(world_->index().totals().files, 1U);
  EXPECT_EQ(world_->index().totals().folders, 2U);
}

TEST_F(Index, FilesGrowOldWithoutAnythingHappening) {
  for (int i = 0; i < 2000; ++i) {
    writeFile(*this / ("f" + std::to_string(i)), 4096, i * 0.02);  // up to 40 days
  }
  begin();
  std::uint64_t before = 0;
  for (int step = 0; step < 60; ++step) {
    world_->passTime(0.5);
    const std::uint64_t now = world_->known().bytes[0];
    EXPECT_GE(now, before);
    before = now;
  }
  EXPECT_EQ(before, 2000U * 4096);
  world_->passTime(-25);  // the wall clock is set back
  EXPECT_LT(world_->known().bytes[0], before);
}

TEST_F(Index, AMovedDirectoryTakesItsFilesWithIt) {
  for (const char* name : {"a/x/one", "a/x/y/two", "b/three"}) writeFile(*this / name, kMiB);
  begin();
  fs::rename(*this / "a/x", *this / "b/x");
  EXPECT_EQ(world_->bytes(), 3 * kMiB);
  writeFile(*this / "b/x/y/four", kMiB);
  EXPECT_EQ(world_->bytes(), 4 * kMiB) << "it is followed in its new place";
  fs::rename(*this / "b/x", outside_ + "/x");
  EXPECT_EQ(world_->bytes(), kMiB);
  writeFile(outside_ + "/x/five", kMiB);
  EXPECT_EQ(world_->bytes(), kMiB) << "and not outside";
  fs::rename(outside_ + "/x", *this / "a/back");
  EXPECT_EQ(world_->bytes(), 5 * kMiB);
  writeFile(*this / "a/back/y/six", kMiB);
  EXPECT_EQ(world_->bytes(), 6 * kMiB);
}

TEST_F(Index, DirectoriesThatChangePlacesAreToldApart) {
  writeFile(*this / "a/one", kMiB);
  writeFile(*this / "b/two", 2 * kMiB);
  begin();
  fs::rename(*this / "a", *this / "c");
  fs::rename(*this / "b", *this / "a");
  fs::rename(*this / "c", *this / "b");
  EXPECT_EQ(world_->bytes(), 3 * kMiB);
  fs::remove(*this / "a/two");
  writeFile(*this / "b/three", 4 * kMiB);
  EXPECT_EQ(world_->bytes(), 5 * kMiB);
}

TEST_F(Index, ATreeThatIsReplacedIsIndexedAnew) {
  writeFile(*this / "old", kMiB);
  begin();
  fs::rename(cache_, outside_ + "/was");
  EXPECT_EQ(world_->compared().bytes[3], 0U) << "there is no directory";
  writeFile(*this / "new", 2 * kMiB);
  const std::uint64_t before = built();
  EXPECT_EQ(world_->compared().bytes[3], 2 * kMiB);
  EXPECT_EQ(built(), before + 1);
  writeFile(*this / "newer", 4 * kMiB);
  EXPECT_EQ(world_->bytes(), 6 * kMiB);
}

TEST_F(Index, AMountOverADirectoryHidesItsFilesAndGivesThemBack) {
  writeFile(*this / "a b/one", kMiB);  // the blank is written as digits in the mount table
  writeFile(*this / "two", 2 * kMiB);
  begin();
  run("mount -t tmpfs none '" + *this / "a b'");
  writeFile(*this / "a b/precious", 4 * kMiB);
  EXPECT_EQ(world_->compared().bytes[3], 2 * kMiB);
  run("umount '" + *this / "a b'");
  EXPECT_EQ(world_->compared().bytes[3], 3 * kMiB);
  run("mount --bind " + *this / "two '" + *this / "a b/one'");
  EXPECT_EQ(world_->compared().bytes[3], 2 * kMiB) << "a single file can be mounted over, too";
  run("umount '" + *this / "a b/one'");
  EXPECT_EQ(world_->compared().bytes[3], 3 * kMiB);
}

TEST_F(Index, AMountOverTheCacheDirectoryItselfIsAnotherTree) {
  writeFile(*this / "one", kMiB);
  begin();
  run("mount -t tmpfs none " + cache_);
  writeFile(*this / "two", 2 * kMiB);
  EXPECT_EQ(world_->compared().bytes[3], 2 * kMiB);
  run("umount " + cache_);
  EXPECT_EQ(world_->compared().bytes[3], kMiB);
}

TEST_F(Index, TwoMountsAreKeptApart) {
  const Volume other("ext4");
  writeFile(*this / "one", kMiB);
  writeFile(other / "cache/two", 2 * kMiB);
  other.settle();
  rules_.directories.push_back(rulesFor(other / "cache").directories[0]);
  begin();
  EXPECT_EQ(world_->known(volume_.path()).bytes[3], kMiB);
  EXPECT_EQ(world_->known(other.path()).bytes[3], 2 * kMiB);
  writeFile(*this / "three", 4 * kMiB);
  writeFile(other / "cache/four", 8 * kMiB);
  other.settle();
  // What is told of one is not lost when the other is asked first.
  EXPECT_EQ(world_->known(other.path()).bytes[3], 10 * kMiB);
  EXPECT_EQ(world_->known(volume_.path()).bytes[3], 5 * kMiB);
  EXPECT_EQ(world_->known().bytes[3], 15 * kMiB);
}

TEST_F(Index, ADirectoryShownTwiceIsWalked) {
  writeFile(*this / "inner/one", kMiB);
  fs::create_directories(outside_ + "/view");
  run("mount --bind " + cache_ + " " + outside_ + "/view");
  rules_.directories.push_back(rulesFor(outside_ + "/view/inner").directories[0]);
  begin();
  writeFile(*this / "inner/two", kMiB);
  world_->compared();
  EXPECT_THAT(world_->problems(), ElementsAre(HasSubstr("shows the same files")));
}

TEST_F(Index, LinksAreNeitherFollowedNorCounted) {
  writeFile(*this / "one", kMiB);
  writeFile(outside_ + "/precious", 4 * kMiB);
  begin();
  fs::create_symlink(outside_, *this / "directory");
  fs::create_symlink(outside_ + "/precious", *this / "file");
  EXPECT_EQ(world_->bytes(), kMiB);
  fs::remove(*this / "directory");
  fs::create_directory(*this / "directory");
  writeFile(*this / "directory/two", 2 * kMiB);
  EXPECT_EQ(world_->bytes(), 3 * kMiB);
  fs::remove_all(*this / "directory");
  fs::create_symlink(outside_, *this / "directory");
  EXPECT_EQ(world_->bytes(), kMiB) << "a directory became a link";
}

TEST_F(Index, AFileThatSomebodyHoldsDoesNotCountUntilItIsLetGo) {
  writeFile(*this / "one", kMiB);
  writeFile(*this / "two", 2 * kMiB);
  begin();
  UniqueFd fd(::open((*this / "two").c_str(), O_RDONLY | O_CLOEXEC));
  EXPECT_EQ(world_->bytes(), kMiB);
  fd.reset();
  EXPECT_EQ(world_->bytes(), 3 * kMiB);
}

TEST_F(Index, WhatIsWrittenThroughAMappingIsNoticed) {
  writeFile(*this / "one", 4096);
  ASSERT_EQ(::truncate((*this / "one").c_str(), 1 << 20), 0);
  setAge(*this / "one", 100);
  begin();
  UniqueFd fd(::open((*this / "one").c_str(), O_RDWR | O_CLOEXEC));
  void* place = ::mmap(nullptr, 1 << 20, PROT_READ | PROT_WRITE, MAP_SHARED, fd.get(), 0);
  ASSERT_NE(place, MAP_FAILED);
  fd.reset();
  world_->known();
  for (int page = 0; page < 10; ++page) static_cast<char*>(place)[page * 8192] = 'x';
  EXPECT_EQ(world_->bytes(), 0U) << "it is held";
  ASSERT_EQ(::munmap(place, 1 << 20), 0);
  EXPECT_EQ(world_->bytes(), 10U * 4096);
  EXPECT_EQ(world_->known().bytes[0], 0U) << "and is young now";
}

TEST_F(Index, WritingThroughANameThatIsGoneIsNoticedOnceItEnds) {
  writeFile(*this / "one", 4096);
  fs::create_hard_link(*this / "one", *this / "two");
  begin();
  UniqueFd fd(::open((*this / "one").c_str(), O_WRONLY | O_APPEND | O_CLOEXEC));
  fs::remove(*this / "one");
  EXPECT_EQ(world_->bytes(), 0U);
  const std::string more(8192, 'x');
  ASSERT_EQ(::write(fd.get(), more.data(), more.size()), 8192);
  fd.reset();
  EXPECT_EQ(world_->bytes(), 3U * 4096);
}

TEST_F(Index, HardLinksCountOnceAndOnlyWhenAllNamesAreInside) {
  writeFile(*this / "one", kMiB);
  begin();
  fs::create_hard_link(*this / "one", *this / "two");
  EXPECT_EQ(world_->bytes(), kMiB);
  fs::create_hard_link(*this / "two", outside_ + "/three");
  EXPECT_EQ(world_->bytes(), 0U);
  fs::remove(outside_ + "/three");
  EXPECT_EQ(world_->bytes(), kMiB);
  fs::remove(*this / "one");
  EXPECT_EQ(world_->bytes(), kMiB);
}

TEST_F(Index, AFurtherNameThatIsKeptKeepsTheFile) {
  rules_.directories[0].keep = {"*.db"};
  writeFile(*this / "one", kMiB);
  begin();
  fs::create_hard_link(*this / "one", *this / "index.db");
  EXPECT_EQ(world_->bytes(), 0U);
}

TEST_F(Index, ALinkMadeOutsideIsNoticedByTheDailyComparison) {
  writeFile(*this / "one", kMiB);
  writeFile(*this / "two", 2 * kMiB);
  begin();
  fs::create_hard_link(*this / "one", outside_ + "/three");
  EXPECT_THAT(world_->cleaner().verifyIndex(volume_.path(), 10'000'000'000),
              ElementsAre(HasSubstr("wrong about 1 names")));
  EXPECT_EQ(world_->bytes(), 2 * kMiB);
  EXPECT_THAT(world_->cleaner().verifyIndex(volume_.path(), 10'000'000'000), IsEmpty());
}

TEST_F(Index, ALinkMadeOutsideIsNoticedAtTheLatestWhenTheTrustEnds) {
  writeFile(*this / "one", kMiB);
  CacheIndex::Settings settings = withoutThread();
  settings.trust_ns = 0;
  begin(settings);
  fs::create_hard_link(*this / "one", outside_ + "/three");
  EXPECT_EQ(world_->compared().bytes[3], 0U);
  EXPECT_EQ(built(), 1U) << "looking at all of it again is enough";
}

TEST_F(Index, AComparisonThatRunsOutOfTimeGoesOnTheNextTime) {
  for (int i = 0; i < 20; ++i) writeFile(*this / ("d" + std::to_string(i) + "/f"), 4096);
  begin();
  for (int i = 0; i < 20; ++i) {
    fs::create_hard_link(*this / ("d" + std::to_string(i) + "/f"),
                         outside_ + "/" + std::to_string(i));
  }
  // Without any time at all nothing is compared, and nothing is claimed to be.
  EXPECT_THAT(world_->cleaner().verifyIndex({}, 0), IsEmpty());
  EXPECT_THAT(world_->cleaner().verifyIndex({}, 10'000'000'000),
              ElementsAre(HasSubstr("wrong about 20 names")));
  EXPECT_EQ(world_->bytes(), 0U);
}

TEST_F(Index, WithoutWatchesDirectoriesAreLookedThroughAndThatIsToldOnce) {
  for (const char* name : {"a/one", "a/b/two", "c/three"}) writeFile(*this / name, kMiB);
  CacheIndex::Settings settings = withoutThread();
  settings.inbox.max_watches = 2;
  begin(settings);
  EXPECT_THAT(world_->problems(), ElementsAre(HasSubstr("fs.inotify.max_user_watches")));
  writeFile(*this / "a/b/four", kMiB);
  writeFile(*this / "a/b/new/five", kMiB);
  writeFile(*this / "c/six", kMiB);
  EXPECT_EQ(world_->bytes(), 6 * kMiB);
  fs::rename(*this / "a/b/new", *this / "c/new");
  fs::remove(*this / "a/one");
  EXPECT_EQ(world_->bytes(), 5 * kMiB);
  fs::remove_all(*this / "a");
  EXPECT_EQ(world_->bytes(), 3 * kMiB);
  EXPECT_THAT(world_->problems(), SizeIs(1));
}

TEST_F(Index, AfterALossEverythingIsIndexedAnew) {
  writeFile(*this / "a/one", kMiB);
  begin();
  std::uint64_t queued = 0;
  std::ifstream("/proc/sys/fs/inotify/max_queued_events") >> queued;
  for (std::uint64_t i = 0; i < queued; ++i) {
    ::close(::open((*this / ("a/f" + std::to_string(i % 5000))).c_str(), O_CREAT | O_WRONLY, 0644));
  }
  writeFile(*this / "a/two", 2 * kMiB);
  const std::uint64_t before = built();
  EXPECT_EQ(world_->compared().bytes[3], 3 * kMiB);
  EXPECT_EQ(world_->index().history().losses, 1U);
  EXPECT_EQ(built(), before + 1);
  writeFile(*this / "a/three", 4 * kMiB);
  EXPECT_EQ(world_->bytes(), 7 * kMiB);
}

TEST_F(Index, ATreeBeyondTheBoundIsWalkedAndTriedAgainAtTheComparison) {
  for (int i = 0; i < 30; ++i) writeFile(*this / ("f" + std::to_string(i)), 4096);
  CacheIndex::Settings settings = withoutThread();
  settings.bounds.max_files = 20;
  begin(settings);
  world_->compared();
  EXPECT_EQ(built(), 1U) << "it is not tried at each request";
  EXPECT_EQ(world_->index().totals().files, 0U);
  EXPECT_EQ(world_->index().inbox().watches(), 0U);
  EXPECT_THAT(world_->problems(), ElementsAre(HasSubstr("more than 20 files")));
  for (int i = 0; i < 15; ++i) fs::remove(*this / ("f" + std::to_string(i)));
  static_cast<void>(world_->cleaner().verifyIndex({}, 10'000'000'000));
  EXPECT_EQ(world_->bytes(), 15U * 4096);
  for (int i = 0; i < 15; ++i) writeFile(*this / ("g" + std::to_string(i)), 4096);
  EXPECT_EQ(world_->compared().bytes[3], 30U * 4096) << "it grew beyond the bound again";
  EXPECT_EQ(world_->index().totals().files, 0U);
}

TEST_F(Index, DirectoriesAndLinkedNamesAreBoundedToo) {
  for (int i = 0; i < 6; ++i) {
    writeFile(*this / ("d" + std::to_string(i) + "/f"), 4096);
    fs::create_hard_link(*this / ("d" + std::to_string(i) + "/f"),
                         *this / ("d" + std::to_string(i) + "/g"));
  }
  CacheIndex::Settings few_folders = withoutThread();
  few_folders.bounds.max_folders = 5;
  begin(few_folders);
  EXPECT_THAT(world_->problems(), ElementsAre(HasSubstr("more than 5 directories")));
  CacheIndex::Settings few_linked = withoutThread();
  few_linked.bounds.max_linked = 11;
  begin(few_linked);
  EXPECT_THAT(world_->problems(), ElementsAre(HasSubstr("more than 11 names")));
}

TEST_F(Index, AFileSystemThatDoesNotTellIsWalked) {
  fs::create_directories(outside_ + "/upper");
  fs::create_directories(outside_ + "/work");
  writeFile(outside_ + "/lower/one", kMiB);
  run("mount -t overlay none -o lowerdir=" + outside_ + "/lower,upperdir=" + outside_ +
      "/upper,workdir=" + outside_ + "/work " + cache_);
  begin();
  EXPECT_EQ(world_->compared().bytes[3], kMiB);
  EXPECT_THAT(world_->problems(), ElementsAre(HasSubstr("does not tell all changes")));
  EXPECT_EQ(world_->index().inbox().watches(), 0U);
}

}  // namespace
}  // namespace spacekeep::cachedir
