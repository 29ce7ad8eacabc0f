// State on volumes without a free block and without a free inode, on real file systems.
#include <fcntl.h>
#include <gtest/gtest.h>
#include <linux/fs.h>
#include <sched.h>
#include <sys/ioctl.h>
#include <sys/mount.h>
#include <sys/statvfs.h>
#include <unistd.h>

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <string>

#include "support/files/linux/descriptor.h"
#include "support/linux/linux_platform.h"
#include "tests/helpers/temporary_directory.h"

namespace spacekeep {
namespace {

namespace fs = std::filesystem;

const ipc::InterfaceDescription& noMethods() {
  static const ipc::InterfaceDescription interface {
    .name = "com.quorvel.Test", .methods = {}
  };
  return interface;
}

struct FileSystem {
  const char* name;
  const char* make;  ///< command that makes it in the image, empty for memory
  const char* mount_options;
  int size_mib;
  bool inodes_run_out;
};

void PrintTo(const FileSystem& system, std::ostream* stream) { *stream << system.name; }

/// A volume with a state directory, in a mount namespace of this process, that others fill up.
class FullVolume {
 public:
  explicit FullVolume(const FileSystem& system) : inodes_run_out_(system.inodes_run_out) {
    if (unshare(CLONE_NEWNS) != 0 ||
        ::mount(nullptr, "/", nullptr, MS_REC | MS_PRIVATE, nullptr) != 0) {
      throw std::runtime_error("these tests mount file systems and have to run as root");
    }
    fs::create_directories(volume());
    const std::string options = system.mount_options;
    if (*system.make == '\0') {
      shell("mount -t tmpfs -o " + options + " none " + volume());
      return;
    }
    const std::string image = directory_ / "image";
    shell("truncate -s " + std::to_string(system.size_mib) + "M " + image);
    shell(std::string(system.make) + " " + image + " >/dev/null 2>&1");
    shell("mount -o loop" + (options.empty() ? "" : "," + options) + " " + image + " " + volume());
  }
  ~FullVolume() { umount2(volume().c_str(), MNT_DETACH); }
  FullVolume(const FullVolume&) = delete;
  FullVolume& operator=(const FullVolume&) = delete;

  [[nodiscard]] std::string volume() const { return directory_ / "volume"; }
  [[nodiscard]] LinuxPaths paths() const {
    LinuxPaths paths;
    paths.socket = directory_ / "socket";
    paths.services_directory = directory_ / "services";
    paths.metrics_file = directory_ / "metrics";
    paths.state_directory = volume() + "/state";
    paths.vendor_directory = SPACEKEEP_SOURCE_DIR "/packaging";
    paths.administrator_directory = directory_ / "etc";
    paths.system_bus_socket = directory_ / "bus";
    return paths;
  }
  [[nodiscard]] bool hasReserve() const { return fs::exists(volume() + "/state/reserve"); }

  /// Takes what there is: first the inodes, while the directory can still grow, then the blocks, to
  /// the last one.
  void fillUp() {
    // There has to be one to put the blocks in.
    makeFile(volume() + "/ballast");
    while (inodes_run_out_ && makeFile(volume() + "/ballast" + std::to_string(++ballast_))) {
    }
    for (int pass = 0; pass < 3; ++pass) {
      for (const std::size_t piece : {1024U * 1024U, 65536U, 4096U, 512U}) append(piece);
      sync();  // what was promised and not yet placed
    }
    EXPECT_FALSE(canTakeABlock());
    struct statvfs status {};
    EXPECT_EQ(statvfs(volume().c_str(), &status), 0);
    EXPECT_TRUE(!inodes_run_out_ || status.f_favail == 0) << status.f_favail << " inodes left";
  }
  void freeEverything() {
    for (const auto& entry : fs::directory_iterator(volume())) {
      if (entry.is_regular_file()) fs::remove(entry.path());
    }
    sync();
  }

 private:
  static void shell(const std::string& command) {
    if (std::system(command.c_str()) != 0) throw std::runtime_error("failed: " + command);
  }
  static bool makeFile(const std::string& path) {
    return FileDescriptor(::open(path.c_str(), O_WRONLY | O_CREAT | O_CLOEXEC, 0600)).valid();
  }
  void append(std::size_t piece) {
    const FileDescriptor file(
        ::open((volume() + "/ballast").c_str(), O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC, 0600));
    const std::string content(piece, 'x');
    while (file.valid() &&
           ::write(file.get(), content.data(), piece) == static_cast<ssize_t>(piece)) {
    }
    if (file.valid()) ::fsync(file.get());
  }
  bool canTakeABlock() {
    const FileDescriptor file(
        ::open((volume() + "/ballast").c_str(), O_WRONLY | O_APPEND | O_CLOEXEC));
    const std::string content(4096, 'x');
    return file.valid() && ::write(file.get(), content.data(), content.size()) > 0 &&
           ::fsync(file.get()) == 0;
  }

  const test::TemporaryDirectory directory_;
  const bool inodes_run_out_;
  int ballast_ = 0;
};

Value state(std::size_t size, int round) {
  return Dictionary{{"KEY", std::string(size, 'v')}, {"ROUND", round}};
}

using Problem = std::optional<std::string>;

class StateOnAFullVolume : public ::testing::TestWithParam<FileSystem> {
 protected:
  void openSuite() {
    suite_.reset();
    platform_.reset();
    platform_ = std::make_unique<LinuxPlatform>(noMethods(), volume_.paths());
    suite_ = platform_->platform().openPreferencesSuite("com.quorvel.spacekeep");
    ASSERT_NE(suite_, nullptr);
  }
  Problem store(const Value& value) {
    suite_->set("SPACEKEEP_USER_DEFAULTS", value);
    return suite_->synchronize();
  }
  void expectAfterRestart(const Value& value) {
    ASSERT_NO_FATAL_FAILURE(openSuite());
    EXPECT_EQ(suite_->get("SPACEKEEP_USER_DEFAULTS"), value);
  }

  FullVolume volume_{GetParam()};
  std::unique_ptr<LinuxPlatform> platform_;
  std::unique_ptr<PreferencesSuite> suite_;
};

TEST_P(StateOnAFullVolume, IsWrittenAgainAndAgainWithoutTheReserve) {
  ASSERT_NO_FATAL_FAILURE(openSuite());
  ASSERT_EQ(store(state(5'000, 0)), std::nullopt);
  ASSERT_TRUE(volume_.hasReserve());
  volume_.fillUp();
  for (int round = 1; round <= 40; ++round) {
    const std::size_t size = 5'000U + 500U * static_cast<unsigned>(round);
    ASSERT_EQ(store(state(size, round)), std::nullopt) << "round " << round;
    if (round % 10 == 0) volume_.fillUp();
  }
  EXPECT_TRUE(volume_.hasReserve());
  expectAfterRestart(state(25'000, 40));
  // A start on the full volume has to leave the state as writable as it was.
  volume_.fillUp();
  for (int round = 41; round <= 60; ++round) {
    ASSERT_EQ(store(state(25'000, round)), std::nullopt) << "round " << round;
  }
  EXPECT_TRUE(volume_.hasReserve());
  expectAfterRestart(state(25'000, 60));
}

TEST_P(StateOnAFullVolume, IsWrittenAgainAndAgainAfterTheReserveWasGivenBackOnce) {
  ASSERT_NO_FATAL_FAILURE(openSuite());
  ASSERT_EQ(store(state(5'000, 0)), std::nullopt);
  volume_.fillUp();
  int round = 0;
  while (volume_.hasReserve()) {
    ++round;
    ASSERT_LT(round, 100);
    ASSERT_EQ(store(state(5'000U + 10'000U * static_cast<unsigned>(round), round)), std::nullopt)
        << "round " << round;
  }
  EXPECT_GT(round, 5);  // the room of its own came first
  const std::size_t size = 5'000U + 10'000U * static_cast<unsigned>(round);
  for (int more = 1; more <= 20; ++more) {
    if (more % 5 == 1) volume_.fillUp();  // some file systems take seconds for it
    ASSERT_EQ(store(state(size - 20U * static_cast<unsigned>(more), more)), std::nullopt)
        << "round " << more;
  }
  expectAfterRestart(state(size - 400U, 20));
  EXPECT_FALSE(volume_.hasReserve());
  volume_.freeEverything();
  expectAfterRestart(state(size - 400U, 20));
  EXPECT_TRUE(volume_.hasReserve());
}

TEST_P(StateOnAFullVolume, WithNothingLeftToGiveBackSaysSoAndKeepsTheOldValue) {
  ASSERT_NO_FATAL_FAILURE(openSuite());
  ASSERT_EQ(store(state(5'000, 0)), std::nullopt);
  volume_.fillUp();
  Problem problem = store(state(3'000'000, 1));
  ASSERT_TRUE(problem) << "three million bytes went into one of reserve";
  EXPECT_TRUE(problem->starts_with(volume_.paths().state_directory +
                                   "/com.quorvel.spacekeep.sqlite cannot be written"))
      << *problem;
  EXPECT_TRUE(problem->ends_with("; space has to be freed on its volume")) << *problem;
  suite_->discard("SPACEKEEP_USER_DEFAULTS");
  EXPECT_FALSE(volume_.hasReserve());
  volume_.fillUp();
  EXPECT_TRUE(store(state(3'000'000, 2)));
  suite_->discard("SPACEKEEP_USER_DEFAULTS");
  EXPECT_EQ(suite_->get("SPACEKEEP_USER_DEFAULTS"), state(5'000, 0));
  expectAfterRestart(state(5'000, 0));
  // What fits goes on.
  EXPECT_EQ(store(state(5'100, 3)), std::nullopt);
  volume_.freeEverything();
  EXPECT_EQ(store(state(3'000'000, 4)), std::nullopt);
  expectAfterRestart(state(3'000'000, 4));
}

INSTANTIATE_TEST_SUITE_P(
    FileSystems, StateOnAFullVolume,
    ::testing::Values(FileSystem{"ext4", "mkfs.ext4 -q -m 0 -N 64", "", 96, true},
                      FileSystem{"xfs", "mkfs.xfs -q", "", 320, false},
                      FileSystem{"btrfs", "mkfs.btrfs -q", "", 256, false},
                      FileSystem{"tmpfs", "", "size=64M,nr_inodes=24", 0, true}),
    [](const auto& parameter) { return std::string(parameter.param.name); });

TEST(StateOnBtrfs, IsKeptInPlaceSoThatAChangeNeedsNoFreeBlock) {
  const FullVolume volume(FileSystem{"btrfs", "mkfs.btrfs -q", "", 256, false});
  LinuxPlatform platform(noMethods(), volume.paths());
  const auto suite = platform.platform().openPreferencesSuite("com.quorvel.spacekeep");
  ASSERT_NE(suite, nullptr);
  const std::string directory = volume.paths().state_directory;
  for (const std::string& path : {directory, directory + "/com.quorvel.spacekeep.sqlite"}) {
    const FileDescriptor opened(::open(path.c_str(), O_RDONLY | O_CLOEXEC));
    ASSERT_TRUE(opened.valid()) << path;
    int flags = 0;
    ASSERT_EQ(::ioctl(opened.get(), FS_IOC_GETFLAGS, &flags), 0) << path;
    EXPECT_NE(flags & FS_NOCOW_FL, 0) << path;
  }
}

}  // namespace
}  // namespace spacekeep
