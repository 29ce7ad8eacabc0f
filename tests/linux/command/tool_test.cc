// Running other programs: what they get, and how they end.
#include "services/command/tool/tool.h"

#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <signal.h>
#include <unistd.h>

#include <fstream>

#include "services/cachedir/engine/elapsed.h"
#include "support/runtime/runtime.h"
#include "tests/linux/command/command_world.h"

namespace spacekeep::command {
namespace {

using testing::HasSubstr;

constexpr std::uint64_t kSecondNs = 1'000'000'000;

ToolRun play(const Words& words, std::uint64_t limit_ns = 20 * kSecondNs,
             const CancelToken& cancel = CancelToken()) {
  return runTool(words, environmentFor(nullptr), limit_ns, cancel);
}

/// Whether the process whose number stands in `file` has gone, given some time.
bool isGone(const std::string& file) {
  for (int i = 0; i < 2000; ++i) {
    std::ifstream stream(file);
    pid_t pid = 0;
    std::string state;
    if (stream >> pid) {
      std::ifstream stat("/proc/" + std::to_string(pid) + "/stat");
      std::string number, name;
      // One that nobody has waited for is gone as well.
      if (!(stat >> number >> name >> state) || state == "Z") return true;
    }
    rt::sleepNs(5'000'000);  // of a process that is nobody's child no event tells
  }
  return false;
}

TEST(Tool, WhatItPrintsAndItsStatusAreKeptApartFromItsComplaints) {
  const ToolRun run = play({shellTool("echo out; echo bad >&2; exit 7")});
  EXPECT_EQ(run.end, ToolEnd::kExited);
  EXPECT_EQ(run.status, 7);
  EXPECT_EQ(run.output, "out\n");
  EXPECT_EQ(run.complaint, "bad\n");
  EXPECT_FALSE(run.good());
}

TEST(Tool, AProgramThatIsNotInstalledIsAbsent) {
  EXPECT_EQ(play({"no-such-program-anywhere"}).end, ToolEnd::kAbsent);
  EXPECT_EQ(play({"/nowhere/at-all"}).end, ToolEnd::kAbsent);
  EXPECT_EQ(play({}).end, ToolEnd::kAbsent);
}

TEST(Tool, NamesAreLookedForInTheSystemsFoldersAndNotInPath) {
  EXPECT_EQ(whereIs("sh").substr(0, 5), "/usr/");
  const std::string folder = temporaryDirectory();
  std::ofstream(folder + "/only-here") << "#!/bin/sh\n";
  ::chmod((folder + "/only-here").c_str(), 0755);
  const char* before = ::getenv("PATH");
  const std::string saved = before == nullptr ? "" : before;
  ::setenv("PATH", folder.c_str(), 1);
  EXPECT_EQ(whereIs("only-here"), "");
  ::setenv("PATH", saved.c_str(), 1);
}

TEST(Tool, NothingOfTheEnvironmentIsInherited) {
  ::setenv("SPACEKEEP_TEST_SECRET", "1", 1);
  const ToolRun run = play({"env"});
  ::unsetenv("SPACEKEEP_TEST_SECRET");
  EXPECT_THAT(run.output, Not(HasSubstr("SECRET")));
  EXPECT_THAT(run.output, HasSubstr("LC_ALL=C.UTF-8\n"));
  EXPECT_THAT(run.output, HasSubstr("PATH=/usr/local/sbin:"));
}

TEST(Tool, AUsersToolIsToldHisFolders) {
  const UserFolders folders = homeAt(temporaryDirectory());
  const ToolRun run = runTool({"env"}, environmentFor(&folders), 20 * kSecondNs, CancelToken());
  EXPECT_THAT(run.output, HasSubstr("HOME=" + folders.home + "\n"));
  EXPECT_THAT(run.output, HasSubstr("XDG_CACHE_HOME=" + folders.home + "/.cache\n"));
  EXPECT_THAT(run.output, HasSubstr("USER=somebody\n"));
}

TEST(Tool, WordsReachItAsTheyAreBecauseNoShellLooksAtThem) {
  const ToolRun run = play({"echo", "$HOME", "`id`", "a;b", "*"});
  EXPECT_EQ(run.output, "$HOME `id` a;b *\n");
}

TEST(Tool, ItStandsInTheRootDirectoryReadsNothingAndHasNoOtherDescriptor) {
  const ToolRun run = play({shellTool("pwd; cat; ls /proc/$$/fd")});
  EXPECT_EQ(run.output.substr(0, 2), "/\n");
  // 10 is the script itself, which the shell reads.
  EXPECT_THAT(run.output, testing::AnyOf("/\n0\n1\n10\n2\n", "/\n0\n1\n2\n255\n"));
}

TEST(Tool, MoreOutputThanThereIsRoomForIsCutAndSaid) {
  const ToolRun run = play({shellTool("head -c 3000000 /dev/zero; head -c 9000 /dev/zero >&2")});
  EXPECT_TRUE(run.good());
  EXPECT_TRUE(run.cut);
  EXPECT_EQ(run.output.size(), kMaxOutputBytes);
  EXPECT_EQ(run.complaint.size(), kMaxComplaintBytes);
}

TEST(Tool, OfOutputThatNeverEndsOneTurnReadsAPartOnly) {
  cachedir::UniqueFd endless(::open("/dev/zero", O_RDONLY | O_CLOEXEC));
  std::size_t read = 0;
  readSome(endless, [&read](std::string_view part) { read += part.size(); });
  EXPECT_EQ(read, kMaxOutputBytes);
  EXPECT_TRUE(endless);
}

TEST(Tool, OneTurnReadsAllThatAPipeHolds) {
  int ends[2];
  ASSERT_EQ(::pipe2(ends, O_CLOEXEC | O_NONBLOCK), 0);
  cachedir::UniqueFd reading(ends[0]);
  cachedir::UniqueFd writing(ends[1]);
  ASSERT_GE(::fcntl(writing.get(), F_SETPIPE_SZ, kMaxOutputBytes), 0);
  const std::string all(kMaxOutputBytes, 'x');
  ASSERT_EQ(::write(writing.get(), all.data(), all.size()), static_cast<ssize_t>(all.size()));
  std::size_t read = 0;
  readSome(reading, [&read](std::string_view part) { read += part.size(); });
  EXPECT_EQ(read, kMaxOutputBytes);
  EXPECT_TRUE(reading);
  writing.reset();
  readSome(reading, [](std::string_view) { ADD_FAILURE(); });
  EXPECT_FALSE(reading) << "an end that is closed would be ready for ever";
}

TEST(Tool, OneThatWritesWithoutEndIsEndedInTime) {
  const std::uint64_t begin = rt::ticks();
  const ToolRun run = play({"yes"}, kSecondNs / 5);
  EXPECT_EQ(run.end, ToolEnd::kTimedOut);
  EXPECT_LT(cachedir::elapsedNs(begin), 10 * kSecondNs);
}

TEST(Tool, OneThatTakesTooLongIsEndedWithItsWholeGroup) {
  const std::string file = temporaryDirectory() + "/child";
  const std::uint64_t begin = rt::ticks();
  const ToolRun run = play({shellTool("sleep 1000 & echo $! > " + file + "; wait")}, kSecondNs / 5);
  EXPECT_EQ(run.end, ToolEnd::kTimedOut);
  EXPECT_LT(cachedir::elapsedNs(begin), 10 * kSecondNs);
  EXPECT_TRUE(isGone(file));
}

TEST(Tool, OneThatIgnoresTheWishToEndIsKilled) {
  const std::uint64_t begin = rt::ticks();
  const ToolRun run =
      play({shellTool("trap '' TERM; while :; do sleep 1000 & wait $!; done")}, kSecondNs / 5);
  EXPECT_EQ(run.end, ToolEnd::kTimedOut);
  EXPECT_GE(cachedir::elapsedNs(begin), kGraceNs);
  EXPECT_EQ(run.status, 128 + SIGKILL);
}

TEST(Tool, ACancelEndsIt) {
  const std::string file = temporaryDirectory() + "/started";
  const CancelToken cancel([&file] { return exists(file); });
  const ToolRun run =
      play({shellTool("echo x > " + file + "; sleep 1000")}, 60 * kSecondNs, cancel);
  EXPECT_EQ(run.end, ToolEnd::kCancelled);
}

TEST(Tool, WhatItLeavesRunningIsEndedWithIt) {
  const std::string file = temporaryDirectory() + "/child";
  const ToolRun run = play({shellTool("sleep 1000 & echo $! > " + file)});
  EXPECT_TRUE(run.good());
  EXPECT_TRUE(isGone(file));
}

TEST(Tool, SignalsThatThisProcessIgnoresEndItAsUsual) {
  const auto before = ::signal(SIGPIPE, SIG_IGN);
  const ToolRun run = play({shellTool("kill -PIPE $$; echo goes on")});
  ::signal(SIGPIPE, before);
  EXPECT_EQ(run.status, 128 + SIGPIPE);
  EXPECT_EQ(run.output, "");
}

TEST(Tool, AProblemIsOneLineThatNamesTheCommandAndItsLastWords) {
  const Words words{shellTool("echo first >&2; printf 'E: \\033no room\\n\\n' >&2; exit 100"),
                    "a b"};
  EXPECT_EQ(problemOf(words, play(words)),
            words.front() + " \"a b\" ended with status 100: E:  no room");
}

}  // namespace
}  // namespace spacekeep::command
