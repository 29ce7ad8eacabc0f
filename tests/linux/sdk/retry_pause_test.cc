#include "sdk/retry_pause.h"

#include <gtest/gtest.h>

#include <cstdint>

namespace spacekeep::sdk {
namespace {

constexpr std::uint64_t kMs = 1'000'000;

struct PauseCase {
  unsigned failures;
  std::uint64_t random;
  std::uint64_t pause_ns;
};

TEST(RetryPause, TheRandomNumberPicksAPauseBetweenTheShortestAndAGrowingLimit) {
  const PauseCase cases[] = {
      {1, 0, 100 * kMs},
      {1, 100 * kMs, 200 * kMs},      // the limit itself can be drawn
      {1, 100 * kMs + 1, 100 * kMs},  // and the next number begins again
      {2, 300 * kMs, 400 * kMs},
      {3, 700 * kMs, 800 * kMs},
      {8, 25'500 * kMs, 25'600 * kMs},
      {9, 29'900 * kMs, 30'000 * kMs},
      {1000, 29'900 * kMs, 30'000 * kMs},
      {0, 100 * kMs, 200 * kMs},  // nobody pauses without a failure, but the answer stays sane
      {UINT32_MAX, 29'900 * kMs + 1, 100 * kMs},
  };
  for (const auto& c : cases) {
    EXPECT_EQ(retryPauseNs(c.failures, c.random), c.pause_ns) << c.failures << ' ' << c.random;
  }
}

TEST(RetryPause, EveryPauseLiesBetweenATenthAndThirtySeconds) {
  std::uint64_t random = 88172645463325252U;
  for (unsigned i = 0; i < 20'000; ++i) {
    random ^= random << 13;
    random ^= random >> 7;
    random ^= random << 17;
    const std::uint64_t pause_ns = retryPauseNs(i % 40, random);
    ASSERT_GE(pause_ns, 100 * kMs);
    ASSERT_LE(pause_ns, 30'000 * kMs);
  }
}

}  // namespace
}  // namespace spacekeep::sdk
