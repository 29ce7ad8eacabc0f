// Thread safety: one thread at a time.
//
// Adds up what could be freed: out of the index where there is one, out of a walk otherwise.
#pragma once

#include <cstdint>
#include <vector>

#include "services/cachedir/engine/cancel_token.h"
#include "services/cachedir/engine/estimate.h"
#include "services/cachedir/engine/link_groups.h"
#include "services/cachedir/engine/open_files.h"
#include "services/cachedir/engine/roots.h"

namespace spacekeep::cachedir {

class CacheIndex;
class RootIndex;

class Estimator {
 public:
  /// All must outlive this. `open_files` has been scanned when count is called.
  Estimator(const std::vector<Root>& roots, const OpenFiles& open_files, std::int64_t now_ns)
      : roots_(roots), open_files_(open_files), now_ns_(now_ns) {}

  /// `index` may be null.
  void count(CacheIndex* index, const CancelToken& cancel);

  Estimate sum;

 private:
  void countIndexed(RootIndex& index, std::size_t root);
  void leaveOutHeld(RootIndex& index, std::size_t root);
  void visit(const FoundFile& found);
  void add(const Inode& inode, std::size_t root, std::uint64_t bytes, int mildest);

  const std::vector<Root>& roots_;
  const OpenFiles& open_files_;
  const std::int64_t now_ns_;
  LinkGroups groups_;
};

}  // namespace spacekeep::cachedir
