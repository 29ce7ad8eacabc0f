// Thread safety: as the implementation says.
//
// Where the engine learns of files. A walk of the directories answers, or an index that is kept
// between requests. What chooses, checks and deletes need not know which, because every fact is
// read again from the file itself before anything is deleted.
#pragma once

#include <functional>

#include "services/cachedir/engine/cancel_token.h"
#include "services/cachedir/engine/file_facts.h"
#include "services/cachedir/engine/tally.h"

namespace spacekeep::cachedir {

class FileSource {
 public:
  virtual ~FileSource() = default;
  /// Calls `visit` once for each regular file that no pattern keeps, in any order. False when
  /// `cancel` ended it early.
  virtual bool forEachFile(const std::function<void(const FoundFile&)>& visit,
                           const CancelToken& cancel, Tally& tally) = 0;
};

}  // namespace spacekeep::cachedir
