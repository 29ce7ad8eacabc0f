// Two thousand purges waiting at once: everybody is served, and the daemon stays small.
#include <gtest/gtest.h>
#include <spacekeep/client.h>
#include <spacekeep/service.h>

#include <algorithm>
#include <atomic>
#include <fstream>
#include <functional>
#include <memory>
#include <regex>
#include <string>
#include <vector>

#include "support/runtime/guarded.h"
#include "support/runtime/runtime.h"
#include "support/values/text.h"
#include "tests/linux/system/sandbox.h"

namespace spacekeep::system_test {
namespace {

// A sanitizer keeps freed memory back and a shadow of all of it: the bound is about the program as
// it ships.
#if defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
constexpr bool kIsAsShipped = false;
#else
constexpr bool kIsAsShipped = true;
#endif

constexpr int kConnections = 200;
constexpr int kPurgesEach = 10;

/// Gives one file of a directory for each request, as a cache of equal items would.
class OneFileEach : public sdk::Service {
 public:
  explicit OneFileEach(std::string directory) : directory_(std::move(directory)) {
    for (int i = 0; i < kConnections * kPurgesEach + 100; ++i) {
      std::ofstream(pathOf(i)) << std::string(4096, 'x');
    }
  }
  sdk::Answer purge(const sdk::Job&) override {
    std::remove(pathOf(next_.fetch_add(1)).c_str());
    return {.amount = 4096, .more = {}};
  }

 private:
  [[nodiscard]] std::string pathOf(int number) const {
    return directory_ + "/" + std::to_string(number);
  }
  std::string directory_;
  std::atomic<int> next_{0};
};

struct Footprint {
  long threads = 0;
  long resident_kib = 0;
};

Footprint footprintOf(pid_t pid) {
  std::ifstream status("/proc/" + std::to_string(pid) + "/status");
  Footprint footprint;
  const std::regex field("(Threads|VmRSS):\\s+(\\d+).*");
  for (std::string line; std::getline(status, line);) {
    std::smatch match;
    if (!std::regex_match(line, match, field)) continue;
    (match[1] == "Threads" ? footprint.threads : footprint.resident_kib) = std::stol(match[2]);
  }
  return footprint;
}

/// The most that the process has had until `done`, or for two minutes.
Footprint peakUntil(pid_t pid, const std::function<bool()>& done) {
  Footprint peak;
  for (int i = 0; i < 12000 && !done(); ++i) {
    const Footprint now = footprintOf(pid);
    peak.threads = std::max(peak.threads, now.threads);
    peak.resident_kib = std::max(peak.resident_kib, now.resident_kib);
    rt::sleepNs(10'000'000);
  }
  return peak;
}

void connectAll(const std::string& socket_path, std::vector<sdk::Client>& clients) {
  for (int i = 0; i < kConnections; ++i) {
    auto client = sdk::Client::connect({.socket_path = socket_path, .on_disconnect = {}});
    ASSERT_TRUE(client) << client.error().text;
    clients.push_back(std::move(*client));
  }
}

TEST(Flood, TwoThousandPurgesFromTwoHundredConnectionsAreAllAnsweredInBoundedSpace) {
  Sandbox sandbox;
  sandbox.addVolume("tmp", "tmpfs", 64);
  sandbox.start();
  Process daemon = sandbox.startDaemon();

  sdk::CheckInOptions options;
  options.socket_path = sandbox.socketPath();
  auto host = sdk::ServiceHost::checkIn(
      "one-file-each", std::make_shared<OneFileEach>(sandbox.volume("tmp")), options);
  ASSERT_TRUE(host);
  ASSERT_TRUE(sandbox.waitForText("/tmp/daemon.log", "ping got pong"));

  std::vector<sdk::Client> clients;
  ASSERT_NO_FATAL_FAILURE(connectAll(sandbox.socketPath(), clients));
  // One purge that waits out its urgencies holds the purge queue while the others arrive.
  std::atomic<int> answered{0};
  std::atomic<int> reached{0};
  rt::Guarded<std::string> shortfalls;
  const auto book = [&](const sdk::Reply& reply) {
    if (reply.outcome && unsignedAt(*reply.outcome, "SPACEKEEP_AMOUNT") >= 4096U) {
      ++reached;
    } else {
      const std::string what = reply.outcome ? textOf(*reply.outcome) : "no outcome";
      shortfalls.update([&](std::string& all) { all += what + "\n"; });
    }
    ++answered;
  };
  sdk::PurgeRequest slow{.volume = "/volumes/tmp",
                         .amount = 0,
                         .urgency = 1,
                         .timeout_seconds = 2,
                         .token = {},
                         .finish_early = false};
  clients[0].purgeAsync(slow, [&](const sdk::Reply&) { ++answered; });
  sdk::PurgeRequest one{.volume = "/volumes/tmp",
                        .amount = 4096,
                        .urgency = 1,
                        // Longer than a busy machine may hold up the service.
                        .timeout_seconds = 60,
                        .token = {},
                        .finish_early = true};
  for (int i = 0; i < kPurgesEach; ++i) {
    for (sdk::Client& client : clients) client.purgeAsync(one, book);
  }
  const int expected = kConnections * kPurgesEach + 1;
  const Footprint peak = peakUntil(daemon.pid(), [&] { return answered >= expected; });
  EXPECT_EQ(answered, expected);
  EXPECT_EQ(reached, expected - 1) << shortfalls.get();
  EXPECT_LE(peak.threads, 100);
  if (kIsAsShipped) {
    EXPECT_LE(peak.resident_kib, 64 * 1024);
  }
  RecordProperty("peak_threads", std::to_string(peak.threads));
  RecordProperty("peak_resident_kib", std::to_string(peak.resident_kib));
  std::printf("peak threads %ld, peak resident %ld KiB\n", peak.threads, peak.resident_kib);
}

}  // namespace
}  // namespace spacekeep::system_test
