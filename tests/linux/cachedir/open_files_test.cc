// What /proc shows of the files that processes hold, and when it does not show all of it.
#include "services/cachedir/engine/open_files.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sched.h>
#include <sys/mman.h>
#include <sys/mount.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <thread>

#include "tests/linux/cachedir/cache_world.h"

namespace spacekeep::cachedir {
namespace {

class OpenFilesScan : public testing::Test {
 protected:
  void SetUp() override {
    writeFile(held_, 4096);
    writeFile(mapped_, 4096);
  }
  [[nodiscard]] bool holds(const std::string& path) const {
    const OpenedRoots opened = openRoots(rulesFor(cache_), {});
    OpenFiles files;
    struct stat facts {};
    EXPECT_EQ(::stat(path.c_str(), &facts), 0);
    EXPECT_TRUE(files.scan(opened.roots, {}));
    return files.holds(inodeOf(facts), opened.roots[0].file_system);
  }
  const std::string cache_ = temporaryDirectory();
  const std::string held_ = cache_ + "/held";
  const std::string mapped_ = cache_ + "/mapped";
};

TEST_F(OpenFilesScan, WithoutProcNobodyIsTakenForUnused) {
  OpenFiles files("/nowhere");
  EXPECT_FALSE(files.scan({}, {}));
}

TEST_F(OpenFilesScan, TheScanIsKeptForARequestThatFollowsClosely) {
  const OpenedRoots opened = openRoots(rulesFor(cache_), {});
  OpenFiles files;
  ASSERT_TRUE(files.ensure(opened.roots, 0, {}));
  const UniqueFd late(::open(held_.c_str(), O_RDONLY | O_CLOEXEC));
  struct stat facts {};
  ASSERT_EQ(::fstat(late.get(), &facts), 0);
  ASSERT_TRUE(files.ensure(opened.roots, UINT64_MAX, {}));
  EXPECT_FALSE(files.holds(inodeOf(facts), opened.roots[0].file_system));
  ASSERT_TRUE(files.ensure(opened.roots, 0, {}));
  EXPECT_TRUE(files.holds(inodeOf(facts), opened.roots[0].file_system));
}

bool isThere(int fd) {
  return ::access(("/proc/self/fd/" + std::to_string(fd)).c_str(), F_OK) == 0;
}

TEST_F(OpenFilesScan, WhatAProcessHoldsThatGoesOnWithoutItsMainThreadIsSeen) {
  test::OtherProcess process([this](int ready) {
    const int held = ::open(held_.c_str(), O_RDONLY);
    const int mapped = ::open(mapped_.c_str(), O_RDONLY);
    static_cast<void>(::mmap(nullptr, 4096, PROT_READ, MAP_PRIVATE, mapped, 0));
    ::close(mapped);
    std::thread([held, ready] {
      while (isThere(held)) ::sched_yield();
      test::tellReady(ready);
      for (;;) ::pause();
    }).detach();
    ::syscall(SYS_exit, 0);
  });
  EXPECT_TRUE(holds(held_));
  EXPECT_TRUE(holds(mapped_));
  process.end();
  EXPECT_FALSE(holds(held_));
}

TEST_F(OpenFilesScan, WhatAThreadHoldsAmongDescriptorsOfItsOwnIsSeen) {
  const Holder holder([this] {
    std::atomic<int> opened{0};
    std::thread([&opened, this] {
      opened = ::unshare(CLONE_FILES) == 0 && ::open(held_.c_str(), O_RDONLY) >= 0 ? 1 : -1;
      for (;;) ::pause();
    }).detach();
    while (opened == 0) ::sched_yield();
    return opened == 1;
  });
  EXPECT_TRUE(holds(held_));
}

TEST_F(OpenFilesScan, AFileIsSeenThatIsHeldByAPathTooLongToBeTold) {
  const Holder holder([this] {
    if (::chdir(cache_.c_str()) != 0) return false;
    const std::string name(200, 'd');
    for (int depth = 0; depth < 25; ++depth) {
      if (::mkdir(name.c_str(), 0700) != 0 || ::chdir(name.c_str()) != 0) return false;
    }
    if (::link(held_.c_str(), "held") != 0 || ::open("held", O_RDONLY) < 0) return false;
    return ::chdir("/") == 0;
  });
  EXPECT_TRUE(holds(held_));
}

/// A /proc of one process that holds one file, looked at by another user.
class HiddenProcesses : public testing::Test {
 protected:
  void SetUp() override {
    run("mkdir -p " + proc_ + "/self/ns " + one_ + "/fd " + own_thread_ + "/fd");
    run("ln -s 'pid:[4026531836]' " + proc_ + "/self/ns/pid");
    run("touch " + one_ + "/maps " + own_thread_ + "/maps");
    run("mkdir " + target_ + " && touch " + target_ + "/file");
    run("ln -s " + target_ + "/file " + one_ + "/fd/3");
  }
  struct Hidden {
    std::uint64_t all = 0;
    std::uint64_t own = 0;
  };
  /// Whether another user finds so many hidden, once `limit` has been run.
  [[nodiscard]] bool findsHidden(
      const Hidden& hidden, const std::function<bool()>& limit = [] { return true; }) const {
    return asNobody([&] {
      OpenFiles files(proc_);
      return limit() && files.scan({}, {}) && files.hiddenProcesses() == hidden.all &&
             files.hiddenOwnProcesses() == hidden.own;
    });
  }
  void expectHiddenAfter(const std::string& change, const std::string& back) const {
    run(change);
    EXPECT_TRUE(findsHidden({1, 0})) << change;
    run(back);
    EXPECT_TRUE(findsHidden({0, 0})) << back;
  }

  const std::string proc_ = temporaryDirectory();
  const std::string one_ = proc_ + "/1";
  // A number that no thread can have, so that nobody is taken for it.
  const std::string own_thread_ = one_ + "/task/4194305";
  const std::string target_ = temporaryDirectory() + "/target";
};

TEST_F(HiddenProcesses, EachRefusalAloneHidesAProcess) {
  EXPECT_TRUE(findsHidden({0, 0}));
  expectHiddenAfter("chmod 0 " + one_ + "/fd", "chmod 755 " + one_ + "/fd");
  // It may be listed, and its links may not be read.
  expectHiddenAfter("chmod 444 " + one_ + "/fd", "chmod 755 " + one_ + "/fd");
  expectHiddenAfter("chmod 0 " + one_ + "/maps", "chmod 644 " + one_ + "/maps");
  expectHiddenAfter("chmod 0 " + target_, "chmod 755 " + target_);
  expectHiddenAfter("chmod 0 " + one_ + "/task", "chmod 755 " + one_ + "/task");
  expectHiddenAfter("chmod 0 " + own_thread_ + "/fd", "chmod 755 " + own_thread_ + "/fd");
  expectHiddenAfter("chmod 0 " + own_thread_ + "/maps", "chmod 644 " + own_thread_ + "/maps");
}

TEST_F(HiddenProcesses, WhatHasGoneHidesNothing) {
  run("rm -r " + target_ + " " + own_thread_);
  EXPECT_TRUE(findsHidden({0, 0}));
  run("rm -r " + one_ + "/*");
  EXPECT_TRUE(findsHidden({0, 0}));
}

TEST_F(HiddenProcesses, ALackOfDescriptorsHidesAProcess) {
  const auto one_more = [] {
    const int lowest = ::dup(0);
    ::close(lowest);
    const rlimit limit{.rlim_cur = static_cast<rlim_t>(lowest) + 1,
                       .rlim_max = static_cast<rlim_t>(lowest) + 1};
    return lowest >= 0 && ::setrlimit(RLIMIT_NOFILE, &limit) == 0;
  };
  EXPECT_TRUE(findsHidden({1, 0}, one_more));
}

TEST_F(HiddenProcesses, OneOfTheSameUserIsToldFromOthers) {
  run("chmod 0 " + one_ + "/maps && chown 65534 " + one_);
  EXPECT_TRUE(findsHidden({1, 1}));
}

TEST_F(HiddenProcesses, WhereTheFirstProcessIsNotShownOthersAreHiddenToo) {
  run("mv " + one_ + " " + proc_ + "/17");
  EXPECT_TRUE(findsHidden({1, 0}));
}

TEST_F(HiddenProcesses, InAContainerAllOutsideAreHidden) {
  run("ln -sf 'pid:[4026532000]' " + proc_ + "/self/ns/pid");
  EXPECT_TRUE(findsHidden({1, 0}));
  run("rm " + proc_ + "/self/ns/pid");
  EXPECT_TRUE(findsHidden({1, 0}));
}

TEST_F(HiddenProcesses, APidNamespaceOfItsOwnCountsAsAContainer) {
  const std::string proc = temporaryDirectory();
  const auto leave = [] { return ::unshare(CLONE_NEWPID | CLONE_NEWNS) == 0; };
  const auto is_so = [&proc] {
    OpenFiles files(proc);
    return ::mount("none", proc.c_str(), "proc", 0, nullptr) == 0 && files.scan({}, {}) &&
           files.hiddenProcesses() == 1;
  };
  // The first child is the first process of the new name space.
  EXPECT_TRUE(asAnother(leave, [&] { return asAnother([] { return true; }, is_so); }));
}

}  // namespace
}  // namespace spacekeep::cachedir
