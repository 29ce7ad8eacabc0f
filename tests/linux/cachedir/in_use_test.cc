// A file that somebody uses is not taken, however urgent it is.
#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <linux/capability.h>
#include <sys/file.h>
#include <sys/mman.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <csignal>

#include "services/cachedir/engine/file_guard.h"
#include "services/cachedir/engine/link_groups.h"
#include "services/cachedir/engine/open_files.h"
#include "services/cachedir/engine/remover.h"
#include "services/cachedir/engine/tree_walk.h"
#include "tests/linux/cachedir/cache_world.h"

namespace spacekeep::cachedir {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;

class InUse : public testing::TestWithParam<const char*> {
 protected:
  void SetUp() override {
    writeFile(held_, kMiB, 200);
    writeFile(free_, kMiB, 100);
    volume_.settle();
  }
  /// With `hold` in another process the held file stays and the other goes; afterwards it goes too.
  void expectSparedWhile(const std::function<bool(const char*)>& hold, Left why) {
    {
      const Holder holder([&] { return hold(held_.c_str()); });
      EXPECT_EQ(CacheCleaner(rulesFor(volume_.path())).estimate({}).bytes[3], kMiB);
      const Observed seen = freeIn(volume_.path(), 2 * kMiB);
      EXPECT_THAT(seen.paths, ElementsAre(free_));
      EXPECT_EQ(seen.result.bytes, kMiB);
      EXPECT_EQ(seen.result.left.of(why), 1U);
      EXPECT_TRUE(exists(held_));
    }
    setAge(held_, 200);
    EXPECT_THAT(freeIn(volume_.path(), 2 * kMiB).paths, ElementsAre(held_));
  }
  /// The last check alone, without the scan of /proc.
  FileGuard::Verdict verdictWhile(const std::function<bool(const char*)>& hold) {
    const Holder holder([&] { return hold(held_.c_str()); });
    const UniqueFd fd(::open(held_.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK));
    return FileGuard(fd.get()).verdict();
  }

  Volume volume_{GetParam()};
  const std::string held_ = volume_ / "held";
  const std::string free_ = volume_ / "free";
};
INSTANTIATE_TEST_SUITE_P(On, InUse, testing::Values("ext4", "xfs", "btrfs", "tmpfs"),
                         [](const auto& about) { return about.param; });

bool holdOpen(const char* path) { return ::open(path, O_RDONLY) >= 0; }

bool holdOpenForWriting(const char* path) { return ::open(path, O_WRONLY) >= 0; }

bool holdFlock(const char* path) { return ::flock(::open(path, O_RDONLY), LOCK_SH) == 0; }

bool holdRecordLock(const char* path) {
  struct flock first_byte {};
  first_byte.l_type = F_WRLCK;
  first_byte.l_len = 1;
  return ::fcntl(::open(path, O_RDWR), F_SETLK, &first_byte) == 0;
}

bool holdOpenDescriptionLock(const char* path) {
  struct flock last_bytes {};
  last_bytes.l_type = F_RDLCK;
  last_bytes.l_start = 1000;
  return ::fcntl(::open(path, O_RDONLY), F_OFD_SETLK, &last_bytes) == 0;
}

bool holdLease(const char* path) {
  ::signal(SIGIO, SIG_IGN);
  return ::fcntl(::open(path, O_RDONLY), F_SETLEASE, F_RDLCK) == 0;
}

bool holdMapped(const char* path) {
  const int fd = ::open(path, O_RDONLY);
  const void* place = ::mmap(nullptr, 4096, PROT_READ, MAP_PRIVATE, fd, 0);
  ::close(fd);
  return place != MAP_FAILED;
}

TEST_P(InUse, AFileHeldOpenIsSpared) { expectSparedWhile(holdOpen, Left::kOpen); }
TEST_P(InUse, AFileOpenForWritingIsSpared) { expectSparedWhile(holdOpenForWriting, Left::kOpen); }
TEST_P(InUse, AMappedFileWithoutADescriptorIsSpared) { expectSparedWhile(holdMapped, Left::kOpen); }
TEST_P(InUse, AFileUnderFlockIsSpared) { expectSparedWhile(holdFlock, Left::kOpen); }
TEST_P(InUse, AFileUnderARecordLockIsSpared) { expectSparedWhile(holdRecordLock, Left::kOpen); }
TEST_P(InUse, ALeasedFileIsSpared) { expectSparedWhile(holdLease, Left::kOpen); }

TEST_P(InUse, TheLastCheckAloneSeesOpenFilesMappingsLocksAndLeases) {
  using Verdict = FileGuard::Verdict;
  EXPECT_EQ(verdictWhile(holdOpen), Verdict::kOpen);
  EXPECT_EQ(verdictWhile(holdOpenForWriting), Verdict::kOpen);
  EXPECT_EQ(verdictWhile(holdMapped), Verdict::kOpen);
  EXPECT_EQ(verdictWhile(holdFlock), Verdict::kLocked);
  EXPECT_EQ(verdictWhile(holdRecordLock), Verdict::kLocked);
  EXPECT_EQ(verdictWhile(holdOpenDescriptionLock), Verdict::kLocked);
  EXPECT_EQ(verdictWhile(holdLease), Verdict::kOpen);
  EXPECT_EQ(verdictWhile([](const char*) { return true; }), Verdict::kAlone);
}

TEST_P(InUse, WhoComesWhileTheFileIsGuardedIsNoticed) {
  const UniqueFd fd(::open(held_.c_str(), O_RDONLY | O_CLOEXEC));
  const FileGuard guard(fd.get());
  ASSERT_EQ(guard.verdict(), FileGuard::Verdict::kAlone);
  EXPECT_TRUE(guard.stillAlone());
  // Not waiting, so that the lease's break is asked for and the opener goes away again.
  EXPECT_LT(::open(held_.c_str(), O_RDWR | O_NONBLOCK | O_CLOEXEC), 0);
  EXPECT_EQ(errno, EWOULDBLOCK);
  EXPECT_FALSE(guard.stillAlone());
}

TEST_P(InUse, AFileOpenedAfterTheScanIsSparedByTheLastCheck) {
  CacheCleaner cleaner(rulesFor(volume_.path()));
  writeFile(volume_ / "first", kMiB, 300);
  volume_.settle();
  UniqueFd late;
  FreeResult result = cleaner.free({.amount = 3 * kMiB, .urgency = 4}, [&](const TakenFile& file) {
    if (file.path == volume_ / "first") late.reset(::open(held_.c_str(), O_RDONLY | O_CLOEXEC));
  });
  EXPECT_EQ(result.left.of(Left::kOpen), 1U);
  EXPECT_EQ(result.bytes, 2 * kMiB);
  EXPECT_TRUE(exists(held_));
}

TEST_P(InUse, AFileUsedAfterTheWalkIsSpared) {
  CacheCleaner cleaner(rulesFor(volume_.path()));
  writeFile(volume_ / "first", kMiB, 300);
  volume_.settle();
  FreeResult result = cleaner.free({.amount = 3 * kMiB, .urgency = 1}, [&](const TakenFile& file) {
    if (file.path == volume_ / "first") setAge(held_, 0);
  });
  EXPECT_EQ(result.left.of(Left::kUsedSince), 1U);
  EXPECT_TRUE(exists(held_));
}

TEST_P(InUse, AFileReplacedAfterTheWalkIsSpared) {
  CacheCleaner cleaner(rulesFor(volume_.path()));
  writeFile(volume_ / "first", kMiB, 300);
  volume_.settle();
  FreeResult result = cleaner.free({.amount = 3 * kMiB, .urgency = 1}, [&](const TakenFile& file) {
    if (file.path != volume_ / "first") return;
    writeFile(volume_ / "next", kMiB, 250);
    ASSERT_EQ(::rename((volume_ / "next").c_str(), held_.c_str()), 0);
  });
  EXPECT_EQ(result.left.of(Left::kUsedSince), 1U);
  EXPECT_TRUE(exists(held_));
}

TEST_P(InUse, AFileLinkedAfterTheWalkIsSpared) {
  CacheCleaner cleaner(rulesFor(volume_.path()));
  writeFile(volume_ / "first", kMiB, 300);
  volume_.settle();
  FreeResult result = cleaner.free({.amount = 3 * kMiB, .urgency = 1}, [&](const TakenFile& file) {
    if (file.path == volume_ / "first") {
      ASSERT_EQ(::link(held_.c_str(), (volume_ / "saved").c_str()), 0);
    }
  });
  EXPECT_EQ(result.left.of(Left::kLinked), 1U);
  EXPECT_TRUE(exists(held_));
}

/// Keeps the privileges of which `keep` says so.
bool limitPrivileges(const std::function<bool(unsigned)>& keep) {
  __user_cap_header_struct about{_LINUX_CAPABILITY_VERSION_3, 0};
  __user_cap_data_struct sets[2]{};
  if (::syscall(SYS_capget, &about, sets) != 0) return false;
  for (unsigned each = 0; each < 64; ++each) {
    if (keep(each)) continue;
    sets[each / 32].effective &= ~(1U << (each % 32));
    sets[each / 32].permitted &= ~(1U << (each % 32));
  }
  return ::syscall(SYS_capset, &about, sets) == 0;
}

bool asRootWith(const std::function<bool(unsigned)>& privileges,
                const std::function<bool()>& body) {
  return asAnother([&] { return limitPrivileges(privileges); }, body);
}

bool openAsNobody(const char* path) { return becomeNobody() && holdOpen(path); }

/// Deletes the file `path` below the directory of `rules`, with `proc` in the place of /proc; why not,
/// none when it went.
std::optional<Left> objectionTo(const std::string& path, const Rules& rules,
                                const std::string& proc) {
  const OpenedRoots opened = openRoots(rules, {});
  OpenFiles open_files(proc);
  if (!open_files.scan(opened.roots, {})) return Left::kFailed;
  Remover remover(opened.roots, open_files, {});
  std::optional<Left> why = Left::kFailed;
  const auto visit = [&](const FoundFile& found) {
    if (!path.ends_with("/" + std::string(found.name))) return;
    const auto outcome = remover.take(candidateOf(found, 0), {});
    const auto* left = std::get_if<Left>(&outcome);
    why = left != nullptr ? std::optional(*left) : std::nullopt;
  };
  Tally tally;
  TreeWalk(opened.roots).forEachFile(visit, {}, tally);
  return why;
}

TEST_P(InUse, WithoutTheRightToALeaseWhatProcShowsDecidesIfItShowsEveryProcess) {
  for (const std::string& file : {held_, free_}) {
    ASSERT_EQ(::chown(file.c_str(), kNobody, kNobody), 0);
  }
  const std::string proc = temporaryDirectory();
  run("mkdir -p " + proc + "/17/fd && ln -s " + held_ + " " + proc + "/17/fd/3");
  const auto allButLeases = [](unsigned each) { return each != CAP_LEASE; };
  const Rules rules = rulesFor(volume_.path());
  EXPECT_TRUE(asRootWith(allButLeases, [&] {
    return objectionTo(free_, rules, proc) == Left::kUnproven &&
           objectionTo(held_, rules, proc) == Left::kOpen;
  }));
  run("mkdir -p " + proc + "/1/fd " + proc + "/self/ns");
  run("ln -s 'pid:[4026531836]' " + proc + "/self/ns/pid");
  EXPECT_TRUE(asRootWith(allButLeases, [&] {
    return objectionTo(free_, rules, proc) == std::nullopt &&
           objectionTo(held_, rules, proc) == Left::kOpen;
  }));
  EXPECT_TRUE(exists(held_));
  EXPECT_FALSE(exists(free_));
}

TEST_P(InUse, AFileOfAnotherUserStaysWhenNeitherALeaseNorProcCanTell) {
  ASSERT_EQ(::chown(held_.c_str(), kNobody, kNobody), 0);
  const Holder holder([this] { return openAsNobody(held_.c_str()); });
  // Of its own files a lease still tells.
  EXPECT_TRUE(asRootWith([](unsigned) { return false; },
                         [this] {
                           const Observed seen = freeIn(volume_.path(), 2 * kMiB);
                           return seen.paths == std::vector<std::string>{free_} &&
                                  seen.result.left.of(Left::kUnproven) == 1;
                         }));
  EXPECT_TRUE(exists(held_));
  EXPECT_FALSE(exists(free_));
}

TEST_P(InUse, ThePrivilegeOfLeasesAloneTellsOfFilesOfOtherUsers) {
  for (const std::string& file : {held_, free_}) {
    ASSERT_EQ(::chown(file.c_str(), kNobody, kNobody), 0);
  }
  const Holder holder([this] { return openAsNobody(held_.c_str()); });
  EXPECT_TRUE(asRootWith([](unsigned each) { return each == CAP_LEASE; },
                         [this] {
                           const Observed seen = freeIn(volume_.path(), 2 * kMiB);
                           return seen.paths == std::vector<std::string>{free_} &&
                                  seen.result.left.of(Left::kOpen) == 1;
                         }));
  EXPECT_TRUE(exists(held_));
  EXPECT_FALSE(exists(free_));
}

TEST_P(InUse, WithoutTheRightToALeaseAFileStaysWhereProcHidesProcesses) {
  // Files of root in a directory of another user, who may delete them and gets no lease on them.
  ASSERT_EQ(::chmod((volume_ / "").c_str(), 0777), 0);
  ::rmdir((volume_ / "lost+found").c_str());  // ext4's own, which cannot be read
  EXPECT_TRUE(asNobody([this] {
    const UniqueFd fd(::open(free_.c_str(), O_RDONLY | O_CLOEXEC));
    return FileGuard(fd.get()).verdict() == FileGuard::Verdict::kUnproven;
  }));
  EXPECT_TRUE(asNobody([this] {
    const UniqueFd user(::open(held_.c_str(), O_RDONLY | O_CLOEXEC));
    const Observed seen = freeIn(volume_.path(), 2 * kMiB);
    return seen.paths.empty() && seen.result.left.of(Left::kOpen) == 1 &&
           seen.result.left.of(Left::kUnproven) == 1;
  }));
  EXPECT_TRUE(exists(held_));
  EXPECT_TRUE(exists(free_));
}

TEST_P(InUse, AFileThatCannotBeReadStays) {
  ASSERT_EQ(::chmod((volume_ / "").c_str(), 0777), 0);
  ASSERT_EQ(::chown(free_.c_str(), kNobody, kNobody), 0);  // on which it gets a lease
  ASSERT_EQ(::chmod(held_.c_str(), 0600), 0);
  ::rmdir((volume_ / "lost+found").c_str());  // ext4's own, which cannot be read either
  EXPECT_TRUE(asNobody([this] {
    const Observed seen = freeIn(volume_.path(), 2 * kMiB);
    return seen.paths == std::vector<std::string>{free_} &&
           seen.result.left.of(Left::kUnreadable) == 1;
  }));
  EXPECT_TRUE(exists(held_));
}

}  // namespace
}  // namespace spacekeep::cachedir
