// Caches that their owner's tool cleans: here a shell script that removes files by name.
#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/file.h>
#include <sys/wait.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>

#include "services/command/engine/file_age.h"
#include "services/command/engine/in_use.h"
#include "services/command/engine/measure.h"
#include "support/runtime/runtime.h"
#include "tests/linux/command/command_world.h"

namespace spacekeep::command {
namespace {

using testing::ElementsAre;
using testing::HasSubstr;

class ToolCacheTest : public testing::Test {
 protected:
  void SetUp() override {
    writeFile(cache_ + "/old1", kMiB, 50);
    writeFile(cache_ + "/old2", kMiB, 50);
    writeFile(cache_ + "/new1", kMiB, 5);
    writeFile(cache_ + "/new2", 2 * kMiB, 5);
  }
  /// `tool old` and, at urgency 3, `tool ''`: removes the files whose names begin so.
  [[nodiscard]] std::string rule(const std::string& tool, const std::string& more = "") const {
    const auto step = [&](const char* urgency, const char* prefix, const char* days) {
      return std::string("<key>") + urgency + "</key><dict><key>COMMAND</key>" +
             arrayOf({tool, cache_, prefix}) +
             "<key>AMOUNT</key><dict><key>OLDER_THAN_DAYS</key><integer>" + days +
             "</integer></dict></dict>";
    };
    return "<key>MEASURE</key>" + arrayOf({cache_}) + "<key>CLEAN</key><dict>" +
           step("1", "old", "30") + step("3", "o", "30") + step("4", "/", "0") + "</dict>" + more;
  }
  [[nodiscard]] std::unique_ptr<Cache> cache(const std::string& tool,
                                             const std::string& more = "") const {
    return makeCache(ruleFrom(rule(tool, more)), nullptr);
  }
  [[nodiscard]] Request request(int urgency, std::uint64_t amount = 100 * kMiB) const {
    return {.amount = amount, .urgency = urgency, .volume = volume_.path()};
  }

  Volume volume_{"tmpfs"};
  const std::string cache_ = volume_ / "cache";
  // A prefix of "/" means all: an empty word would be no word.
  const std::string tool_ =
      shellTool("[ \"$2\" = / ] && set -- \"$1\" ''; rm -f \"$1/$2\"*; echo 9999");
};

TEST_F(ToolCacheTest, EachUrgencyTakesWhatItsCommandTakesAndTheDryRunForetellsIt) {
  const auto all = cache(tool_);
  const Offer offer = all->offer(volume_.path(), CancelToken());
  EXPECT_THAT(offer.bytes, ElementsAre(2 * kMiB, 2 * kMiB, 2 * kMiB, 5 * kMiB));
  EXPECT_THAT(offer.unknown, ElementsAre(false, false, false, false));
  const Went mild = freeAsForetold(*all, request(2));
  EXPECT_EQ(mild.result.bytes, 2 * kMiB);
  EXPECT_THAT(mild.what, ElementsAre(tool_ + " " + cache_ + " old"));
  EXPECT_TRUE(exists(cache_ + "/new1"));
  const std::uint64_t before = volume_.freeBytes();
  const Went hard = freeAsForetold(*all, request(4));
  EXPECT_EQ(hard.result.bytes, 3 * kMiB);
  EXPECT_EQ(volume_.freeBytes() - before, 3 * kMiB);
  EXPECT_FALSE(exists(cache_ + "/new1"));
}

TEST_F(ToolCacheTest, WhatTwoPathsStandForIsNotCountedTwiceAndTold) {
  const std::string all = shellTool("rm -r " + volume_.path() + "/*/deep");
  writeFile(volume_ / "other/deep/file", kMiB);
  writeFile(cache_ + "/deep/file", kMiB);
  const auto cache =
      makeCache(ruleFrom("<key>MEASURE</key>" + arrayOf({volume_ / "*", cache_ + "/deep"}) +
                         "<key>CLEAN</key><dict><key>1</key><dict><key>COMMAND</key>" +
                         arrayOf({all}) + "</dict></dict>"),
                nullptr);
  const Went went = freeFrom(*cache, request(1));
  EXPECT_EQ(went.result.bytes, kMiB) << "of the other";
  EXPECT_EQ(went.result.problems.size(), 2U);
}

TEST_F(ToolCacheTest, TheMildestCommandThatSufficesIsTheLast) {
  const Went went = freeAsForetold(*cache(tool_), request(4, kMiB));
  EXPECT_EQ(went.result.bytes, 2 * kMiB);
  EXPECT_TRUE(exists(cache_ + "/new2"));
}

TEST_F(ToolCacheTest, NothingIsDoneForNothingOrAtNoUrgencyOrOnAnotherVolume) {
  const auto all = cache(tool_);
  const Volume other("tmpfs");
  EXPECT_EQ(freeFrom(*all, request(4, 0)).result.bytes, 0U);
  EXPECT_EQ(freeFrom(*all, request(0)).result.bytes, 0U);
  EXPECT_EQ(freeFrom(*all, request(5)).result.bytes, 0U);
  Request elsewhere = request(4);
  elsewhere.volume = other.path();
  EXPECT_EQ(freeFrom(*all, elsewhere).result.bytes, 0U);
  EXPECT_THAT(all->offer(other.path(), CancelToken()).bytes, ElementsAre(0, 0, 0, 0));
  EXPECT_TRUE(exists(cache_ + "/old1"));
}

/// On two file systems, where what statvfs shows does not bound what is claimed.
class ToolOnTwoVolumes : public ToolCacheTest {
 protected:
  void SetUp() override {
    ToolCacheTest::SetUp();
    writeFile(other_ / "cache/file", 4096);
  }
  [[nodiscard]] std::unique_ptr<Cache> cleanedBy(const std::string& body,
                                                 const std::string& measured) const {
    return makeCache(
        ruleFrom("<key>MEASURE</key>" + arrayOf({measured, other_ / "cache"}) +
                 "<key>CLEAN</key><dict><key>1</key><dict><key>COMMAND</key>" +
                 arrayOf({shellTool("cd " + volume_.path() + " && " + body)}) + "</dict></dict>"),
        nullptr);
  }
  static std::uint64_t freedOf(const Cache& cache) {
    return cache.free({.amount = 100 * kMiB, .urgency = 1}, CancelToken(), {}).bytes;
  }
  Volume other_{"tmpfs"};
};

TEST_F(ToolOnTwoVolumes, WhatAToolPutsInThePlaceOfTheOldIsNotFreed) {
  const auto in_place =
      cleanedBy("mkdir new && mv cache/new2 new && rm -r cache && mv new cache", cache_);
  EXPECT_EQ(freedOf(*in_place), 3 * kMiB);
  const auto by_another_name =
      cleanedBy("mkdir ca2 && cp cache/new2 ca2 && rm -r cache", volume_ / "ca*");
  EXPECT_EQ(freedOf(*by_another_name), 0U);
}

TEST_F(ToolOnTwoVolumes, WhatCannotBeCountedAnyMoreIsFreedOnlyIfTheVolumeShowsIt) {
  cachedir::run("chmod 777 " + volume_.path() + " && chown -R 65534 " + cache_);
  const auto hides = cleanedBy(
      "cd cache && mkdir hidden && mv new1 old1 hidden && chmod 0 hidden && rm old2", cache_);
  EXPECT_TRUE(cachedir::asNobody([&] { return freedOf(*hides) == kMiB; }));
}

TEST_F(ToolCacheTest, WhatTheToolClaimsCountsForNothing) {
  const std::string liar = shellTool("echo 'freed 99 GB'");
  EXPECT_EQ(freeFrom(*cache(liar), request(4)).result.bytes, 0U);
}

TEST_F(ToolCacheTest, BytesThatDoNotComeBackAreNotClaimed) {
  const int held = ::open((cache_ + "/new2").c_str(), O_RDONLY | O_CLOEXEC);
  ASSERT_GE(held, 0);
  EXPECT_EQ(cache(tool_)->free(request(4), CancelToken(), {}).bytes, 3 * kMiB);
  ::close(held);
}

TEST_F(ToolCacheTest, ANameOfAFileThatIsLinkedElsewhereGivesNothing) {
  ASSERT_EQ(::link((cache_ + "/new2").c_str(), (volume_ / "elsewhere").c_str()), 0);
  EXPECT_EQ(cache(tool_)->offer(volume_.path(), CancelToken()).bytes[3], 3 * kMiB);
  EXPECT_EQ(freeFrom(*cache(tool_), request(4)).result.bytes, 3 * kMiB);
}

TEST_F(ToolCacheTest, AToolThatIsNotThereIsNoProblemAndGivesNothing) {
  const auto none = cache("no-such-tool");
  const Offer offer = none->offer(volume_.path(), CancelToken());
  EXPECT_THAT(offer.bytes, ElementsAre(0, 0, 0, 0));
  EXPECT_EQ(offer.note, "no-such-tool is not installed");
  const Went went = freeFrom(*none, request(4));
  EXPECT_EQ(went.result.bytes, 0U);
  EXPECT_EQ(went.result.note, "no-such-tool is not installed");
  EXPECT_TRUE(went.result.problems.empty());
}

TEST_F(ToolCacheTest, AToolThatFailsIsToldAndWhatItFreedAllTheSameCounts) {
  const std::string failing = shellTool("rm \"$1/old1\"; echo 'no more' >&2; exit 3");
  const Went went = freeFrom(*cache(failing), request(1));
  EXPECT_EQ(went.result.bytes, kMiB);
  ASSERT_EQ(went.result.problems.size(), 1U);
  EXPECT_THAT(went.result.problems[0], HasSubstr(" ended with status 3: no more"));
}

TEST_F(ToolCacheTest, ACancelEndsTheToolAndWhatWentCounts) {
  const std::string slow = shellTool("rm \"$1/old1\"; sleep 1000; rm \"$1/old2\"");
  const CancelToken cancel([this] { return !exists(cache_ + "/old1"); });
  EXPECT_EQ(cache(slow)->free(request(4), cancel, {}).bytes, kMiB);
  EXPECT_TRUE(exists(cache_ + "/old2"));
}

TEST_F(ToolCacheTest, WhileItsOwnerRunsNothingIsTaken) {
  const std::string pid_file = volume_ / "pid";
  const std::string lock_file = volume_ / "lock";
  writeFile(lock_file, 1);
  std::ofstream(pid_file) << ::getpid() << "\n";
  const auto condition = [](const char* key, const std::string& subject) {
    return std::string("<key>NOT_WHILE</key><array><dict><key>") + key + "</key><string>" +
           subject + "</string></dict></array>";
  };
  const auto checkKept = [&](const std::string& more, const std::string& note) {
    const auto kept = cache(tool_, more);
    EXPECT_EQ(kept->offer(volume_.path(), CancelToken()).note, note);
    EXPECT_EQ(freeAsForetold(*kept, request(4)).result.note, note);
    EXPECT_TRUE(exists(cache_ + "/old1"));
  };
  checkKept(condition("PID_FILE", pid_file), "the process of " + pid_file + " is running");
  checkKept(condition("PROCESS", "test_linux_command"), "test_linux_command is running");
  {
    const cachedir::Holder holder(
        [&] { return ::flock(::open(lock_file.c_str(), O_RDWR), LOCK_EX) == 0; });
    checkKept(condition("LOCKED", lock_file), lock_file + " is locked");
  }
  std::ofstream(pid_file) << "not a number";
  const auto free = cache(tool_, condition("PID_FILE", pid_file));
  EXPECT_EQ(freeAsForetold(*free, request(4)).result.bytes, 5 * kMiB);
}

TEST_F(ToolCacheTest, WhatItsOwnerBeginsWhileACommandRunsKeepsTheNextOnesBack) {
  const std::string pid_file = temporaryDirectory() + "/pid";
  const std::string tool =
      shellTool("[ \"$2\" = / ] && set -- \"$1\" ''; rm -f \"$1/$2\"*; echo $PPID >" + pid_file);
  const auto kept = cache(tool, "<key>NOT_WHILE</key><array><dict><key>PID_FILE</key><string>" +
                                    pid_file + "</string></dict></array>");
  const Went went = freeFrom(*kept, request(4));
  EXPECT_EQ(went.result.bytes, 2 * kMiB);
  EXPECT_THAT(went.what, ElementsAre(tool + " " + cache_ + " old"));
  EXPECT_EQ(went.result.note, "the process of " + pid_file + " is running");
  EXPECT_TRUE(exists(cache_ + "/new1"));
}

TEST_F(ToolCacheTest, WhatItsOwnerBeginsWhileItIsCountedKeepsTheFirstCommandBack) {
  const std::string pid_file = volume_ / "pid";
  const auto kept = cache(tool_, "<key>NOT_WHILE</key><array><dict><key>PID_FILE</key><string>" +
                                     pid_file + "</string></dict></array>");
  const CancelToken while_counting([&pid_file] {
    std::ofstream(pid_file) << ::getpid();
    return false;
  });
  EXPECT_EQ(kept->free(request(4), while_counting, {}).bytes, 0U);
  EXPECT_TRUE(exists(cache_ + "/old1"));
}

/// A shell that goes by another name than its executable, as rootless podman's does.
TEST_F(ToolCacheTest, AProcessThatOnlyWaitsUnderANameOfItsOwnDoesNotKeepTheCache) {
  const std::string tool = volume_ / "busy-tool";
  std::filesystem::copy_file("/bin/sh", tool);
  int to_it[2];
  int from_it[2];
  ASSERT_EQ(::pipe(to_it), 0);
  ASSERT_EQ(::pipe(from_it), 0);
  const pid_t child = ::fork();
  if (child == 0) {
    ::dup2(to_it[0], 0);
    ::dup2(from_it[1], 1);
    for (const int fd : {to_it[0], to_it[1], from_it[0], from_it[1]}) ::close(fd);
    ::execl(tool.c_str(), tool.c_str(), "-c",
            "echo 'busy-tool wait' >/proc/$$/comm; echo; read end", nullptr);
    ::_exit(1);
  }
  ::close(to_it[0]);
  ::close(from_it[1]);
  char ready = 0;
  ASSERT_EQ(::read(from_it[0], &ready, 1), 1);
  const std::string runs =
      "<key>NOT_WHILE</key><array><dict><key>PROCESS</key><string>busy-tool</string></dict>"
      "</array>";
  EXPECT_EQ(freeAsForetold(*cache(tool_, runs), request(4)).result.note, "busy-tool is running");
  const std::string other = "<key>IDLE_PROCESSES</key>" + arrayOf({"busy-tool"});
  EXPECT_EQ(freeAsForetold(*cache(tool_, runs + other), request(4)).result.bytes, 0U);
  const std::string idle = "<key>IDLE_PROCESSES</key>" + arrayOf({"busy-tool wait"});
  EXPECT_EQ(freeAsForetold(*cache(tool_, runs + idle), request(4)).result.bytes, 5 * kMiB);
  ::close(to_it[1]);
  ::close(from_it[0]);
  ::waitpid(child, nullptr, 0);
}

TEST_F(ToolCacheTest, WhatTheToolsOwnDryRunTellsIsPromised) {
  const std::string lists =
      shellTool("[ \"$1\" = -n ] && exec printf 'would remove %s\\n' " + cache_ + "/old1 " +
                cache_ + "/sub /etc/passwd; rm -r " + cache_ + "/old1 " + cache_ + "/sub");
  writeFile(cache_ + "/sub/deep/file", kMiB);
  const auto listed = makeCache(
      ruleFrom("<key>MEASURE</key>" + arrayOf({cache_}) +
               "<key>CLEAN</key><dict><key>1</key><dict>"
               "<key>COMMAND</key>" +
               arrayOf({lists}) + "<key>AMOUNT</key><dict><key>COMMAND</key>" +
               arrayOf({lists, "-n"}) +
               "<key>AFTER</key><string>would remove </string><key>PATHS</key><true/></dict></dict>"
               "</dict>"),
      nullptr);
  EXPECT_EQ(listed->offer(volume_.path(), CancelToken()).bytes[0], 2 * kMiB);
  EXPECT_EQ(freeAsForetold(*listed, request(1)).result.bytes, 2 * kMiB);
}

TEST_F(ToolCacheTest, AnAmountThatIsNotPrintedIsToldAndNotGuessed) {
  const auto told =
      makeCache(ruleFrom("<key>MEASURE</key>" + arrayOf({cache_}) +
                         "<key>CLEAN</key><dict><key>1</key><dict>"
                         "<key>COMMAND</key>" +
                         arrayOf({tool_}) + "<key>AMOUNT</key><dict><key>COMMAND</key>" +
                         arrayOf({"echo", "space: lots"}) +
                         "<key>AFTER</key><string>space:</string></dict></dict></dict>"),
                nullptr);
  const Offer offer = told->offer(volume_.path(), CancelToken());
  EXPECT_EQ(offer.bytes[0], 0U);
  EXPECT_TRUE(offer.unknown[0]);
  EXPECT_THAT(offer.problems,
              ElementsAre("echo \"space: lots\" printed no amount where the rule looks for one"));
}

TEST_F(ToolCacheTest, APromiseIsNeverMoreThanTheDirectoriesHold) {
  const auto told =
      makeCache(ruleFrom("<key>MEASURE</key>" + arrayOf({cache_}) +
                         "<key>CLEAN</key><dict><key>1</key><dict>"
                         "<key>COMMAND</key>" +
                         arrayOf({tool_}) + "<key>AMOUNT</key><dict><key>COMMAND</key>" +
                         arrayOf({"echo", "1T"}) +
                         "<key>COLUMN</key><integer>1</integer></dict></dict></dict>"),
                nullptr);
  EXPECT_EQ(told->offer(volume_.path(), CancelToken()).bytes[3], 5 * kMiB);
}

TEST_F(ToolCacheTest, PlaceholdersStandForTheAmountAndForWhatMayStay) {
  const std::string notes = shellTool("echo \"$1 $2\" > " + (volume_ / "words"));
  const auto told =
      makeCache(ruleFrom("<key>MEASURE</key>" + arrayOf({cache_}) +
                         "<key>CLEAN</key><dict><key>1</key><dict>"
                         "<key>COMMAND</key>" +
                         arrayOf({notes, "{AMOUNT}", "--size={KEEP}"}) + "</dict></dict>"),
                nullptr);
  static_cast<void>(freeFrom(*told, request(1, 2 * kMiB)));
  std::ifstream stream(volume_ / "words");
  std::string words;
  std::getline(stream, words);
  EXPECT_EQ(words, "2097152 --size=3145728");
}

TEST_F(ToolCacheTest, WhileAnyFileInItIsOpenNothingIsTakenIfTheRuleSaysSo) {
  const auto kept = cache(tool_, "<key>NOT_WHILE</key><array><dict><key>OPEN</key><string>" +
                                     cache_ + "</string></dict></array>");
  {
    const cachedir::Holder holder(
        [this] { return ::open((cache_ + "/new1").c_str(), O_RDONLY) >= 0; });
    EXPECT_EQ(freeAsForetold(*kept, request(4)).result.note, "a file in " + cache_ + " is open");
  }
  // As a user, who does not depend on what root may see of the first process here.
  cachedir::run("chown -R 65534 " + cache_);
  EXPECT_TRUE(cachedir::asNobody(
      [&] { return freeAsForetold(*kept, request(4)).result.bytes == 5 * kMiB; }));
}

TEST(TrashTime, WhatWasThrownAwayIsAsOldAsItsRecordSays) {
  const std::string record = "[Trash Info]\nPath=/srv/a/b\nDeletionDate=2024-01-15T12:00:00\n";
  EXPECT_EQ(deletionTimeNs(record).value_or(0) / 1'000'000'000 / 86400, 19737);
  for (const char* bad : {"", "[Trash Info]\nPath=/x\n", "\nDeletionDate=yesterday\n",
                          "\nDeletionDate=2024-1-31T23:59:59\n", "\nDeletionDate=2024-01-31\n"}) {
    EXPECT_EQ(deletionTimeNs(bad), std::nullopt) << bad;
  }
  EXPECT_EQ(deletionTimeNs("\nDeletionDate=2300-01-31T23:59:59\n"), INT64_MAX);
  const std::string trash = temporaryDirectory();
  writeFile(trash + "/files/a/deep/file", 1);
  writeFile(trash + "/files/orphan", 1);
  cachedir::run("mkdir " + trash + "/info");
  std::ofstream(trash + "/info/a.trashinfo") << record;
  std::ofstream(trash + "/info/bad.trashinfo") << "nothing";
  const cachedir::UniqueFd fd(::open(trash.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  EXPECT_EQ(trashTimeNs(fd.get(), "files/a/deep/file"), deletionTimeNs(record));
  EXPECT_EQ(trashTimeNs(fd.get(), "info/a.trashinfo"), deletionTimeNs(record));
  EXPECT_EQ(trashTimeNs(fd.get(), "files/orphan"), INT64_MIN);
  EXPECT_EQ(trashTimeNs(fd.get(), "files/bad"), std::nullopt);
  EXPECT_EQ(trashTimeNs(fd.get(), "directorysizes"), std::nullopt);
}

TEST(JournalTime, ArchivedFilesAreAsOldAsTheirFirstEntryOrTheirLastWrite) {
  const std::string closed =
      "system@0123456789abcdef0123456789abcdef-00000000000003e8-"
      "000005f5e1000000.journal";
  EXPECT_EQ(journalTimeNs(closed, INT64_MAX), 0x000005f5e1000000LL * 1000);
  EXPECT_EQ(journalTimeNs(closed, 5), 5);
  EXPECT_EQ(journalTimeNs("user-1000@000005f5e1000000-0123456789abcdef.journal~", INT64_MAX),
            0x000005f5e1000000LL * 1000);
  for (const char* active : {"system.journal", "user-1000.journal", "system@x.journal",
                             "a@b-c.journal", "system@00000000000003e8-000005f5e1000000.log"}) {
    EXPECT_EQ(journalTimeNs(active, INT64_MAX), std::nullopt) << active;
  }
}

}  // namespace
}  // namespace spacekeep::command
