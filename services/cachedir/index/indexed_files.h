// Thread safety: one thread at a time.
//
// Files out of the index, those of what is not indexed out of a walk.
#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "services/cachedir/engine/file_source.h"
#include "services/cachedir/engine/roots.h"
#include "services/cachedir/engine/tree_walk.h"
#include "services/cachedir/index/cache_index.h"

namespace spacekeep::cachedir {

/// How long a request waits for another one that works with the index before it walks instead.
inline constexpr std::uint64_t kIndexWaitNs = 50'000'000;

using FileVisitor = std::function<void(const FoundFile&)>;

/// The files of an index that belongs to `roots[number]`.
class FileShower {
 public:
  FileShower(const RootIndex& index, const std::vector<Root>& roots, std::size_t number)
      : index_(index), roots_(roots), number_(number) {}

  void show(std::uint32_t file, const FileVisitor& visit);
  /// Those with one name, least recently used first. False when cancelled.
  bool showInOrder(const FileVisitor& visit, const CancelToken& cancel);
  /// Each name of those with several.
  void showLinked(const FileVisitor& visit);

 private:
  const RootIndex& index_;
  const std::vector<Root>& roots_;
  const std::size_t number_;
  std::vector<std::shared_ptr<const Folder>> folders_;  // made when first needed
};

class IndexedFiles final : public FileSource {
 public:
  /// All must outlive this. Indexes nothing that is not indexed yet.
  IndexedFiles(CacheIndex& index, const std::vector<Root>& roots)
      : index_(index), roots_(roots), walk_(roots) {}

  bool forEachFile(const FileVisitor& visit, const CancelToken& cancel, Tally& tally) override;
  /// What a person should know, in words, since the last call.
  [[nodiscard]] std::vector<std::string> takeProblems() { return std::exchange(problems_, {}); }

 private:
  std::vector<RootIndex*> refreshed(const std::optional<CacheIndex::Use>& use,
                                    const CancelToken& cancel);

  CacheIndex& index_;
  const std::vector<Root>& roots_;
  TreeWalk walk_;
  std::vector<std::string> problems_;
};

}  // namespace spacekeep::cachedir
