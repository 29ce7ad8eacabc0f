#include "tests/helpers/schedules.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <iostream>

#include "support/runtime/threads/time_scale.h"

namespace spacekeep {
namespace {

constexpr unsigned kMaxRounds = 10;

class FastClocks {
 public:
  FastClocks() { rt::setTimeScaleForTests(kTestTimeScale); }
  ~FastClocks() { rt::setTimeScaleForTests(before_); }
  FastClocks(const FastClocks&) = delete;
  FastClocks& operator=(const FastClocks&) = delete;

 private:
  const std::uint32_t before_ = rt::timeScaleForTests();
};

}  // namespace

void inEverySchedule(unsigned seeds, const std::function<void()>& body) {
  const FastClocks clocks;
  const bool failed_before = ::testing::Test::HasFailure();
  for (unsigned round = 1; round <= std::min(seeds, kMaxRounds); ++round) {
    body();
    if (failed_before || !::testing::Test::HasFailure()) continue;
    std::cout << "failed on real threads in round " << round << std::endl;
    return;
  }
}

bool onRealThreads() { return true; }

}  // namespace spacekeep
