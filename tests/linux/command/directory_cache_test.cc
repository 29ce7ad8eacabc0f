// Caches of plain files under conditions, and directories that go as a whole.
#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sched.h>
#include <sys/file.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <unistd.h>

#include <fstream>

#include "services/cachedir/engine/link_groups.h"
#include "services/command/engine/in_use.h"
#include "services/command/engine/opt_out.h"
#include "tests/linux/command/directory_world.h"

namespace spacekeep::command {
namespace {

using testing::AllOf;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::StartsWith;
using testing::UnorderedElementsAre;

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

TEST_F(DirectoryCacheTest, ADirectoryThatTwoPathsStandForIsLeftAloneAndTold) {
  writeFile(volume_ / "p1/keep.db", kMiB, 400);
  writeFile(volume_ / "p2/deep/keep.db", kMiB, 400);
  writeFile(volume_ / "p3/old", kMiB, 400);
  volume_.settle();
  const auto entry = [this](const std::string& path, const std::string& more) {
    return "<dict><key>PATH</key><string>" + (volume_ / path) + "</string>" + more + "</dict>";
  };
  const std::string keep = "<key>KEEP</key>" + arrayOf({"*.db"});
  for (const char* whole : {"<false/>", "<true/>"}) {
    const auto cache =
        makeCache(ruleFrom("<key>DIRECTORIES</key><array>" +
                           entry("p*", std::string("<key>WHOLE_DIRECTORIES</key>") + whole) +
                           entry("p1", keep) + entry("p2/deep", keep) + "</array>"),
                  nullptr);
    EXPECT_THAT(offered(*cache), ElementsAre(kMiB, kMiB, kMiB, kMiB));
    const Went went = freeAsForetold(*cache, request(4));
    EXPECT_EQ(went.result.bytes, kMiB);
    EXPECT_THAT(
        went.result.problems,
        UnorderedElementsAre(AllOf(StartsWith((volume_ / "p1") + ": left alone, and 1 more"),
                                   HasSubstr((volume_ / "p*") + "\"")),
                             StartsWith((volume_ / "p1") + ": left alone: it overlaps "),
                             StartsWith((volume_ / "p2/deep") + ": left alone: it overlaps ")));
    EXPECT_TRUE(exists(volume_ / "p1/keep.db"));
    EXPECT_TRUE(exists(volume_ / "p2/deep/keep.db"));
    EXPECT_FALSE(exists(volume_ / "p3/old"));
    writeFile(volume_ / "p3/old", kMiB, 400);
    volume_.settle();
  }
}

TEST_F(DirectoryCacheTest, AWholeDirectoryThatIsKeptMayHaveAnEntryOfItsOwn) {
  writeFile(volume_ / "p1/old", kMiB, 400);
  writeFile(volume_ / "p2/old", kMiB, 400);
  volume_.settle();
  const auto cache = makeCache(
      ruleFrom("<key>DIRECTORIES</key><array><dict><key>PATH</key><string>" + (volume_ / "p*") +
               "</string><key>WHOLE_DIRECTORIES</key><true/><key>KEEP</key>" + arrayOf({"p1"}) +
               "</dict><dict><key>PATH</key><string>" + (volume_ / "p1") +
               "</string></dict></array>"),
      nullptr);
  const Went went = freeAsForetold(*cache, request(4));
  EXPECT_THAT(went.what, ElementsAre(volume_ / "p1/old", volume_ / "p2/"));
  EXPECT_THAT(went.result.problems, IsEmpty());
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

TEST_F(DirectoryCacheTest, WhatItsOwnerBeginsWhileFilesGoKeepsTheOthers) {
  for (const char* name : {"a/1", "a/2", "whole/w1/f"}) writeFile(volume_ / name, kMiB, 400);
  setAge(volume_ / "a/1", 500);
  volume_.settle();
  const std::string pid_file = volume_ / "pid";
  const CacheOfDirectories cache(
      ruleFrom("<key>DIRECTORIES</key><array><dict><key>PATH</key><string>" + (volume_ / "a") +
               "</string></dict><dict><key>PATH</key><string>" + (volume_ / "whole/*") +
               "</string><key>WHOLE_DIRECTORIES</key><true/></dict></array>"
               "<key>NOT_WHILE</key><array><dict><key>PID_FILE</key><string>" +
               pid_file + "</string></dict></array>"),
      0);
  const auto begin = [&pid_file](const std::string&, std::optional<std::uint64_t>) {
    std::ofstream(pid_file) << ::getpid();
  };
  const Result result = cache.free(request(4), CancelToken(), begin);
  EXPECT_EQ(result.bytes, kMiB);
  EXPECT_EQ(result.note, "the process of " + pid_file + " is running");
  EXPECT_FALSE(exists(volume_ / "a/1"));
  EXPECT_TRUE(exists(volume_ / "a/2"));
  EXPECT_TRUE(exists(volume_ / "whole/w1/f"));
}

TEST_F(DirectoryCacheTest, WhatItsOwnerBeginsWhileWholeDirectoriesGoKeepsTheOthers) {
  writeFile(volume_ / "whole/w1/f", kMiB, 500);
  writeFile(volume_ / "whole/w2/f", kMiB, 400);
  volume_.settle();
  const std::string pid_file = volume_ / "pid";
  const CacheOfDirectories cache(
      ruleFrom(directory(volume_ / "whole/*", "<key>WHOLE_DIRECTORIES</key><true/>") +
               "<key>NOT_WHILE</key><array><dict><key>PID_FILE</key><string>" + pid_file +
               "</string></dict></array>"),
      0);
  const auto begin = [&pid_file](const std::string&, std::optional<std::uint64_t>) {
    std::ofstream(pid_file) << ::getpid();
  };
  const Result result = cache.free(request(4), CancelToken(), begin);
  EXPECT_EQ(result.bytes, kMiB);
  EXPECT_EQ(result.note, "the process of " + pid_file + " is running");
  EXPECT_FALSE(exists(volume_ / "whole/w1"));
  EXPECT_TRUE(exists(volume_ / "whole/w2/f"));
}

TEST_F(DirectoryCacheTest, ConditionsAreAskedAgainNowAndThenAndOnceOneHasHeldItCounts) {
  const std::string pid_file = volume_ / "pid";
  const std::vector<Condition> conditions{
      {.kind = Condition::Kind::kPidFile, .subject = pid_file, .idle = {}}};
  ConditionWatch eager(conditions, 0);
  ConditionWatch slow(conditions, 3600 * ConditionWatch::kEveryNs);
  EXPECT_FALSE(eager.holds());
  std::ofstream(pid_file) << ::getpid();
  EXPECT_FALSE(slow.holds());
  EXPECT_TRUE(eager.holds());
  std::ofstream(pid_file) << "";
  EXPECT_TRUE(eager.holds());
  EXPECT_EQ(eager.why(), "the process of " + pid_file + " is running");
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

TEST_F(WholeDirectories, OneOfWhichAProcessHasADirectoryOpenIsKept) {
  for (const int flags : {O_RDONLY, O_PATH}) {
    const cachedir::Holder holder([this, flags] {
      return ::open((volume_ / "all/oldest/deep").c_str(), flags | O_DIRECTORY) >= 0;
    });
    EXPECT_THAT(offered(*cache()), ElementsAre(kMiB, kMiB, 3 * kMiB, 3 * kMiB));
    Request request = this->request(2);
    request.dry_run = true;
    EXPECT_THAT(freeFrom(*cache(), request).what, ElementsAre(volume_ / "all/older/"));
  }
}

TEST_F(WholeDirectories, OneThatAProcessKnowsByAnotherPathOrTakesForTheRootIsKept) {
  const std::string elsewhere = temporaryDirectory();
  const std::string oldest = volume_ / "all/oldest";
  const cachedir::Holder stands_in_it([&] {
    return ::unshare(CLONE_NEWNS) == 0 &&
           ::mount(oldest.c_str(), elsewhere.c_str(), nullptr, MS_BIND, nullptr) == 0 &&
           ::chdir(elsewhere.c_str()) == 0;
  });
  const cachedir::Holder takes_it_for_the_root(
      [this] { return ::chroot((volume_ / "all/older").c_str()) == 0; });
  EXPECT_EQ(freeAsForetold(*cache(), request(2)).result.bytes, 0U);
  EXPECT_TRUE(exists(volume_ / "all/oldest/g"));
  EXPECT_TRUE(exists(volume_ / "all/older/f"));
}

TEST_F(WholeDirectories, OneThatGetsAFileWhileAnotherGoesIsKeptAtAnyUrgency) {
  EXPECT_THAT(goneWhile(4, [this] { writeFile(volume_ / "all/older/new", 4096, 0); }),
              ElementsAre(volume_ / "all/oldest/", volume_ / "all/mixed/"));
  EXPECT_TRUE(exists(volume_ / "all/older/f"));
  EXPECT_TRUE(exists(volume_ / "all/older/new"));
}

TEST_F(WholeDirectories, OneInWhichAProgramBeginsToWaitWhileAnotherGoesIsKept) {
  EXPECT_THAT(goneWhile(2, [this] { cachedir::run("mkfifo " + (volume_ / "all/older/pipe")); }),
              ElementsAre(volume_ / "all/oldest/"));
  EXPECT_TRUE(exists(volume_ / "all/older/f"));
}

TEST_F(WholeDirectories, OneThatAProcessEntersWhileAnotherGoesIsKept) {
  std::optional<cachedir::Holder> holder;
  const auto enter = [this] { return ::chdir((volume_ / "all/older").c_str()) == 0; };
  EXPECT_THAT(goneWhile(2, [&] { holder.emplace(enter); }), ElementsAre(volume_ / "all/oldest/"));
  EXPECT_TRUE(exists(volume_ / "all/older/f"));
}

TEST_F(WholeDirectories, OneThatAProcessOpensWhileAnotherGoesIsKept) {
  std::optional<cachedir::Holder> holder;
  const auto open = [this] { return ::open((volume_ / "all/older").c_str(), O_DIRECTORY) >= 0; };
  EXPECT_THAT(goneWhile(2, [&] { holder.emplace(open); }), ElementsAre(volume_ / "all/oldest/"));
  EXPECT_TRUE(exists(volume_ / "all/older/f"));
}

TEST_F(WholeDirectories, OneOfWhichALinkedFileIsOpenedElsewhereWhileAnotherGoesIsKept) {
  ASSERT_EQ(::link((volume_ / "all/older/f").c_str(), (volume_ / "elsewhere").c_str()), 0);
  writeFile(volume_ / "all/older/g", kMiB, 220);
  std::optional<cachedir::Holder> holder;
  const auto open = [this] { return ::open((volume_ / "elsewhere").c_str(), O_RDONLY) >= 0; };
  EXPECT_THAT(goneWhile(2, [&] { holder.emplace(open); }), ElementsAre(volume_ / "all/oldest/"));
  EXPECT_TRUE(exists(volume_ / "all/older/f"));
}

TEST_F(WholeDirectories, OneOfWhichAFileWithMoreNamesThanAreFollowedIsOpenedMeanwhileIsKept) {
  writeFile(volume_ / "all/older/g", kMiB, 220);
  const std::string file = volume_ / "all/older/f";
  for (std::uint64_t i = 0; i < cachedir::kMaxLinksOfAFile; ++i) {
    ASSERT_EQ(::link(file.c_str(), (file + std::to_string(i)).c_str()), 0);
  }
  std::optional<cachedir::Holder> holder;
  const auto open = [&file] { return ::open(file.c_str(), O_RDONLY) >= 0; };
  EXPECT_THAT(goneWhile(2, [&] { holder.emplace(open); }), ElementsAre(volume_ / "all/oldest/"));
  EXPECT_TRUE(exists(file));
}

TEST_F(WholeDirectories, OneInWhichSomethingIsMountedWhileAnotherGoesIsKept) {
  const std::string place = volume_ / "all/older/mount";
  EXPECT_THAT(
      goneWhile(2,
                [&place] { cachedir::run("mkdir " + place + " && mount -t tmpfs none " + place); }),
      ElementsAre(volume_ / "all/oldest/"));
  EXPECT_TRUE(exists(volume_ / "all/older/f"));
  cachedir::run("umount " + place);
}

TEST_F(WholeDirectories, WhatAnotherTookMeanwhileIsNotClaimed) {
  const std::string going = leftOf("oldest", kHalfPrefix) + "/g";
  const CancelToken another_takes_a_file([&going] {
    static_cast<void>(::unlink(going.c_str()));
    return false;
  });
  EXPECT_EQ(cache()->free(request(1, 1), another_takes_a_file, {}).bytes, kMiB);
  EXPECT_FALSE(exists(volume_ / "all/oldest"));
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
