// The real daemon with its state on a volume that has neither a block nor an inode left: it goes on
// noting down what clients set, and it can still be asked to free space there.
#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <sys/statvfs.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>
#include <string>

#include "support/files/linux/descriptor.h"
#include "tests/linux/system/sandbox.h"
#include "tests/linux/system/state_client.h"

namespace spacekeep::system_test {
namespace {

namespace fs = std::filesystem;

constexpr std::uint64_t kAskedBytes = 5 * 1024 * 1024;

constexpr const char* kRules =
    "<plist version=\"1.0\"><dict><key>SPACEKEEP_ID</key><string>cache</string>"
    "<key>DIRECTORIES</key><array><dict><key>PATH</key><string>/volumes/disk/cache</string></dict>"
    "</array></dict></plist>";

class StateOnTheFullVolume : public testing::Test {
 protected:
  void SetUp() override {
    sandbox_.addVolume("disk", "ext4", 96);
    disk_ = sandbox_.volume("disk");
    fs::create_directory(disk_ + "/state");
    fs::create_directory(disk_ + "/cache");
    for (int i = 0; i < 80; ++i) writeOld(disk_ + "/cache/" + std::to_string(i));
    sandbox_.start();
    fs::create_directory_symlink("/volumes/disk/state", sandbox_.outside("/var/lib/spacekeep"));
    start();
  }
  void start() {
    daemon_ = sandbox_.startDaemon();
    client_ = connectToStarting(sandbox_);
    ASSERT_NE(client_, nullptr);
  }
  static void writeOld(const std::string& path) {
    std::ofstream(path) << std::string(256 * 1024, 'c');
    const timespec when = {time(nullptr) - 40 * 86'400L, 0};
    const timespec times[2] = {when, when};
    utimensat(AT_FDCWD, path.c_str(), times, 0);
  }
  [[nodiscard]] struct statvfs space() const {
    struct statvfs status {};
    EXPECT_EQ(statvfs(disk_.c_str(), &status), 0);
    return status;
  }
  /// Every inode, then every block.
  void fillUp() {
    fs::create_directories(disk_ + "/ballast");
    const FileDescriptor big(
        open((disk_ + "/ballast/big").c_str(), O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC, 0600));
    while (FileDescriptor(open((disk_ + "/ballast/" + std::to_string(++ballast_)).c_str(),
                               O_WRONLY | O_CREAT | O_CLOEXEC, 0600))
               .valid()) {
    }
    for (const std::size_t piece : {1024U * 1024U, 4096U, 512U}) {
      const std::string content(piece, 'x');
      while (write(big.get(), content.data(), piece) == static_cast<ssize_t>(piece)) {
      }
      fsync(big.get());
    }
    EXPECT_EQ(space().f_bavail, 0U);
    EXPECT_EQ(space().f_favail, 0U);
  }
  void setAndExpect(int round) {
    const Value value = Dictionary{{"ROUND", round}, {"TEXT", std::string(3'000, 'x')}};
    const sdk::Status status = client_->setState("KEY", value);
    ASSERT_TRUE(status.ok()) << "round " << round << ": " << status.error->text;
    ASSERT_EQ(client_->state("KEY").value, value);
  }

  Sandbox sandbox_;
  Process daemon_;
  std::unique_ptr<sdk::Client> client_;
  std::string disk_;
  int ballast_ = 0;
};

TEST_F(StateOnTheFullVolume, IsWrittenAndThePurgeThatHelpsWorks) {
  sandbox_.write("/tmp/cache.plist", kRules);
  const Process service = sandbox_.spawn(
      {"/programs/services/spacekeep-cachedir", "--rules", "/tmp/cache.plist", "--check-in"},
      "cache.log");
  ASSERT_TRUE(sandbox_.waitForText("/tmp/cache.log", "serving"));
  fillUp();
  for (int round = 0; round < 30; ++round) ASSERT_NO_FATAL_FAILURE(setAndExpect(round));
  const sdk::Reply reply = client_->purge({.volume = "/volumes/disk",
                                           .amount = kAskedBytes,
                                           .urgency = 2,
                                           .timeout_seconds = 20,
                                           .token = {},
                                           .finish_early = true});
  ASSERT_TRUE(reply.outcome);
  EXPECT_GE(unsignedAt(*reply.outcome, "SPACEKEEP_AMOUNT").value_or(0), kAskedBytes);
  EXPECT_GE(space().f_bavail * space().f_frsize, kAskedBytes);
  ASSERT_NO_FATAL_FAILURE(setAndExpect(100));
}

TEST_F(StateOnTheFullVolume, AStartThereLosesNothingAndStateGoesOnBeingWritten) {
  ASSERT_NO_FATAL_FAILURE(setAndExpect(0));
  fillUp();
  for (int life = 1; life <= 3; ++life) {
    ASSERT_NO_FATAL_FAILURE(setAndExpect(life));
    daemon_.signal(SIGKILL);
    daemon_.wait();
    fs::remove(sandbox_.outside("/tmp/daemon.log"));
    ASSERT_NO_FATAL_FAILURE(start());
    const auto kept = client_->state("KEY").value;
    ASSERT_TRUE(kept && kept->dictionary());
    EXPECT_EQ(unsignedAt(*kept->dictionary(), "ROUND"), static_cast<std::uint64_t>(life));
    EXPECT_EQ(sandbox_.daemonLog().find("set aside"), std::string::npos);
  }
}

TEST_F(StateOnTheFullVolume, AValueForWhichThereIsNoRoomIsRefusedAndTheOldOneStays) {
  ASSERT_NO_FATAL_FAILURE(setAndExpect(7));
  fillUp();
  // More than the headroom and the reserve together, in values that a message can carry.
  sdk::Status status;
  int stored = 0;
  for (; stored < 40 && status.ok(); ++stored) {
    status = client_->setState("BIG" + std::to_string(stored),
                               Value(std::string(60'000, static_cast<char>('a' + stored % 26))));
    fillUp();
  }
  ASSERT_FALSE(status.ok());
  EXPECT_NE(status.error->text.find("space has to be freed on its volume"), std::string::npos)
      << status.error->text;
  EXPECT_GT(stored, 3);
  const std::string refused = "BIG" + std::to_string(stored - 1);
  EXPECT_EQ(client_->state(refused).value, std::nullopt);
  daemon_.signal(SIGKILL);
  daemon_.wait();
  fs::remove(sandbox_.outside("/tmp/daemon.log"));
  ASSERT_NO_FATAL_FAILURE(start());
  EXPECT_EQ(client_->state(refused).value, std::nullopt);
  EXPECT_EQ(client_->state("BIG0").value, Value(std::string(60'000, 'a')));
  const auto kept = client_->state("KEY").value;
  ASSERT_TRUE(kept && kept->dictionary());
  EXPECT_EQ(unsignedAt(*kept->dictionary(), "ROUND"), 7U);
}

}  // namespace
}  // namespace spacekeep::system_test
