// Thread safety: one thread at a time.
//
// A depth-first walk of the roots by directory descriptors. Memory is bounded by the depth, not by
// the number of files.
#pragma once

#include <memory>
#include <string>
#include <vector>

#include "services/cachedir/engine/entry.h"
#include "services/cachedir/engine/file_source.h"
#include "services/cachedir/engine/roots.h"

namespace spacekeep::cachedir {

class TreeWalk final : public FileSource {
 public:
  /// `roots` must outlive the walk and every Folder it hands out is good on its own.
  explicit TreeWalk(const std::vector<Root>& roots) : roots_(roots) {}

  bool forEachFile(const std::function<void(const FoundFile&)>& visit, const CancelToken& cancel,
                   Tally& tally) override;
  /// The same for the files of one root, by its index.
  bool walkRoot(std::size_t index, const std::function<void(const FoundFile&)>& visit,
                const CancelToken& cancel, Tally& tally);

 private:
  struct Level;
  void enter(std::vector<Level>& levels, UniqueFd fd, Folder folder, Tally& tally);
  void descend(std::vector<Level>& levels, const char* name, Tally& tally);
  void meet(const Level& level, const char* name,
            const std::function<void(const FoundFile&)>& visit, Tally& tally);

  const std::vector<Root>& roots_;
};

}  // namespace spacekeep::cachedir
