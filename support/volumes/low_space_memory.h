// Thread safety: every member may be called from any thread.
//
// Remembers which volumes are short of space, for the hysteresis. Everyone who asks shares one
// memory: a volume that the watcher reports as short must be short for the purge that follows.
#pragma once

#include <map>
#include <string>
#include <utility>
#include <vector>

#include "support/runtime/runtime.h"
#include "support/volumes/space_source.h"

namespace spacekeep {

class LowSpaceMemory {
 public:
  /// Sets the thresholds and the level of each sample. `samples` are all volumes there are now: the
  /// others are forgotten, so the memory never outgrows the mount table.
  void judge(std::vector<VolumeSample>& samples);

  /// Holds from the next judge() on, which starts afresh: who was short by other thresholds says
  /// nothing now. Answers whether anything changed.
  bool setSettings(const LowSpaceSettings& settings);

 private:
  using Key = std::pair<std::string, std::uint64_t>;  // mount point, file system

  rt::Mutex mutex_;
  // Protected by mutex_.
  LowSpaceSettings settings_;
  std::map<Key, SpaceLevel> short_;  // only volumes that are not kEnough
};

}  // namespace spacekeep
