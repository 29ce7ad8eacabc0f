#include "support/events/low_space_stream.h"

#include <gtest/gtest.h>

#include <mutex>

#include "support/queues/waiting.h"
#include "tests/helpers/schedules.h"

namespace spacekeep {
namespace {

constexpr std::uint64_t kMiB = 1024 * 1024;
constexpr std::uint64_t kSecond = 1'000'000'000;

/// One volume of 10 GiB whose space the test sets.
class OneVolume final : public SpaceSource {
 public:
  std::vector<VolumeSample> sampleLocalVolumes() override {
    const std::scoped_lock lock(mutex_);
    return {sample_};
  }
  void set(std::uint64_t available, SpaceLevel level) {
    const std::scoped_lock lock(mutex_);
    const VolumeSpace space{.size_bytes = 10240 * kMiB, .available_bytes = available};
    sample_ = {.volume = "/data",
               .file_system = 1,
               .space = space,
               .thresholds = spaceThresholds(space, {}),
               .level = level};
  }
  void setThresholdsChangedHandler(std::function<void()>) override {}

 private:
  rt::Mutex mutex_;
  VolumeSample sample_;  // protected by mutex_
};

TEST(LowSpaceStream, AShortVolumeGivesAnEventWithItsFlags) {
  inEverySchedule(50, [] {
    OneVolume volume;
    volume.set(100 * kMiB, SpaceLevel::kVeryLow);
    ConcurrentQueue queue({});
    CountingSemaphore handled(0);
    Dictionary event;
    LowSpaceStream stream(volume, queue, [&](const Dictionary& got) {
      event = got;
      handled.signal();
    });
    handled.wait();
    EXPECT_EQ(event, (Dictionary{{"_Flags", 0x200}}));
  });
}

TEST(LowSpaceStream, AVolumeThatFillsUpIsNoticed) {
  inEverySchedule(50, [] {
    OneVolume volume;
    volume.set(900 * kMiB, SpaceLevel::kEnough);
    ConcurrentQueue queue({});
    CountingSemaphore handled(0);
    LowSpaceStream stream(volume, queue, [&](const Dictionary&) { handled.signal(); });
    volume.set(400 * kMiB, SpaceLevel::kLow);
    handled.wait();
    EXPECT_GE(stream.looks(), 1U);
  });
}

TEST(LowSpaceStream, AChangedMountTableIsLookedAtWithoutWaiting) {
  inEverySchedule(50, [] {
    OneVolume volume;
    volume.set(9000 * kMiB, SpaceLevel::kEnough);
    ConcurrentQueue queue({});
    CountingSemaphore handled(0);
    const std::uint64_t began = rt::ticks();
    LowSpaceStream stream(volume, queue, [&](const Dictionary&) { handled.signal(); });
    volume.set(400 * kMiB, SpaceLevel::kLow);
    stream.lookNow();
    handled.wait();
    if (!onRealThreads()) {
      EXPECT_LT(rt::ticks() - began, 3 * kSecond);
    }
  });
}

TEST(LowSpaceStream, OneEventIsHandledAtATime) {
  inEverySchedule(30, [] {
    OneVolume volume;
    volume.set(0, SpaceLevel::kVeryLow);
    ConcurrentQueue queue({});
    CountingSemaphore handled(0);
    std::atomic<int> running{0};
    LowSpaceStream stream(volume, queue, [&](const Dictionary&) {
      EXPECT_EQ(++running, 1);
      rt::sleepNs(90 * kSecond);  // longer than the pause before the next event
      --running;
      handled.signal();
    });
    for (int i = 0; i < 2; ++i) handled.wait();
  });
}

TEST(LowSpaceStream, AShortageDuringTheHandlingOfAnEventIsReportedWhenItEnds) {
  inEverySchedule(30, [] {
    OneVolume volume;
    volume.set(400 * kMiB, SpaceLevel::kLow);
    ConcurrentQueue queue({});
    CountingSemaphore handled(0);
    std::vector<Dictionary> events;
    std::vector<std::uint64_t> times;
    LowSpaceStream stream(volume, queue, [&](const Dictionary& event) {
      events.push_back(event);
      times.push_back(rt::ticks());
      if (events.size() == 1) {
        volume.set(100 * kMiB, SpaceLevel::kVeryLow);
        rt::sleepNs(90 * kSecond + kSecond / 2);  // in the middle between two looks
      }
      handled.signal();
    });
    for (int i = 0; i < 2; ++i) handled.wait();
    ASSERT_GE(events.size(), 2U);
    EXPECT_EQ(events[0], (Dictionary{{"_Flags", 0x4}}));
    EXPECT_EQ(events[1], (Dictionary{{"_Flags", 0x200}}));
    if (!onRealThreads()) {
      EXPECT_LT(times[1] - times[0], 90 * kSecond + kSecond * 3 / 4) << "the end waits for no look";
    }
  });
}

TEST(LowSpaceStream, ItsEndWaitsForTheHandlerThatRuns) {
  inEverySchedule(50, [] {
    OneVolume volume;
    volume.set(0, SpaceLevel::kVeryLow);
    ConcurrentQueue queue({});
    CountingSemaphore begun(0);
    bool ended = false;
    {
      LowSpaceStream stream(volume, queue, [&](const Dictionary&) {
        begun.signal();
        rt::sleepNs(5 * kSecond);
        ended = true;
      });
      begun.wait();
    }
    EXPECT_TRUE(ended);
  });
}

}  // namespace
}  // namespace spacekeep
