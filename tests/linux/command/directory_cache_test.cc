// Caches of plain files under conditions, and directories that go as a whole.
#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/file.h>
#include <unistd.h>

#include "services/command/engine/directory_cache.h"
#include "services/command/engine/in_use.h"
#include "services/command/engine/whole_directories.h"
#include "tests/linux/command/command_world.h"

namespace spacekeep::command {
namespace {

using testing::ElementsAre;

std::string directory(const std::string& path, const std::string& more = "") {
  return "<key>DIRECTORIES</key><array><dict><key>PATH</key><string>" + path + "</string>" + more +
         "</dict></array>";
}

class DirectoryCacheTest : public testing::Test {
 protected:
  [[nodiscard]] Request request(int urgency, std::uint64_t amount = 100 * kMiB) const {
    return {.amount = amount, .urgency = urgency, .volume = volume_.path()};
  }
  [[nodiscard]] std::array<std::uint64_t, 4> offered(const Cache& cache) const {
    return cache.offer(volume_.path(), CancelToken()).bytes;
  }
  Volume volume_{"ext4"};
};

TEST_F(DirectoryCacheTest, FilesOfAllDirectoriesThatMatchGoByAge) {
  writeFile(volume_ / "p1/cache/old", kMiB, 40);
  writeFile(volume_ / "p2/cache/young", kMiB, 2);
  writeFile(volume_ / "p2/other/old", kMiB, 40);
  volume_.settle();
  const auto cache = makeCache(ruleFrom(directory(volume_ / "p*/cache")), nullptr);
  EXPECT_THAT(offered(*cache), ElementsAre(kMiB, kMiB, 2 * kMiB, 2 * kMiB));
  EXPECT_THAT(freeAsForetold(*cache, request(1)).what, ElementsAre(volume_ / "p1/cache/old"));
  EXPECT_THAT(freeAsForetold(*cache, request(3)).what, ElementsAre(volume_ / "p2/cache/young"));
  EXPECT_TRUE(exists(volume_ / "p2/other/old"));
}

TEST_F(DirectoryCacheTest, ADirectoryWithTheMarkerIsLeftAlone) {
  writeFile(volume_ / "p1/old", kMiB, 400);
  writeFile(volume_ / "p2/old", kMiB, 400);
  writeFile(volume_ / "p1" + "/" + kOptOutMarker, 0);
  volume_.settle();
  for (const char* whole : {"<false/>", "<true/>"}) {
    const auto cache = makeCache(
        ruleFrom(directory(volume_ / "p*", std::string("<key>WHOLE_DIRECTORIES</key>") + whole)),
        nullptr);
    EXPECT_THAT(offered(*cache), ElementsAre(kMiB, kMiB, kMiB, kMiB));
    EXPECT_EQ(freeAsForetold(*cache, request(4)).result.bytes, kMiB);
    EXPECT_TRUE(exists(volume_ / "p1/old"));
    EXPECT_FALSE(exists(volume_ / "p2/old"));
    writeFile(volume_ / "p2/old", kMiB, 400);
    volume_.settle();
  }
}

TEST_F(DirectoryCacheTest, NothingGoesWhileAnotherHoldsTheOwnersLock) {
  writeFile(volume_ / "cache/old", kMiB, 400);
  writeFile(volume_ / "lock", 1);
  volume_.settle();
  struct Case {
    const char* key;
    std::function<bool(int)> hold;
  };
  const Case cases[] = {{"FLOCK", [](int fd) { return ::flock(fd, LOCK_EX) == 0; }},
                        {"RECORD", [](int fd) {
                           struct flock whole {};
                           whole.l_type = F_WRLCK;
                           return ::fcntl(fd, F_SETLK, &whole) == 0;
                         }}};
  for (const auto& [key, hold] : cases) {
    const auto cache = makeCache(
        ruleFrom(directory(volume_ / "cache") + "<key>OWNERS_LOCKS</key><array><dict><key>" + key +
                 "</key><string>" + (volume_ / "lock") + "</string></dict></array>"),
        nullptr);
    const cachedir::Holder holder(
        [&, &how = hold] { return how(::open((volume_ / "lock").c_str(), O_RDWR)); });
    const Went went = freeAsForetold(*cache, request(4));
    EXPECT_EQ(went.result.bytes, 0U);
    EXPECT_EQ(went.result.note, (volume_ / "lock") + " is locked");
    EXPECT_THAT(offered(*cache), ElementsAre(0, 0, 0, 0));
  }
  EXPECT_TRUE(exists(volume_ / "cache/old"));
}

TEST_F(DirectoryCacheTest, TheOwnersLockIsHeldAsTheOwnerHoldsIt) {
  writeFile(volume_ / "lock", 1);
  HeldLocks locks;
  EXPECT_EQ(locks.take({{OwnersLock::Kind::kRecord, volume_ / "lock"},
                        {OwnersLock::Kind::kRecord, volume_ / "not-there"}}),
            "");
  EXPECT_TRUE(isLocked(volume_ / "lock"));
  HeldLocks others;
  EXPECT_EQ(others.take({{OwnersLock::Kind::kRecord, volume_ / "lock"}}),
            (volume_ / "lock") + " is locked");
  EXPECT_FALSE(exists(volume_ / "not-there"));
}

class WholeDirectories : public DirectoryCacheTest {
 protected:
  void SetUp() override {
    writeFile(volume_ / "all/oldest/deep/f", kMiB, 300);
    writeFile(volume_ / "all/oldest/g", kMiB, 250);
    writeFile(volume_ / "all/older/f", kMiB, 220);
    writeFile(volume_ / "all/mixed/old", kMiB, 300);
    writeFile(volume_ / "all/mixed/young", kMiB, 2);
    volume_.settle();
  }
  [[nodiscard]] std::unique_ptr<Cache> cache(const std::string& more = "") const {
    return makeCache(
        ruleFrom(directory(volume_ / "all/*", "<key>WHOLE_DIRECTORIES</key><true/>" + more)),
        nullptr);
  }
};

TEST_F(WholeDirectories, ADirectoryIsAsYoungAsItsYoungestFileAndTheOldestGoesFirst) {
  const auto all = cache();
  EXPECT_THAT(offered(*all), ElementsAre(3 * kMiB, 3 * kMiB, 5 * kMiB, 5 * kMiB));
  EXPECT_THAT(freeAsForetold(*all, request(2, 1)).what, ElementsAre(volume_ / "all/oldest/"));
  EXPECT_FALSE(exists(volume_ / "all/oldest"));
  EXPECT_THAT(freeAsForetold(*all, request(2)).what, ElementsAre(volume_ / "all/older/"));
  EXPECT_TRUE(exists(volume_ / "all/mixed/old"));
  EXPECT_THAT(freeAsForetold(*all, request(3)).what, ElementsAre(volume_ / "all/mixed/"));
  EXPECT_TRUE(exists(volume_ / "all"));
}

TEST_F(WholeDirectories, NothingGoesForNothingOrAtNoUrgency) {
  for (const Request& none : {request(0), request(5), request(-1), request(4, 0)}) {
    EXPECT_EQ(freeFrom(*cache(), none).result.bytes, 0U);
  }
  EXPECT_TRUE(exists(volume_ / "all/oldest/g"));
}

TEST_F(WholeDirectories, OneFileInUseKeepsAllOfIt) {
  const cachedir::Holder holder(
      [this] { return ::open((volume_ / "all/oldest/g").c_str(), O_RDONLY) >= 0; });
  EXPECT_THAT(offered(*cache()), ElementsAre(kMiB, kMiB, 3 * kMiB, 3 * kMiB));
  EXPECT_THAT(freeAsForetold(*cache(), request(2)).what, ElementsAre(volume_ / "all/older/"));
  EXPECT_TRUE(exists(volume_ / "all/oldest/deep/f"));
}

TEST_F(WholeDirectories, OneLockedFileKeepsAllOfItUnderItsName) {
  const cachedir::Holder holder([this] {
    return ::flock(::open((volume_ / "all/older/f").c_str(), O_RDONLY), LOCK_SH) == 0;
  });
  EXPECT_THAT(freeAsForetold(*cache(), request(2)).what, ElementsAre(volume_ / "all/oldest/"));
  EXPECT_TRUE(exists(volume_ / "all/older/f"));
}

TEST_F(WholeDirectories, NamesThatKeepNamesAreLeft) {
  const auto kept = cache("<key>KEEP</key>" + arrayOf({"old*"}));
  EXPECT_THAT(offered(*kept), ElementsAre(0, 0, 2 * kMiB, 2 * kMiB));
  EXPECT_EQ(freeAsForetold(*kept, request(4)).result.bytes, 2 * kMiB);
  EXPECT_TRUE(exists(volume_ / "all/oldest/g"));
}

TEST_F(WholeDirectories, WhatIsReadOnlyOrALinkOrEmptyGoesWithIt) {
  writeFile(volume_ / "outside/f", kMiB, 300);
  cachedir::run("ln -s ../../outside " + (volume_ / "all/oldest/link"));
  cachedir::run("mkdir -p " + (volume_ / "all/oldest/empty/er"));
  cachedir::run("chmod -R a-w " + (volume_ / "all/oldest"));
  EXPECT_EQ(freeAsForetold(*cache(), request(1, 1)).result.bytes, 2 * kMiB);
  EXPECT_FALSE(exists(volume_ / "all/oldest"));
  EXPECT_TRUE(exists(volume_ / "outside/f"));
}

TEST_F(WholeDirectories, WhatIsMountedInsideKeepsIt) {
  cachedir::run("mkdir " + (volume_ / "all/oldest/mount") + " && mount -t tmpfs none " +
                (volume_ / "all/oldest/mount"));
  writeFile(volume_ / "all/oldest/mount/f", kMiB, 300);
  EXPECT_THAT(freeAsForetold(*cache(), request(1)).what, ElementsAre(volume_ / "all/older/"));
  EXPECT_TRUE(exists(volume_ / "all/oldest/mount/f"));
  cachedir::run("umount " + (volume_ / "all/oldest/mount"));
}

TEST_F(WholeDirectories, OneWhereAProgramWaitsAtASocketOrAPipeIsKept) {
  cachedir::run("mkfifo " + (volume_ / "all/oldest/deep/pipe"));
  cachedir::run("python3 -c \"import socket; socket.socket(socket.AF_UNIX).bind('" +
                (volume_ / "all/older/socket") + "')\"");
  EXPECT_THAT(offered(*cache()), ElementsAre(0, 0, 2 * kMiB, 2 * kMiB));
  EXPECT_EQ(freeAsForetold(*cache(), request(2)).result.bytes, 0U);
  EXPECT_TRUE(exists(volume_ / "all/older/f"));
}

TEST_F(WholeDirectories, OneInWhichAProcessStandsIsKept) {
  const cachedir::Holder holder(
      [this] { return ::chdir((volume_ / "all/oldest/deep").c_str()) == 0; });
  EXPECT_THAT(freeAsForetold(*cache(), request(2)).what, ElementsAre(volume_ / "all/older/"));
  EXPECT_TRUE(exists(volume_ / "all/oldest/g"));
}

TEST_F(WholeDirectories, ASubvolumeInsideKeepsAllOfIt) {
  const Volume volume("btrfs");
  writeFile(volume / "all/one/f", kMiB, 300);
  cachedir::run("btrfs subvolume create " + (volume / "all/one/inner"));
  writeFile(volume / "all/one/inner/f", kMiB, 300);
  writeFile(volume / "all/two/f", kMiB, 300);
  volume.settle();
  const auto all = makeCache(
      ruleFrom(directory(volume / "all/*", "<key>WHOLE_DIRECTORIES</key><true/>")), nullptr);
  Request on = request(4);
  on.volume = volume.path();
  EXPECT_THAT(freeAsForetold(*all, on).what, ElementsAre(volume / "all/two/"));
  EXPECT_TRUE(exists(volume / "all/one/f"));
  EXPECT_TRUE(exists(volume / "all/one/inner/f"));
}

TEST_F(WholeDirectories, WhatACrashLeftIsFinishedFirstAndCounts) {
  const std::string left = volume_ / ("all/" + std::string(kGoingPrefix) + "gone");
  writeFile(left + "/f", kMiB, 1);
  volume_.settle();
  const Went went{cache()->free(request(1, kMiB), CancelToken(), {}), {}, 0};
  EXPECT_EQ(went.result.bytes, kMiB);
  EXPECT_FALSE(exists(left));
  EXPECT_TRUE(exists(volume_ / "all/oldest")) << "the rest of the last one was enough";
}

TEST_F(WholeDirectories, AFileThatIsLinkedElsewhereGivesNothingAndGoes) {
  ASSERT_EQ(::link((volume_ / "all/older/f").c_str(), (volume_ / "elsewhere").c_str()), 0);
  writeFile(volume_ / "all/older/g", kMiB, 220);
  volume_.settle();
  EXPECT_EQ(freeAsForetold(*cache(), request(1)).result.bytes, 3 * kMiB);
  EXPECT_FALSE(exists(volume_ / "all/older"));
  EXPECT_TRUE(exists(volume_ / "elsewhere"));
}

}  // namespace
}  // namespace spacekeep::command
