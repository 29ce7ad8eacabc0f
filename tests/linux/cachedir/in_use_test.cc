// A file that somebody uses is not taken, however urgent it is.
#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/file.h>
#include <sys/mman.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <csignal>

#include "services/cachedir/engine/file_guard.h"
#include "services/cachedir/engine/open_files.h"
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

/// Runs `body` in another process under the user `nobody`; answers whether it said true.
bool asNobody(const std::function<bool()>& body) {
  constexpr uid_t kNobody = 65534;
  const pid_t child = ::fork();
  if (child == 0) {
    if (::setresgid(kNobody, kNobody, kNobody) != 0) ::_exit(2);
    if (::setresuid(kNobody, kNobody, kNobody) != 0) ::_exit(2);
    ::_exit(body() ? 0 : 1);
  }
  int status = 0;
  EXPECT_EQ(::waitpid(child, &status, 0), child);
  return WIFEXITED(status) && WEXITSTATUS(status) == 0;
}

TEST_P(InUse, WithoutTheRightToALeaseWhatProcShowsDecides) {
  // Files of root in a directory of another user, who may delete them and gets no lease on them.
  ASSERT_EQ(::chmod((volume_ / "").c_str(), 0777), 0);
  EXPECT_TRUE(asNobody([this] {
    const UniqueFd fd(::open(free_.c_str(), O_RDONLY | O_CLOEXEC));
    return FileGuard(fd.get()).verdict() == FileGuard::Verdict::kUnproven;
  }));
  EXPECT_TRUE(asNobody([this] {
    const UniqueFd user(::open(held_.c_str(), O_RDONLY | O_CLOEXEC));
    const Observed seen = freeIn(volume_.path(), 2 * kMiB);
    return seen.paths == std::vector<std::string>{free_} && seen.result.left.of(Left::kOpen) == 1;
  }));
  EXPECT_TRUE(exists(held_));
  EXPECT_FALSE(exists(free_));
}

TEST_P(InUse, AFileThatCannotBeReadStays) {
  ASSERT_EQ(::chmod((volume_ / "").c_str(), 0777), 0);
  ASSERT_EQ(::chmod(held_.c_str(), 0600), 0);
  ::rmdir((volume_ / "lost+found").c_str());  // ext4's own, which cannot be read either
  EXPECT_TRUE(asNobody([this] {
    const Observed seen = freeIn(volume_.path(), 2 * kMiB);
    return seen.paths == std::vector<std::string>{free_} &&
           seen.result.left.of(Left::kUnreadable) == 1;
  }));
  EXPECT_TRUE(exists(held_));
}

TEST(OpenFilesScan, WithoutProcNobodyIsTakenForUnused) {
  OpenFiles files("/nowhere");
  EXPECT_FALSE(files.scan({}, {}));
}

TEST(OpenFilesScan, TheScanIsKeptForARequestThatFollowsClosely) {
  const std::string cache = temporaryDirectory();
  writeFile(cache + "/file", 4096);
  const OpenedRoots opened = openRoots(rulesFor(cache), {});
  OpenFiles files;
  ASSERT_TRUE(files.ensure(opened.roots, 0, {}));
  const UniqueFd late(::open((cache + "/file").c_str(), O_RDONLY | O_CLOEXEC));
  struct stat facts {};
  ASSERT_EQ(::fstat(late.get(), &facts), 0);
  ASSERT_TRUE(files.ensure(opened.roots, UINT64_MAX, {}));
  EXPECT_FALSE(files.holds(inodeOf(facts), opened.roots[0].file_system));
  ASSERT_TRUE(files.ensure(opened.roots, 0, {}));
  EXPECT_TRUE(files.holds(inodeOf(facts), opened.roots[0].file_system));
}

}  // namespace
}  // namespace spacekeep::cachedir
