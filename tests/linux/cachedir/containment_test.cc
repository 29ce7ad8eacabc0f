// Nothing outside the named directories is ever touched.
#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/prctl.h>
#include <sys/stat.h>
#include <sys/sysmacros.h>
#include <sys/wait.h>
#include <unistd.h>

#include <csignal>
#include <filesystem>
#include <limits>

#include "services/cachedir/engine/tree_walk.h"
#include "tests/linux/cachedir/cache_world.h"

namespace spacekeep::cachedir {
namespace {

using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::SizeIs;

constexpr std::uint64_t kAll = std::numeric_limits<std::uint64_t>::max();

TEST(Containment, LinksAreNeitherFollowedNorTaken) {
  const Volume volume("ext4");
  writeFile(volume / "outside/precious", kMiB);
  writeFile(volume / "cache/file", kMiB);
  std::filesystem::create_symlink(volume / "outside", volume / "cache/directory");
  std::filesystem::create_symlink(volume / "outside/precious", volume / "cache/link");
  std::filesystem::create_symlink("/", volume / "cache/root");
  EXPECT_THAT(freeIn(volume / "cache", kAll).paths, ElementsAre(volume / "cache/file"));
  EXPECT_TRUE(exists(volume / "outside/precious"));
  EXPECT_TRUE(exists(volume / "cache/link"));
}

TEST(Containment, SpecialFilesAreNotTaken) {
  const Volume volume("tmpfs");
  ASSERT_EQ(::mkfifo((volume / "pipe").c_str(), 0644), 0);
  ASSERT_EQ(::mknod((volume / "device").c_str(), S_IFCHR | 0600, makedev(1, 3)), 0);
  EXPECT_THAT(freeIn(volume.path(), kAll).paths, IsEmpty());
  EXPECT_TRUE(exists(volume / "pipe"));
  EXPECT_TRUE(exists(volume / "device"));
}

TEST(Containment, ADirectoryReachedThroughALinkIsRefusedByName) {
  const Volume volume("tmpfs");
  writeFile(volume / "real/file", kMiB);
  std::filesystem::create_symlink("real", volume / "alias");
  const Observed seen = freeIn(volume / "alias", kAll);
  EXPECT_THAT(seen.paths, IsEmpty());
  ASSERT_THAT(seen.result.problems, SizeIs(1));
  EXPECT_THAT(seen.result.problems[0], HasSubstr(volume / "alias"));
  EXPECT_THAT(seen.result.problems[0], HasSubstr("name the real directory"));
}

TEST(Containment, ADirectoryThatIsNotThereIsNoProblem) {
  const Observed seen = freeIn(temporaryDirectory() + "/later", kAll);
  EXPECT_THAT(seen.result.problems, IsEmpty());
  EXPECT_EQ(seen.result.bytes, 0U);
}

TEST(Containment, FileSystemsAndFilesMountedInsideAreLeftAlone) {
  const Volume volume("ext4");
  const Volume other("ext4");
  writeFile(volume / "outside/precious", kMiB);
  for (const char* name : {"cache/other/x", "cache/same/x", "cache/single"}) {
    writeFile(volume / name, 4096);
  }
  writeFile(other / "precious", kMiB);
  run("mount --bind " + other.path() + " " + volume / "cache/other");
  run("mount --bind " + volume / "outside" + " " + volume / "cache/same");
  run("mount --bind " + volume / "outside/precious" + " " + volume / "cache/single");
  const Observed seen = freeIn(volume / "cache", kAll);
  EXPECT_THAT(seen.paths, IsEmpty());
  EXPECT_EQ(seen.result.left.of(Left::kElsewhere), 3U);
  EXPECT_EQ(CacheCleaner(rulesFor(volume / "cache")).estimate({}).bytes[3], 0U);
  for (const char* name : {"cache/other", "cache/same", "cache/single"}) {
    run("umount " + volume / name);
  }
  EXPECT_TRUE(exists(other / "precious"));
  EXPECT_TRUE(exists(volume / "outside/precious"));
}

TEST(Containment, ASubvolumeInsideIsAFileSystemOfItsOwn) {
  const Volume volume("btrfs");
  writeFile(volume / "cache/file", kMiB);
  run("btrfs subvolume create " + volume / "cache/inner");
  writeFile(volume / "cache/inner/precious", kMiB);
  volume.settle();
  const Observed seen = freeIn(volume / "cache", kAll);
  EXPECT_THAT(seen.paths, ElementsAre(volume / "cache/file"));
  EXPECT_EQ(seen.result.left.of(Left::kElsewhere), 1U);
  EXPECT_TRUE(exists(volume / "cache/inner/precious"));
}

TEST(Containment, OnlyDirectoriesOnTheVolumeAskedTakePart) {
  const Volume volume("ext4");
  const Volume other("tmpfs");
  const Volume third("btrfs");
  writeFile(volume / "cache/file", kMiB);
  writeFile(other / "cache/file", kMiB, 200);
  run("btrfs subvolume create " + third / "inner");
  writeFile(third / "inner/cache/file", kMiB);
  third.settle();
  Rules rules = rulesFor(volume / "cache");
  rules.directories.push_back(rulesFor(other / "cache").directories[0]);
  rules.directories.push_back(rulesFor(third / "inner/cache").directories[0]);
  CacheCleaner cleaner(rules);
  EXPECT_EQ(cleaner.estimate(volume.path()).bytes[3], kMiB);
  const auto on = [&](const std::string& place) {
    return freeWith(cleaner, {.amount = kAll, .urgency = 4, .volume = place}).paths;
  };
  EXPECT_THAT(on(volume.path()), ElementsAre(volume / "cache/file"));
  EXPECT_TRUE(exists(other / "cache/file"));
  // A subvolume has a device number of its own, and belongs to its volume all the same.
  EXPECT_THAT(on(third.path()), ElementsAre(third / "inner/cache/file"));
  EXPECT_THAT(freeWith(cleaner, {.amount = kAll, .urgency = 4, .volume = "/nowhere"}).paths,
              IsEmpty());
  EXPECT_THAT(on(other.path()), ElementsAre(other / "cache/file"));
}

TEST(Containment, DirectoriesBelowTheDepthLimitAreLeft) {
  const Volume volume("tmpfs");
  std::string path = volume.path();
  for (std::size_t i = 0; i <= kMaxDepth; ++i) {
    path += "/d";
    writeFile(path + "/file", 4096);
  }
  const Observed seen = freeIn(volume.path(), kAll);
  EXPECT_EQ(seen.result.files, kMaxDepth);
  EXPECT_EQ(seen.result.left.of(Left::kTooDeep), 1U);
  EXPECT_TRUE(exists(path + "/file"));
}

TEST(Containment, ADirectorySwappedForALinkWhileFilesGoLeadsNowhere) {
  const Volume volume("ext4");
  for (int i = 0; i < 3; ++i) {
    writeFile(volume / ("cache/d/f" + std::to_string(i)), kMiB, 200 - i);
    writeFile(volume / ("outside/f" + std::to_string(i)), kMiB, 200 - i);
  }
  CacheCleaner cleaner(rulesFor(volume / "cache"));
  std::vector<std::string> gone;
  const FreeResult result =
      cleaner.free({.amount = kAll, .urgency = 4}, [&](const TakenFile& file) {
        gone.push_back(file.path);
        std::filesystem::rename(volume / "cache/d", volume / "moved");
        std::filesystem::create_symlink(volume / "outside", volume / "cache/d");
      });
  EXPECT_THAT(gone, ElementsAre(volume / "cache/d/f0"));
  EXPECT_EQ(result.left.of(Left::kUsedSince), 2U);
  for (int i = 0; i < 3; ++i) EXPECT_TRUE(exists(volume / ("outside/f" + std::to_string(i))));
  EXPECT_TRUE(exists(volume / "moved/f1"));
}

TEST(Containment, ADirectorySwappedAllTheTimeNeverLosesWhatIsOutside) {
  const Volume volume("tmpfs");
  std::filesystem::create_directories(volume / "cache");
  for (int i = 0; i < 200; ++i) {
    writeFile(volume / ("outside/f" + std::to_string(i)), 4096);
    writeFile(volume / ("cache/d/f" + std::to_string(i)), 4096);
  }
  std::filesystem::create_symlink(volume / "outside", volume / "link");
  const pid_t swapper = ::fork();
  if (swapper == 0) {
    ::prctl(PR_SET_PDEATHSIG, SIGKILL);
    const std::string inside = volume / "cache/d";
    const std::string link = volume / "link";
    for (;;) ::renameat2(AT_FDCWD, inside.c_str(), AT_FDCWD, link.c_str(), RENAME_EXCHANGE);
  }
  std::uint64_t taken = 0;
  for (int round = 0; round < 40; ++round) {
    for (int i = 0; i < 20; ++i) {
      writeFile(volume / ("cache/e/f" + std::to_string(i)), 4096);
    }
    taken += freeIn(volume / "cache", kAll).result.files;
  }
  ::kill(swapper, SIGKILL);
  ::waitpid(swapper, nullptr, 0);
  EXPECT_GE(taken, 800U);
  for (int i = 0; i < 200; ++i) ASSERT_TRUE(exists(volume / ("outside/f" + std::to_string(i))));
}

}  // namespace
}  // namespace spacekeep::cachedir
