#include "support/linux/linux_platform.h"

#include <gtest/gtest.h>
#include <sched.h>
#include <sys/mount.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/statvfs.h>
#include <sys/un.h>
#include <unistd.h>

#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <set>

#include "support/linux/reserve_file.h"
#include "support/linux/token.h"
#include "tests/helpers/log_capture.h"

namespace spacekeep {
namespace {

namespace fs = std::filesystem;
using test::LogCapture;

const ipc::InterfaceDescription& noMethods() {
  static const ipc::InterfaceDescription interface {
    .name = "com.quorvel.Test", .methods = {}
  };
  return interface;
}

class LinuxPlatformInADirectory : public ::testing::Test {
 protected:
  LinuxPlatformInADirectory() {
    std::string path = (fs::temp_directory_path() / "platform.XXXXXX").string();
    EXPECT_NE(::mkdtemp(path.data()), nullptr);
    root_ = path;
    paths_.socket = root_ + "/spacekeep.sock";
    paths_.services_directory = root_ + "/services";
    paths_.metrics_file = root_ + "/metrics.prom";
    paths_.state_directory = root_ + "/state";
    paths_.vendor_directory = SPACEKEEP_SOURCE_DIR "/packaging";
    paths_.administrator_directory = root_ + "/etc";
    paths_.system_bus_socket = root_ + "/bus";
  }
  ~LinuxPlatformInADirectory() override { fs::remove_all(root_); }

  bool somebodyListens() {
    const int fd = ::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    std::memcpy(address.sun_path, paths_.socket.c_str(), paths_.socket.size() + 1);
    const bool connected =
        ::connect(fd, reinterpret_cast<const sockaddr*>(&address), sizeof(address)) == 0;
    ::close(fd);
    return connected;
  }

  std::string root_;
  LinuxPaths paths_;
};

TEST_F(LinuxPlatformInADirectory, ListensOnItsSocketForEverybody) {
  LinuxPlatform linux_platform(noMethods(), paths_);
  const auto listener =
      linux_platform.platform().makeListener({.description = &noMethods(), .methods = {}});
  ASSERT_NE(listener, nullptr);
  listener->setRequiredEntitlement("CLIENT_ENTITLEMENT");
  listener->resume();
  EXPECT_TRUE(somebodyListens());
  struct stat status {};
  ASSERT_EQ(::stat(paths_.socket.c_str(), &status), 0);
  EXPECT_EQ(status.st_mode & 0777U, 0666U);
}

TEST_F(LinuxPlatformInADirectory, WithoutAPlaceForTheSocketItSaysSoAndGoesOn) {
  paths_.socket = root_ + "/missing/spacekeep.sock";
  LinuxPlatform linux_platform(noMethods(), paths_);
  const LogCapture log;
  const auto listener =
      linux_platform.platform().makeListener({.description = &noMethods(), .methods = {}});
  ASSERT_NE(listener, nullptr);
  listener->resume();
  EXPECT_EQ(log.count(kLogProblem, "makeListener cannot listen on " + paths_.socket), 1U);
}

TEST_F(LinuxPlatformInADirectory, OpensSuitesThatLast) {
  {
    LinuxPlatform linux_platform(noMethods(), paths_);
    const auto suite = linux_platform.platform().openPreferencesSuite("com.quorvel.spacekeep");
    ASSERT_NE(suite, nullptr);
    suite->set("KEY", Value("value"));
    EXPECT_EQ(suite->synchronize(), std::nullopt);
  }
  LinuxPlatform linux_platform(noMethods(), paths_);
  const auto suite = linux_platform.platform().openPreferencesSuite("com.quorvel.spacekeep");
  ASSERT_NE(suite, nullptr);
  EXPECT_EQ(suite->get("KEY"), Value("value"));
}

TEST_F(LinuxPlatformInADirectory, TheRootIsAVolume) {
  LinuxPlatform linux_platform(noMethods(), paths_);
  EXPECT_TRUE(linux_platform.platform().volumes.validateVolume({{"SPACEKEEP_VOLUME", "/"}}));
}

TEST_F(LinuxPlatformInADirectory, NamesAServiceThatDoesNotExistAsUnreachable) {
  LinuxPlatform linux_platform(noMethods(), paths_);
  EXPECT_EQ(linux_platform.platform().connector.connectionToDeclared("nobody", noMethods()),
            nullptr);
}

TEST_F(LinuxPlatformInADirectory, MakesAFreshTokenEachTimeThatComparesByValue) {
  LinuxPlatform linux_platform(noMethods(), paths_);
  const Value one = linux_platform.platform().createSpacekeepToken();
  const Value other = linux_platform.platform().createSpacekeepToken();
  EXPECT_NE(one, other);
  ASSERT_NE(one.string(), nullptr);
  EXPECT_EQ(one, Value(*one.string()));
}

/// A tmpfs of that size over `directory`, in a mount namespace of this process.
void mountSmall(const std::string& directory, const std::string& size) {
  ASSERT_EQ(::geteuid(), 0U) << "tests of a full volume mount, and have to run as root";
  ASSERT_EQ(::unshare(CLONE_NEWNS), 0);
  ASSERT_EQ(::mount("none", "/", nullptr, MS_REC | MS_PRIVATE, nullptr), 0);
  fs::create_directories(directory);
  ASSERT_EQ(::mount("none", directory.c_str(), "tmpfs", 0, ("size=" + size).c_str()), 0);
}

std::uint64_t available(const std::string& directory) {
  struct statvfs status {};
  return ::statvfs(directory.c_str(), &status) == 0 ? status.f_bavail * status.f_frsize : 0;
}

void fillUp(const std::string& directory) {
  std::ofstream file(directory + "/ballast", std::ios::binary);
  const std::string block(4096, 'x');
  while (file.write(block.data(), static_cast<std::streamsize>(block.size())).flush()) {
  }
}

TEST_F(LinuxPlatformInADirectory, KeepsStateOnAFullVolumeByGivingBackItsReserve) {
  ASSERT_NO_FATAL_FAILURE(mountSmall(paths_.state_directory, "16M"));
  {
    LinuxPlatform linux_platform(noMethods(), paths_);
    const auto suite = linux_platform.platform().openPreferencesSuite("com.quorvel.spacekeep");
    ASSERT_NE(suite, nullptr);
    ASSERT_TRUE(fs::exists(paths_.state_directory + "/reserve"));
    fillUp(paths_.state_directory);
    ASSERT_EQ(available(paths_.state_directory), 0U);
    suite->set("KEY", Value(std::string(500'000, 'v')));
    EXPECT_EQ(suite->synchronize(), std::nullopt);
    EXPECT_FALSE(fs::exists(paths_.state_directory + "/reserve"));
  }
  {
    LinuxPlatform linux_platform(noMethods(), paths_);
    const auto suite = linux_platform.platform().openPreferencesSuite("com.quorvel.spacekeep");
    ASSERT_NE(suite, nullptr);
    EXPECT_EQ(suite->get("KEY"), Value(std::string(500'000, 'v')));
    EXPECT_FALSE(fs::exists(paths_.state_directory + "/reserve")) << "there is no room for it";
  }
  ASSERT_EQ(::umount2(paths_.state_directory.c_str(), MNT_DETACH), 0);
}

TEST_F(LinuxPlatformInADirectory, AReserveIsTakenOnlyWhereThereIsRoomEnough) {
  ASSERT_NO_FATAL_FAILURE(mountSmall(root_ + "/small", "1M"));
  ReserveFile modest(root_ + "/small/modest", 128 * 1024);
  EXPECT_TRUE(modest.take());
  EXPECT_TRUE(modest.take());
  EXPECT_EQ(available(root_ + "/small"), 896U * 1024);
  ReserveFile greedy(root_ + "/small/greedy", 128 * 1024);
  EXPECT_FALSE(greedy.take());
  EXPECT_FALSE(greedy.giveBack());
  EXPECT_TRUE(modest.giveBack());
  EXPECT_FALSE(modest.giveBack());
  EXPECT_EQ(available(root_ + "/small"), 1024U * 1024);
  EXPECT_TRUE(greedy.take());
  EXPECT_FALSE(ReserveFile("/nowhere/reserve").take());
  ASSERT_EQ(::umount2((root_ + "/small").c_str(), MNT_DETACH), 0);
}

TEST_F(LinuxPlatformInADirectory, AReserveIsNotTakenThroughALinkThatLeadsElsewhere) {
  ASSERT_EQ(::symlink((root_ + "/elsewhere").c_str(), (root_ + "/reserve").c_str()), 0);
  EXPECT_FALSE(ReserveFile(root_ + "/reserve", 128 * 1024).take());
  EXPECT_FALSE(fs::exists(root_ + "/elsewhere"));
}

TEST(Token, IsThirtyTwoHexadecimalDigitsAndNeverTheSame) {
  std::set<std::string> tokens;
  for (int i = 0; i < 1000; ++i) {
    const std::string token = randomToken();
    EXPECT_EQ(token.size(), 32U);
    EXPECT_EQ(token.find_first_not_of("0123456789abcdef"), std::string::npos) << token;
    tokens.insert(token);
  }
  EXPECT_EQ(tokens.size(), 1000U);
}

TEST(LinuxPaths, AreThoseOfProduction) {
  const LinuxPaths paths;
  EXPECT_EQ(paths.socket, "/run/spacekeep/spacekeep.sock");
  EXPECT_EQ(paths.services_directory, "/run/spacekeep/services");
  EXPECT_EQ(paths.state_directory, "/var/lib/spacekeep");
  EXPECT_EQ(paths.vendor_directory, "/usr/lib/spacekeep");
  EXPECT_EQ(paths.administrator_directory, "/etc/spacekeep");
}

}  // namespace
}  // namespace spacekeep
