// The daemon is killed at any moment, a thousand times if asked to: what it has answered is there.
//
// SPACEKEEP_STATE_KILLS=1000 makes the run longer than the few kills of every day.
#include <gtest/gtest.h>
#include <spacekeep/client.h>

#include <algorithm>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <deque>
#include <filesystem>
#include <numeric>
#include <random>
#include <string>
#include <thread>
#include <vector>

#include "support/runtime/runtime.h"
#include "tests/linux/system/sandbox.h"
#include "tests/linux/system/state_client.h"
#include "tests/linux/system/state_writer.h"

namespace spacekeep::system_test {
namespace {

constexpr int kEverydayKills = 25;
constexpr std::uint64_t kSlowestRestartMs = 5000;
constexpr std::uint64_t kMs = 1'000'000;

int killsAskedFor() {
  const char* asked = std::getenv("SPACEKEEP_STATE_KILLS");
  return asked == nullptr ? kEverydayKills : std::max(1, std::atoi(asked));
}

class StateKills : public testing::Test {
 protected:
  void SetUp() override {
    sandbox_.addVolume("disk", "ext4", 64);
    sandbox_.start();
    std::filesystem::create_directory(sandbox_.volume("disk") + "/state");
    std::filesystem::create_directory_symlink("/volumes/disk/state",
                                              sandbox_.outside("/var/lib/spacekeep"));
    for (int i = 0; i < 4; ++i) writers_.emplace_back(i);
  }

  /// The time from the start to the first answer.
  std::uint64_t startAndCheckMs() {
    const std::uint64_t start_ms = monotonicMs();
    daemon_ = sandbox_.spawn({"/programs/daemon/spacekeepd"}, "daemon.log");
    const auto client = connectToStarting(sandbox_);
    const std::uint64_t took_ms = monotonicMs() - start_ms;
    if (client == nullptr) {
      ADD_FAILURE() << "no answer after a start: " << sandbox_.daemonLog();
      return took_ms;
    }
    for (StateWriter& writer : writers_) EXPECT_TRUE(writer.check(*client));
    return took_ms;
  }
  [[nodiscard]] std::uint64_t answers() const {
    return std::accumulate(
        writers_.begin(), writers_.end(), std::uint64_t{0},
        [](std::uint64_t sum, const StateWriter& writer) { return sum + writer.answers(); });
  }
  void writeUntilTheEnd(StateWriter& writer) {
    auto client = sdk::Client::connect({.socket_path = sandbox_.socketPath(), .on_disconnect = {}});
    if (client) writer.writeUntilTheEnd(*client);
  }
  void writeAndKillAfter(std::uint64_t delay_ns) {
    std::vector<std::thread> threads;
    threads.reserve(writers_.size());
    for (StateWriter& writer : writers_) {
      threads.emplace_back([this, &writer] { writeUntilTheEnd(writer); });
    }
    rt::sleepNs(delay_ns);
    daemon_.signal(SIGKILL);
    daemon_.wait();
    for (std::thread& thread : threads) thread.join();
  }

  Sandbox sandbox_;
  Process daemon_;
  std::deque<StateWriter> writers_;
};

TEST_F(StateKills, LoseNothingThatWasAnsweredAndNeverKeepTheDaemonFromStarting) {
  const int asked_kills = killsAskedFor();
  int kills = 0;
  std::mt19937 random(20'240'229);
  std::uint64_t slowest_ms = startAndCheckMs();
  // On a busy machine a kill may come before the first answer: it goes on until there were enough
  // that could have been lost.
  const auto enough = [&] {
    return kills >= asked_kills && answers() > static_cast<std::uint64_t>(kills);
  };
  for (; !enough() && kills < 10 * asked_kills && !HasFailure(); ++kills) {
    writeAndKillAfter(random() % (200 * kMs));
    slowest_ms = std::max(slowest_ms, startAndCheckMs());
    const std::string log = sandbox_.daemonLog();
    EXPECT_EQ(log.find("set aside"), std::string::npos) << log;
    EXPECT_EQ(log.find("cannot be opened"), std::string::npos) << log;
  }
  std::uint64_t lost = 0;
  for (const StateWriter& writer : writers_) lost += writer.lost();
  EXPECT_EQ(lost, 0U);
  EXPECT_GT(answers(), static_cast<std::uint64_t>(kills));
  EXPECT_LT(slowest_ms, kSlowestRestartMs);
  std::printf("%d kills, %llu answered writes, %llu lost, slowest restart %llu ms\n", kills,
              static_cast<unsigned long long>(answers()), static_cast<unsigned long long>(lost),
              static_cast<unsigned long long>(slowest_ms));
}

}  // namespace
}  // namespace spacekeep::system_test
