// Whether a cache's owner is at work, above all when that cannot be told.
#include "services/command/engine/in_use.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <fstream>

#include "tests/linux/command/command_world.h"

namespace spacekeep::command {
namespace {

using cachedir::asNobody;
using cachedir::run;
using Kind = Condition::Kind;

class AtWork : public testing::Test {
 protected:
  void SetUp() override {
    run("mkdir -p " + proc_ + "/self/ns " + proc_ + "/1/fd && touch " + proc_ + "/locks " + proc_ +
        "/1/maps");
    writeFile(cache_ + "/deep/file", 4096);
    run("touch " + lock_);
  }
  [[nodiscard]] std::string why(Kind kind, const std::string& subject) const {
    return whyNotNow({{.kind = kind, .subject = subject, .idle = {}}}, proc_);
  }
  [[nodiscard]] bool isWhyForNobody(Kind kind, const std::string& subject,
                                    const std::string& answer) const {
    return asNobody([&] { return why(kind, subject) == answer; });
  }
  [[nodiscard]] std::string unknown() const {
    return "nobody can tell whether a file in " + cache_ + " is open";
  }

  const std::string proc_ = temporaryDirectory();
  const std::string cache_ = temporaryDirectory();
  const std::string lock_ = temporaryDirectory() + "/lock";
};

TEST_F(AtWork, WithoutProcNobodyCanTell) {
  run("rm -r " + proc_);
  EXPECT_EQ(why(Kind::kOpen, cache_), unknown());
  EXPECT_EQ(why(Kind::kProcess, "x"), "nobody can tell whether x is running");
  EXPECT_EQ(why(Kind::kLocked, lock_), "nobody can tell whether " + lock_ + " is locked");
}

TEST_F(AtWork, ADirectoryThatIsNotThereOrEmptyIsNotInUse) {
  EXPECT_EQ(why(Kind::kOpen, cache_ + "/not-there"), "");
  EXPECT_EQ(why(Kind::kOpen, cache_ + "/no*"), "");
  EXPECT_EQ(why(Kind::kOpen, cache_), "");
}

TEST_F(AtWork, WhatCannotBeLookedIntoMayBeInUse) {
  EXPECT_TRUE(isWhyForNobody(Kind::kOpen, cache_, ""));
  run("chmod 0 " + cache_ + "/deep");
  EXPECT_TRUE(isWhyForNobody(Kind::kOpen, cache_, unknown()));
  run("chmod 0 " + cache_);
  EXPECT_TRUE(isWhyForNobody(Kind::kOpen, cache_, unknown()));
  run("chmod 755 " + cache_ + " " + cache_ + "/deep && mount -t tmpfs none " + cache_ + "/deep");
  EXPECT_TRUE(isWhyForNobody(Kind::kOpen, cache_, unknown()));
  run("umount " + cache_ + "/deep");
  const std::string link = temporaryDirectory() + "/link";
  run("ln -s " + cache_ + " " + link);
  EXPECT_EQ(why(Kind::kOpen, link), "nobody can tell whether a file in " + link + " is open");
}

TEST_F(AtWork, AHiddenProcessOfTheSameUserMayHaveAFileOpenAndOneOfOthersDoesNotCount) {
  run("chmod 0 " + proc_ + "/1/maps");
  EXPECT_TRUE(isWhyForNobody(Kind::kOpen, cache_, ""));
  run("chown 65534 " + proc_ + "/1");
  EXPECT_TRUE(isWhyForNobody(Kind::kOpen, cache_, unknown()));
}

TEST_F(AtWork, ALockFileThatCannotBeLookedAtMayBeLocked) {
  EXPECT_EQ(why(Kind::kLocked, lock_), "");
  EXPECT_EQ(why(Kind::kLocked, lock_ + "-not-there"), "");
  EXPECT_FALSE(isLocked(lock_, proc_));
  const std::string folder = lock_.substr(0, lock_.rfind('/'));
  run("chmod 0 " + folder);
  EXPECT_TRUE(
      isWhyForNobody(Kind::kLocked, lock_, "nobody can tell whether " + lock_ + " is locked"));
  run("chmod 755 " + folder + " && rm " + proc_ + "/locks");
  EXPECT_EQ(why(Kind::kLocked, lock_), "nobody can tell whether " + lock_ + " is locked");
  EXPECT_TRUE(isLocked(lock_, proc_));
}

TEST_F(AtWork, AProcessOfAnotherUserThatProcHidesLives) {
  const std::string pid_file = temporaryDirectory() + "/pid";
  std::ofstream(pid_file) << ::getpid() << "\n";
  EXPECT_TRUE(
      isWhyForNobody(Kind::kPidFile, pid_file, "the process of " + pid_file + " is running"));
  run("chmod 0 " + pid_file);
  EXPECT_TRUE(isWhyForNobody(Kind::kPidFile, pid_file,
                             "nobody can tell whether the process of " + pid_file + " is running"));
}

TEST_F(AtWork, AProcessThatHasEndedOrThatNoFileNamesDoesNot) {
  const pid_t child = ::fork();
  if (child == 0) ::_exit(0);
  ::waitpid(child, nullptr, 0);
  const std::string pid_file = temporaryDirectory() + "/pid";
  EXPECT_EQ(why(Kind::kPidFile, pid_file), "");
  for (const std::string& text : {std::to_string(child), std::string("-1"), std::string("0"),
                                  std::string(""), std::string("99999999999999")}) {
    std::ofstream(pid_file) << text;
    EXPECT_EQ(why(Kind::kPidFile, pid_file), "") << text;
  }
}

}  // namespace
}  // namespace spacekeep::command
