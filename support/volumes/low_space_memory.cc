#include "support/volumes/low_space_memory.h"

#include <mutex>

namespace spacekeep {

void LowSpaceMemory::judge(std::vector<VolumeSample>& samples) {
  const std::scoped_lock lock(mutex_);
  std::map<Key, SpaceLevel> now_short;
  for (VolumeSample& sample : samples) {
    const Key key{sample.volume, sample.file_system};
    const auto known = short_.find(key);
    const SpaceLevel previous = known == short_.end() ? SpaceLevel::kEnough : known->second;
    sample.thresholds = spaceThresholds(sample.space, settings_);
    sample.level = spaceLevel(sample.space, sample.thresholds, previous);
    if (sample.level != SpaceLevel::kEnough) now_short.emplace(key, sample.level);
  }
  short_ = std::move(now_short);
}

bool LowSpaceMemory::setSettings(const LowSpaceSettings& settings) {
  const std::scoped_lock lock(mutex_);
  if (settings_ == settings) return false;
  settings_ = settings;
  short_.clear();
  return true;
}

}  // namespace spacekeep
