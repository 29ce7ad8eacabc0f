#include "tests/linux/cachedir/cache_world.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sched.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <sys/statvfs.h>
#include <unistd.h>

#include <cstdlib>
#include <filesystem>

#include "services/cachedir/engine/file_facts.h"
#include "support/runtime/runtime.h"

namespace spacekeep::cachedir {
namespace {

/// Leaves the machine's mounts alone, and removes what was written when the program ends.
class PrivateMounts : public testing::Environment {
 public:
  void SetUp() override {
    ASSERT_EQ(::geteuid(), 0U) << "these tests mount file systems: run them as root";
    ASSERT_EQ(::unshare(CLONE_NEWNS), 0);
    ASSERT_EQ(::mount("none", "/", nullptr, MS_REC | MS_PRIVATE, nullptr), 0);
    char pattern[] = "/tmp/cachedir-test-XXXXXX";
    ASSERT_NE(::mkdtemp(pattern), nullptr);
    base = pattern;
    ASSERT_EQ(::chmod(pattern, 0755), 0);  // tests also run as other users
  }
  void TearDown() override {
    if (!base.empty()) std::filesystem::remove_all(base);
  }
  static std::string base;
};
std::string PrivateMounts::base;

const auto* const kMounts = testing::AddGlobalTestEnvironment(new PrivateMounts);

std::string numbered(const std::string& name) {
  static int count = 0;
  return PrivateMounts::base + "/" + name + std::to_string(count++);
}

}  // namespace

void run(const std::string& command) {
  ASSERT_EQ(std::system(("{ " + command + "; } >/dev/null 2>&1").c_str()), 0) << command;
}

std::string temporaryDirectory() {
  std::string path = numbered("dir");
  std::filesystem::create_directory(path);
  return path;
}

Volume::Volume(const std::string& kind, std::uint64_t size_mib)
    : base_(numbered(kind)), path_(base_ + "/mounted") {
  std::filesystem::create_directories(path_);
  const std::string size = std::to_string(size_mib) + "M";
  if (kind == "tmpfs") {
    run("mount -t tmpfs -o size=" + size + " none " + path_);
    return;
  }
  const std::string image = base_ + "/image";
  run("truncate -s " + size + " " + image);
  run("mkfs." + kind + (kind == "ext4" ? " -F " : " -f ") + image);
  run("mount -o loop " + image + " " + path_);
}

Volume::~Volume() {
  ::umount2(path_.c_str(), MNT_DETACH);
  ::unlink((base_ + "/image").c_str());
}

std::uint64_t Volume::freeBytes() const {
  struct statvfs facts {};
  EXPECT_EQ(::statvfs(path_.c_str(), &facts), 0);
  return static_cast<std::uint64_t>(facts.f_bavail) * facts.f_frsize;
}

void Volume::settle() const {
  const UniqueFd fd(::open(path_.c_str(), O_RDONLY | O_DIRECTORY));
  ASSERT_EQ(::syncfs(fd.get()), 0);
  ASSERT_EQ(::syncfs(fd.get()), 0);  // btrfs: what the first commit freed itself
}

void writeFile(const std::string& path, std::uint64_t bytes, double days) {
  std::filesystem::create_directories(std::filesystem::path(path).parent_path());
  const UniqueFd fd(::open(path.c_str(), O_WRONLY | O_CREAT | O_TRUNC, 0644));
  ASSERT_TRUE(fd) << path;
  const std::string block(64 * 1024, '\xa5');
  for (std::uint64_t done = 0; done < bytes;) {
    const std::uint64_t step = std::min<std::uint64_t>(block.size(), bytes - done);
    ASSERT_EQ(::write(fd.get(), block.data(), step), static_cast<ssize_t>(step)) << path;
    done += step;
  }
  setAge(path, days);
}

void setAge(const std::string& path, double days) {
  const std::int64_t then_ns = rt::wallClockNs() - static_cast<std::int64_t>(days * 86400 * 1e9);
  const timespec time{.tv_sec = then_ns / kNsPerSecond, .tv_nsec = then_ns % kNsPerSecond};
  const timespec times[2] = {time, time};
  ASSERT_EQ(::utimensat(AT_FDCWD, path.c_str(), times, AT_SYMLINK_NOFOLLOW), 0) << path;
}

bool exists(const std::string& path) {
  struct stat facts {};
  return ::lstat(path.c_str(), &facts) == 0;
}

std::uint64_t allocated(const std::string& path) {
  struct stat facts {};
  EXPECT_EQ(::lstat(path.c_str(), &facts), 0) << path;
  return allocatedBytes(facts);
}

Holder::Holder(const std::function<bool()>& hold)
    : process_([&](int ready) {
        // What the test has open at the moment would be held by the other process as well.
        const auto kept = static_cast<unsigned>(ready);
        static_cast<void>(::close_range(3, kept - 1, 0));
        static_cast<void>(::close_range(kept + 1, ~0U, 0));
        if (!hold()) ::_exit(1);
        test::tellReady(ready);
      }) {}

bool becomeNobody() {
  return ::setresgid(kNobody, kNobody, kNobody) == 0 && ::setresuid(kNobody, kNobody, kNobody) == 0;
}

bool asAnother(const std::function<bool()>& become, const std::function<bool()>& body) {
  return test::holdsInAnotherProcess([&] { return become() && body(); });
}

bool asNobody(const std::function<bool()>& body) { return asAnother(becomeNobody, body); }

Rules rulesFor(const std::string& directory) {
  Rules rules;
  rules.service_id = "com.example.cache";
  DirectoryRule rule;
  rule.path = directory;
  rules.directories.push_back(rule);
  return rules;
}

Observed freeWith(CacheCleaner& cleaner, const FreeRequest& request) {
  Observed observed;
  observed.result = cleaner.free(
      request, [&observed](const TakenFile& file) { observed.paths.push_back(file.path); });
  return observed;
}

Observed freeIn(const std::string& directory, std::uint64_t amount, int urgency) {
  CacheCleaner cleaner(rulesFor(directory));
  return freeWith(cleaner, {.amount = amount, .urgency = urgency});
}

}  // namespace spacekeep::cachedir
