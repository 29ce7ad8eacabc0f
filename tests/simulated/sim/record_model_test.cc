// The model that the daemon's record of recent answers is compared with, at its exact limits.
#include <gtest/gtest.h>

#include "sim/invariants/system/record_model.h"

namespace spacekeep::sim {
namespace {

constexpr std::int64_t kSecondNs = 1'000'000'000;
constexpr std::int64_t kNowNs = 1'700'000'000 * kSecondNs;
constexpr std::uint64_t kFree = 100 * RecordModel::kThresholdBytes;

using Verdict = RecordModel::Verdict;

RecordModel oneAnswer() {
  RecordModel record;
  record.answer("/", "cache", 70, kFree, kNowNs);
  return record;
}

TEST(RecordModel, AnAnswerOfExactly120SecondsAgoIsBelieved) {
  RecordModel record = oneAnswer();
  EXPECT_EQ(record.validate(kNowNs + 120 * kSecondNs, {{"/", kFree}}), Verdict::kUsable);
  EXPECT_EQ(record.amountsOf("/"), (Dictionary{{"cache", 70}}));
  EXPECT_EQ(record.validate(kNowNs + 120 * kSecondNs + 1, {{"/", kFree}}), Verdict::kInvalid);
  EXPECT_TRUE(record.empty());
}

TEST(RecordModel, AnAnswerOfTheFutureIsNotBelieved) {
  RecordModel record = oneAnswer();
  EXPECT_EQ(record.validate(kNowNs - 1, {{"/", kFree}}), Verdict::kInvalid);
}

TEST(RecordModel, FreeSpaceThatMovedByExactly5MibIsNear) {
  for (const std::uint64_t moved :
       {kFree + RecordModel::kThresholdBytes, kFree - RecordModel::kThresholdBytes}) {
    RecordModel record = oneAnswer();
    EXPECT_EQ(record.validate(kNowNs, {{"/", moved}}), Verdict::kUsable);
  }
  for (const std::uint64_t moved :
       {kFree + RecordModel::kThresholdBytes + 1, kFree - RecordModel::kThresholdBytes - 1}) {
    RecordModel record = oneAnswer();
    EXPECT_EQ(record.validate(kNowNs, {{"/", moved}}), Verdict::kInvalid);
  }
}

TEST(RecordModel, AnOldAnswerGoesAndTheOthersOfItsVolumeStay) {
  RecordModel record = oneAnswer();
  record.answer("/", "other", 5, kFree, kNowNs + 60 * kSecondNs);
  EXPECT_EQ(record.validate(kNowNs + 130 * kSecondNs, {{"/", kFree}}), Verdict::kChanged);
  EXPECT_EQ(record.amountsOf("/"), (Dictionary{{"other", 5}}));
}

TEST(RecordModel, AVolumeThatIsGoneLeavesTheOthers) {
  RecordModel record = oneAnswer();
  record.answer("/data", "cache", 8, kFree, kNowNs);
  EXPECT_EQ(record.validate(kNowNs, {{"/", kFree}}), Verdict::kChanged);
  EXPECT_EQ(record.text(), (Dictionary{{"/", Dictionary{{"cache", 70}}}}));
}

}  // namespace
}  // namespace spacekeep::sim
