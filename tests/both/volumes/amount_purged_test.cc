#include <gtest/gtest.h>

#include "support/volumes/volumes.h"

namespace spacekeep {
namespace {

class OneVolume final : public Volumes {
 public:
  explicit OneVolume(std::uint64_t free_bytes) : free_bytes_(free_bytes) {}
  std::vector<std::string> getLocalVolumes() override { return {"/data"}; }
  std::vector<std::string> lowSpaceVolumes() override { return {}; }
  bool validateVolume(const Dictionary&) override { return true; }
  std::uint64_t volumeFreespace(const Value* volume) override {
    return volume != nullptr && *volume == Value("/data") ? free_bytes_ : 0;
  }
  void setLowSpaceSettings(const LowSpaceSettings&) override {}

 private:
  const std::uint64_t free_bytes_;
};

std::uint64_t purged(std::uint64_t free_bytes, const Dictionary& request) {
  return OneVolume(free_bytes).amountPurged(request);
}

TEST(AmountPurged, IsTheGrowthOfTheFreeSpace) {
  EXPECT_EQ(purged(1500, {{"SPACEKEEP_VOLUME", "/data"}, {"SPACEKEEP_FREESPACE_BEGIN", 1000}}),
            500U);
  EXPECT_EQ(purged(1000, {{"SPACEKEEP_VOLUME", "/data"}, {"SPACEKEEP_FREESPACE_BEGIN", 0}}), 1000U);
}

TEST(AmountPurged, IsNeverNegative) {
  EXPECT_EQ(purged(999, {{"SPACEKEEP_VOLUME", "/data"}, {"SPACEKEEP_FREESPACE_BEGIN", 1000}}), 0U);
  EXPECT_EQ(purged(1000, {{"SPACEKEEP_VOLUME", "/data"}, {"SPACEKEEP_FREESPACE_BEGIN", 1000}}), 0U);
}

TEST(AmountPurged, IsNothingWithoutABeginning) {
  EXPECT_EQ(purged(1500, {{"SPACEKEEP_VOLUME", "/data"}}), 0U);
  EXPECT_EQ(purged(1500, {{"SPACEKEEP_VOLUME", "/data"}, {"SPACEKEEP_FREESPACE_BEGIN", "10"}}), 0U);
}

TEST(AmountPurged, IsNothingOnAnUnknownVolume) {
  EXPECT_EQ(purged(1500, {{"SPACEKEEP_VOLUME", "/nowhere"}, {"SPACEKEEP_FREESPACE_BEGIN", 0}}), 0U);
  EXPECT_EQ(purged(1500, {{"SPACEKEEP_FREESPACE_BEGIN", 0}}), 0U);
}

}  // namespace
}  // namespace spacekeep
