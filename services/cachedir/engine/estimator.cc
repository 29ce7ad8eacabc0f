#include "services/cachedir/engine/estimator.h"

#include <algorithm>
#include <limits>
#include <optional>

#include "services/cachedir/engine/ages.h"
#include "services/cachedir/engine/tree_walk.h"
#include "services/cachedir/index/cache_index.h"
#include "services/cachedir/index/indexed_files.h"

namespace spacekeep::cachedir {

void Estimator::add(const Inode& inode, std::size_t root, std::uint64_t bytes, int mildest) {
  if (mildest > kUrgencies || open_files_.holds(inode, roots_[root].file_system)) return;
  for (auto i = static_cast<std::size_t>(mildest - 1); i < kUrgencies; ++i) {
    sum.bytes[i] += bytes;
    ++sum.files[i];
  }
}

void Estimator::visit(const FoundFile& found) {
  const std::size_t root = found.folder->root;
  const int mildest = mildestUrgency(*roots_[root].rule, found.used_ns, now_ns_);
  if (found.bytes == 0) return;
  if (found.links == 1) return add(found.inode, root, found.bytes, mildest);
  const auto whole = groups_.offer(found, mildest);
  if (whole) add(whole->turn.inode, root, whole->bytes, whole->level);
}

/// What somebody holds open stands in the sums of the index, and is taken out again.
void Estimator::leaveOutHeld(RootIndex& index, std::size_t root) {
  for (const std::uint64_t inode : open_files_.heldOn(roots_[root])) {
    const std::uint32_t file = index.files().findInode(inode);
    if (file == kNoId) continue;
    index.noteHeld(file);
    const FileRecord& record = index.files().at(file);
    if (record.blocks == 0) continue;
    const int mildest = mildestUrgency(*roots_[root].rule, record.used_ns, now_ns_);
    for (auto i = static_cast<std::size_t>(mildest - 1); i < kUrgencies; ++i) {
      sum.bytes[i] -= record.bytes();
      --sum.files[i];
    }
  }
}

void Estimator::countIndexed(RootIndex& index, std::size_t root) {
  std::int64_t latest_ns = std::numeric_limits<std::int64_t>::min();
  for (int urgency = 1; urgency <= kUrgencies; ++urgency) {
    latest_ns = std::max(latest_ns, latestForUrgency(*roots_[root].rule, urgency, now_ns_));
    const Amount amount = index.files().order().upTo(latest_ns);
    const auto i = static_cast<std::size_t>(urgency - 1);
    sum.bytes[i] += amount.bytes;
    sum.files[i] += amount.files;
  }
  leaveOutHeld(index, root);
  FileShower(index, roots_, root).showLinked([this](const FoundFile& found) { visit(found); });
}

void Estimator::count(CacheIndex* index, const CancelToken& cancel) {
  const auto use = index != nullptr ? index->acquire(kIndexWaitNs) : std::nullopt;
  std::vector<RootIndex*> indexed(roots_.size(), nullptr);
  if (use) {
    CacheIndex::Refreshed refreshed = (*use)->refresh(roots_, CacheIndex::Effort::kBuild, cancel);
    indexed = std::move(refreshed.indexed);
    sum.problems = std::move(refreshed.problems);
  }
  TreeWalk walk(roots_);
  Tally left;
  for (std::size_t i = 0; i < roots_.size() && !sum.cancelled; ++i) {
    if (indexed[i] != nullptr) {
      countIndexed(*indexed[i], i);
    } else {
      sum.cancelled = !walk.walkRoot(
          i, [this](const FoundFile& found) { visit(found); }, cancel, left);
    }
  }
}

}  // namespace spacekeep::cachedir
