// A volume that is filled, in virtual time: how much is left when the event comes, and whether
// purges keep up.
#include <gtest/gtest.h>

#include <algorithm>
#include <mutex>

#include "support/events/low_space_stream.h"
#include "support/queues/waiting.h"
#include "support/runtime/simulation.h"
#include "support/volumes/low_space_memory.h"
#include "tests/helpers/schedules.h"

namespace spacekeep {
namespace {

constexpr std::uint64_t kMiB = 1024 * 1024;
constexpr std::uint64_t kGiB = 1024 * kMiB;
constexpr std::uint64_t kSecond = 1'000'000'000;
constexpr std::uint64_t kPhases = 1'000'000;

/// A volume that is quiet until a moment and then filled at a steady rate.
class FillingVolume final : public SpaceSource {
 public:
  FillingVolume(std::uint64_t size, std::uint64_t available, std::uint64_t bytes_per_second)
      : size_(size), available_(available), bytes_per_second_(bytes_per_second) {}

  std::vector<VolumeSample> sampleLocalVolumes() override {
    std::vector<VolumeSample> samples = {
        {.volume = "/data",
         .file_system = 1,
         .space = {.size_bytes = size_, .available_bytes = availableNow()}}};
    memory_.judge(samples);
    return samples;
  }
  void setThresholdsChangedHandler(std::function<void()>) override {}

  std::uint64_t availableNow() {
    const std::scoped_lock lock(mutex_);
    settle();
    return available_;
  }
  void startFilling() {
    const std::scoped_lock lock(mutex_);
    settled_ticks_ = rt::ticks();
    is_filling_ = true;
  }
  void free(std::uint64_t bytes) {
    const std::scoped_lock lock(mutex_);
    settle();
    available_ = std::min(size_, available_ + bytes);
  }
  /// Bytes that found no room.
  std::uint64_t refused() {
    const std::scoped_lock lock(mutex_);
    settle();
    return refused_;
  }

 private:
  void settle() {
    if (!is_filling_) return;
    // Virtual ticks are nanoseconds.
    const std::uint64_t now = rt::ticks();
    const std::uint64_t wanted = (now - settled_ticks_) / 1000 * bytes_per_second_ / 1'000'000;
    settled_ticks_ += (now - settled_ticks_) / 1000 * 1000;
    const std::uint64_t taken = std::min(wanted, available_);
    available_ -= taken;
    refused_ += wanted - taken;
  }

  const std::uint64_t size_;
  LowSpaceMemory memory_;
  rt::Mutex mutex_;
  // Protected by mutex_.
  std::uint64_t available_;
  const std::uint64_t bytes_per_second_;
  bool is_filling_ = false;
  std::uint64_t settled_ticks_ = 0;
  std::uint64_t refused_ = 0;
};

/// Waits for a random part of `at_most_ns`: the burst may begin anywhere between two looks.
void waitForSomePhase(std::uint64_t at_most_ns) {
  rt::sleepNs(at_most_ns / kPhases * rt::choose(kPhases));
}

/// What was left when the first event came, after a burst from `available` on.
std::uint64_t leftAtFirstEvent(std::uint64_t size, std::uint64_t available,
                               std::uint64_t bytes_per_second) {
  FillingVolume volume(size, available, bytes_per_second);
  ConcurrentQueue queue({});
  CountingSemaphore handled(0);
  std::uint64_t left = 0;
  LowSpaceStream stream(volume, queue, [&](const Dictionary&) {
    left = volume.availableNow();
    handled.signal();
    rt::sleepNs(1000 * kSecond);
  });
  waitForSomePhase(200 * kSecond);
  volume.startFilling();
  handled.wait();
  return left;
}

TEST(LowSpaceFilling, ABurstOnTwoGibibytesIsReportedWithHalfOfTheThresholdLeft) {
  constexpr std::uint64_t kLow = 2 * kGiB / 20;
  for (const std::uint64_t rate : {10 * kMiB, 80 * kMiB, 160 * kMiB}) {
    for (const std::uint64_t available : {110 * kMiB, 150 * kMiB, 300 * kMiB, 1000 * kMiB}) {
      inEverySchedule(100, [&] {
        EXPECT_GE(leftAtFirstEvent(2 * kGiB, available, rate), kLow / 2 - kMiB) << available;
      });
    }
  }
}

TEST(LowSpaceFilling, ABurstOnALargeVolumeIsToo) {
  for (const std::uint64_t available : {501 * kMiB, 3 * kGiB, 20 * kGiB, 60 * kGiB}) {
    inEverySchedule(100, [&] {
      EXPECT_GE(leftAtFirstEvent(64 * kGiB, available, 160 * kMiB), 249 * kMiB) << available;
    });
  }
}

// Purges that end when they have their 250 MiB, and services that take a quarter of a second.
TEST(LowSpaceFilling, QuickPurgesKeepUpWithEightyMebibytesASecond) {
  for (const std::uint64_t available : {60 * kMiB, 110 * kMiB, 300 * kMiB, 1000 * kMiB}) {
    inEverySchedule(50, [&] {
      FillingVolume volume(2 * kGiB, available, 80 * kMiB);
      ConcurrentQueue queue({});
      LowSpaceStream stream(volume, queue, [&](const Dictionary&) {
        rt::sleepNs(kSecond / 4);
        volume.free(250 * kMiB);
      });
      waitForSomePhase(200 * kSecond);
      volume.startFilling();
      rt::sleepNs(600 * kSecond);
      EXPECT_EQ(volume.refused(), 0U) << available;
    });
  }
}

// A purge as it is by default: it frees its 250 MiB soon and waits out all its urgencies.
TEST(LowSpaceFilling, WhenAPurgeOfFifteenMinutesEndsTheNextOneBeginsAtOnce) {
  inEverySchedule(30, [] {
    FillingVolume volume(2 * kGiB, 300 * kMiB, 80 * kMiB);
    ConcurrentQueue queue({});
    std::vector<std::uint64_t> begun_ticks;
    LowSpaceStream stream(volume, queue, [&](const Dictionary&) {
      begun_ticks.push_back(rt::ticks());
      rt::sleepNs(kSecond / 4);
      volume.free(250 * kMiB);
      rt::sleepNs(900 * kSecond);
    });
    volume.startFilling();
    rt::sleepNs(7200 * kSecond);
    ASSERT_GE(begun_ticks.size(), 7U);
    for (std::size_t i = 1; i < begun_ticks.size(); ++i) {
      EXPECT_LE(begun_ticks[i] - begun_ticks[i - 1], 901 * kSecond);
    }
  });
}

// Nobody has anything to give, and nobody uses anything: hours go by with few looks and few events.
TEST(LowSpaceFilling, AShortVolumeThatCannotBeHelpedCostsLittle) {
  inEverySchedule(10, [] {
    FillingVolume volume(2 * kGiB, 50 * kMiB, 0);
    ConcurrentQueue queue({});
    int events = 0;
    LowSpaceStream stream(volume, queue, [&](const Dictionary&) { ++events; });
    rt::sleepNs(24 * 3600 * kSecond);
    EXPECT_GE(events, 24);
    EXPECT_LE(events, 30);
    EXPECT_LE(stream.looks(), 2U * 24 * 60);
  });
}

TEST(LowSpaceFilling, FarFromTheThresholdThereIsAtMostOneLookAMinute) {
  for (const std::uint64_t available : {kGiB, 2 * kGiB}) {
    inEverySchedule(10, [&] {
      FillingVolume volume(2 * kGiB, available, 0);
      ConcurrentQueue queue({});
      LowSpaceStream stream(volume, queue, [](const Dictionary&) {});
      rt::sleepNs(3600 * kSecond);
      EXPECT_LE(stream.looks(), 61U);
    });
  }
}

}  // namespace
}  // namespace spacekeep
