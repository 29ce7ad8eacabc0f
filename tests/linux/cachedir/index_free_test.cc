// Freeing by way of the index: the same files, the same checks.
#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <filesystem>
#include <limits>

#include "services/cachedir/engine/elapsed.h"
#include "services/cachedir/engine/unique_fd.h"
#include "tests/linux/cachedir/cache_world.h"
#include "tests/linux/cachedir/index_world.h"

namespace spacekeep::cachedir {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;
using testing::SizeIs;

constexpr std::uint64_t kAll = std::numeric_limits<std::uint64_t>::max();

class FreeingByIndex : public testing::Test {
 protected:
  FreeingByIndex() {
    for (int i = 0; i < 60; ++i) {
      writeFile(cache_ + "/d" + std::to_string(i % 7) + "/f" + std::to_string(i),
                4096 * static_cast<std::uint64_t>(i % 4), 100 + i * 17 % 60);
    }
  }
  void begin() {
    world_ = std::make_unique<IndexWorld>(rules_);
    world_->compared();
  }
  Observed free(const FreeRequest& request) { return freeWith(world_->cleaner(), request); }
  /// The request is served from the index, and by nothing else.
  Observed freeKnown(const FreeRequest& request) {
    const CacheIndex::History before = world_->index().history();
    Observed observed = free(request);
    EXPECT_EQ(world_->index().history().walked, before.walked);
    EXPECT_GT(world_->index().history().answered, before.answered);
    return observed;
  }

  const Volume volume_{"tmpfs"};
  const std::string cache_ = volume_ / "cache";
  Rules rules_ = rulesFor(cache_);
  std::unique_ptr<IndexWorld> world_;
};

TEST_F(FreeingByIndex, TheVeryFilesGoThatAWalkWouldTakeInTheSameOrder) {
  begin();
  std::filesystem::create_hard_link(cache_ + "/d1/f1", cache_ + "/d2/other-name");
  CacheCleaner walker(rules_);
  FreeRequest request{.amount = 30 * 4096, .urgency = 4, .dry_run = true};
  const Observed walked = freeWith(walker, request);
  const Observed dry = freeKnown(request);
  EXPECT_EQ(dry.paths, walked.paths);
  EXPECT_EQ(dry.result.bytes, walked.result.bytes);
  request.dry_run = false;
  EXPECT_EQ(freeKnown(request).paths, walked.paths);
  EXPECT_EQ(world_->known().files[3], 45 - walked.result.files);
}

TEST_F(FreeingByIndex, TheDailyPassTakesEmptyFilesToo) {
  rules_.directories[0].periodic_unused_seconds = 90 * kSecondsPerDay;
  begin();
  FreeRequest daily;
  daily.periodic = true;
  EXPECT_THAT(freeKnown(daily).paths, SizeIs(60));
}

TEST_F(FreeingByIndex, AHardLinkThatTheIndexDoesNotKnowOfKeepsItsFile) {
  begin();
  std::filesystem::create_directories(volume_ / "outside");
  std::filesystem::create_hard_link(cache_ + "/d1/f1", volume_ / "outside/precious");
  const Observed seen = freeKnown({.amount = kAll, .urgency = 4});
  EXPECT_TRUE(exists(cache_ + "/d1/f1"));
  EXPECT_EQ(seen.result.left.of(Left::kLinked), 1U);
  EXPECT_EQ(seen.result.files, 44U);
}

TEST_F(FreeingByIndex, WhatSomebodyHasOpenStays) {
  begin();
  const UniqueFd fd(::open((cache_ + "/d1/f1").c_str(), O_RDONLY | O_CLOEXEC));
  EXPECT_THAT(freeKnown({.amount = kAll, .urgency = 4}).paths, SizeIs(44));
  EXPECT_TRUE(exists(cache_ + "/d1/f1"));
}

TEST_F(FreeingByIndex, APurgeDoesNotWaitForAnIndexToBeBuilt) {
  world_ = std::make_unique<IndexWorld>(rules_);
  EXPECT_THAT(free({.amount = kAll, .urgency = 4}).paths, SizeIs(45));
  EXPECT_EQ(world_->index().history().built, 0U);
}

TEST_F(FreeingByIndex, AnIndexInOtherHandsIsNotWaitedFor) {
  begin();
  const auto held = world_->index().acquire(0);
  ASSERT_TRUE(held);
  EXPECT_FALSE(world_->index().acquire(0));
  const CacheIndex::History before = world_->index().history();
  world_->compared();
  EXPECT_THAT(free({.amount = 4096, .urgency = 4}).paths, SizeIs(1));
  EXPECT_EQ(world_->index().history().answered, before.answered);
}

TEST_F(FreeingByIndex, ACancelledEstimateLeavesNoHalfIndex) {
  world_ = std::make_unique<IndexWorld>(rules_);
  int asked = 0;
  const Estimate cut =
      world_->cleaner().estimate({}, CancelToken([&asked] { return ++asked > 60; }));
  EXPECT_TRUE(cut.cancelled);
  EXPECT_EQ(world_->compared().files[3], 45U);
  EXPECT_EQ(world_->known().files[3], 45U);
}

TEST_F(FreeingByIndex, SeveralPassesKeepTheOrder) {
  const auto index = std::make_shared<CacheIndex>(withoutThread());
  CacheCleaner::Surroundings surroundings;
  surroundings.index = index;
  CacheCleaner few(rules_, {.max_files = 4}, surroundings);
  static_cast<void>(few.estimate({}));
  CacheCleaner walker(rules_);
  const FreeRequest dry{.amount = kAll, .urgency = 4, .dry_run = true};
  const std::vector<std::string> expected = freeWith(walker, dry).paths;
  EXPECT_EQ(freeWith(few, {.amount = kAll, .urgency = 4}).paths, expected);
  EXPECT_EQ(index->history().walked, 0U);
  EXPECT_THAT(freeWith(few, dry).paths, IsEmpty());
}

}  // namespace
}  // namespace spacekeep::cachedir
