// Cancelling, and requests that meet.
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <time.h>

#include <algorithm>
#include <atomic>
#include <filesystem>
#include <limits>
#include <map>

#include "services/cachedir/engine/elapsed.h"
#include "support/runtime/runtime.h"
#include "tests/linux/cachedir/cache_world.h"

namespace spacekeep::cachedir {
namespace {

constexpr std::uint64_t kAll = std::numeric_limits<std::uint64_t>::max();
constexpr std::uint64_t kCancelLimitMs = 50;

/// Of this thread: time during which the machine ran something else does not count.
std::uint64_t processorNs() {
  timespec used{};
  EXPECT_EQ(::clock_gettime(CLOCK_THREAD_CPUTIME_ID, &used), 0);
  return static_cast<std::uint64_t>(used.tv_sec) * 1'000'000'000 +
         static_cast<std::uint64_t>(used.tv_nsec);
}

void fill(const Volume& volume, int files) {
  for (int i = 0; i < files; ++i) {
    writeFile(volume / ("d" + std::to_string(i % 50) + "/f" + std::to_string(i)), 4096,
              100 + i * 1e-6);
  }
}

std::uint64_t remaining(const Volume& volume) {
  std::uint64_t count = 0;
  for (const auto& entry : std::filesystem::recursive_directory_iterator(volume.path())) {
    if (entry.is_regular_file()) ++count;
  }
  return count;
}

TEST(Cancelling, ADeletionStopsWithinFiftyMillisecondsAndTellsWhatItFreed) {
  const Volume volume("ext4");
  fill(volume, 20000);
  CacheCleaner cleaner(rulesFor(volume.path()));
  std::uint64_t cancelled_at_ns = 0;
  std::uint64_t count = 0;
  const FreeResult result = cleaner.free({.amount = kAll, .urgency = 4}, [&](const TakenFile&) {
    if (++count == 1000) {
      cleaner.cancel();
      cancelled_at_ns = processorNs();
    }
  });
  EXPECT_LT(processorNs() - cancelled_at_ns, kCancelLimitMs * kNsPerMs);
  EXPECT_TRUE(result.cancelled);
  EXPECT_EQ(result.files, 1000U);
  EXPECT_EQ(result.bytes, 1000U * 4096);
  EXPECT_EQ(remaining(volume), 19000U);
}

TEST(Cancelling, AWalkStopsWithinFiftyMillisecondsAndNothingIsDeleted) {
  const Volume volume("tmpfs");
  fill(volume, 50000);
  CacheCleaner cleaner(rulesFor(volume.path()));
  std::uint64_t asked = 0;
  std::uint64_t cancelled_at_ns = 0;
  FreeRequest request{.amount = kAll, .urgency = 4};
  request.cancelled = [&] {
    if (++asked == 20000) cancelled_at_ns = processorNs();
    return asked >= 20000;
  };
  const FreeResult result = cleaner.free(request);
  EXPECT_LT(processorNs() - cancelled_at_ns, kCancelLimitMs * kNsPerMs);
  EXPECT_TRUE(result.cancelled);
  EXPECT_EQ(result.bytes, 0U);
  EXPECT_EQ(remaining(volume), 50000U);
}

TEST(Cancelling, TheWaitForSpaceOnASlowFileSystemEndsToo) {
  const Volume volume("btrfs");
  CacheCleaner cleaner(rulesFor(volume.path()));
  // A wait takes no processor time, so here the clock has to tell. The machine may hold up some of
  // the rounds; it is the wait itself that would be too long in all of them.
  std::uint64_t quickest_ns = kAll;
  for (int round = 0; round < 10 && quickest_ns >= kCancelLimitMs * kNsPerMs; ++round) {
    for (int i = 0; i < 40; ++i) writeFile(volume / ("f" + std::to_string(i)), kMiB);
    volume.settle();
    std::uint64_t cancelled_at = 0;
    const FreeResult result =
        cleaner.free({.amount = 10 * kMiB, .urgency = 4}, [&, count = 0](const TakenFile&) mutable {
          if (++count < 10) return;
          cleaner.cancel();
          cancelled_at = rt::ticks();
        });
    quickest_ns = std::min(quickest_ns, elapsedNs(cancelled_at));
    EXPECT_EQ(result.bytes, 10 * kMiB);
  }
  EXPECT_LT(quickest_ns, kCancelLimitMs * kNsPerMs);
}

TEST(Cancelling, ACancelDoesNotTouchTheRequestsThatFollow) {
  const Volume volume("tmpfs");
  writeFile(volume / "f", kMiB);
  CacheCleaner cleaner(rulesFor(volume.path()));
  cleaner.cancel();
  const FreeResult result = cleaner.free({.amount = kMiB, .urgency = 4});
  EXPECT_FALSE(result.cancelled);
  EXPECT_EQ(result.bytes, kMiB);
}

TEST(Meeting, TwoRequestsRunOneAfterTheOtherAndTakeEachFileOnce) {
  const Volume volume("tmpfs");
  fill(volume, 2000);
  CacheCleaner cleaner(rulesFor(volume.path()));
  std::atomic<int> running{0};
  std::atomic<bool> overlapped{false};
  std::map<std::string, int> taken[2];
  FreeResult results[2];
  const auto ask = [&](std::size_t who) {
    results[who] = cleaner.free({.amount = 500 * 4096, .urgency = 4}, [&](const TakenFile& file) {
      if (running.fetch_add(1) != 0) overlapped = true;
      ++taken[who][file.path];
      running.fetch_sub(1);
    });
  };
  rt::Thread first("first", [&] { ask(0); });
  rt::Thread second("second", [&] { ask(1); });
  first.join();
  second.join();
  EXPECT_FALSE(overlapped);
  for (const FreeResult& result : results) EXPECT_EQ(result.bytes, 500U * 4096);
  for (const auto& [path, times] : taken[0]) EXPECT_FALSE(taken[1].contains(path)) << path;
  EXPECT_EQ(remaining(volume), 1000U);
}

TEST(Meeting, ACancelAlsoReachesTheRequestThatWaits) {
  const Volume volume("tmpfs");
  fill(volume, 100);
  CacheCleaner cleaner(rulesFor(volume.path()));
  std::atomic<bool> waiting{false};
  FreeResult waited;
  rt::Thread second;
  const FreeResult ran = cleaner.free({.amount = kAll, .urgency = 4}, [&](const TakenFile&) {
    if (second.joinable()) return;
    second = rt::Thread("second", [&] {
      FreeRequest request{.amount = kAll, .urgency = 4};
      request.cancelled = [&] {
        waiting = true;  // asked only once the request has noted the cancels before it
        return false;
      };
      waited = cleaner.free(request);
    });
    while (!waiting) rt::sleepNs(kNsPerMs);
    cleaner.cancel();
  });
  second.join();
  EXPECT_TRUE(ran.cancelled);
  EXPECT_EQ(ran.files, 1U);
  EXPECT_TRUE(waited.cancelled);
  EXPECT_EQ(waited.files, 0U);
  EXPECT_EQ(remaining(volume), 99U);
}

}  // namespace
}  // namespace spacekeep::cachedir
