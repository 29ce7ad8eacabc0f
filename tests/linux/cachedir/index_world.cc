#include "tests/linux/cachedir/index_world.h"

#include <gtest/gtest.h>

#include "tests/linux/cachedir/cache_world.h"

namespace spacekeep::cachedir {

CacheIndex::Settings withoutThread() {
  CacheIndex::Settings settings;
  settings.inbox.own_thread = false;
  return settings;
}

IndexWorld::IndexWorld(const Rules& rules, const CacheIndex::Settings& settings)
    : now_ns_(rt::wallClockNs()),
      index_(std::make_shared<CacheIndex>(settings)),
      cleaner_(rules, {}, surroundings(index_)),
      walker_(rules, {}, surroundings(nullptr)) {}

CacheCleaner::Surroundings IndexWorld::surroundings(std::shared_ptr<CacheIndex> index) {
  return {std::move(index), [this] { return now_ns_; }};
}

Estimate IndexWorld::compared(const std::optional<std::string>& volume) {
  now_ns_ = rt::wallClockNs() + offset_ns_;
  Estimate indexed = cleaner_.estimate(volume);
  const Estimate walked = walker_.estimate(volume);
  EXPECT_EQ(indexed.bytes, walked.bytes);
  EXPECT_EQ(indexed.files, walked.files);
  problems_.insert(problems_.end(), indexed.problems.begin(), indexed.problems.end());
  return indexed;
}

Estimate IndexWorld::known(const std::optional<std::string>& volume) {
  const CacheIndex::History before = index_->history();
  Estimate estimate = compared(volume);
  EXPECT_EQ(index_->history().built, before.built);
  EXPECT_EQ(index_->history().walked, before.walked);
  EXPECT_GT(index_->history().answered, before.answered);
  return estimate;
}

}  // namespace spacekeep::cachedir
