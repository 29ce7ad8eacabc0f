#include "services/cachedir/index/age_order.h"

#include <algorithm>

namespace spacekeep::cachedir {
namespace {

void add(Amount& sum, const FileRecord& record) {
  sum.bytes += record.bytes();
  sum.files += record.blocks > 0 ? 1 : 0;
}

void subtract(Amount& sum, const FileRecord& record) {
  sum.bytes -= record.bytes();
  sum.files -= record.blocks > 0 ? 1 : 0;
}

}  // namespace

AgeOrder::Leaf AgeOrder::emptyLeaf() {
  Leaf leaf;
  leaf.ids.reserve(kLeafSize);
  return leaf;
}

void AgeOrder::append(Leaf& leaf, std::uint32_t id) const {
  if (leaf.ids.empty()) leaf.first = keyOf(id);
  leaf.ids.push_back(id);
  add(leaf.sum, records_[id]);
}

/// The last leaf that begins at or before `key`, else the first one.
std::size_t AgeOrder::leafFor(const Key& key) const {
  const auto after = std::ranges::upper_bound(leaves_, key, {}, &Leaf::first);
  return after == leaves_.begin() ? 0 : static_cast<std::size_t>(after - leaves_.begin()) - 1;
}

/// Of the first in `leaf` that is not before `key`.
std::size_t AgeOrder::positionIn(const Leaf& leaf, const Key& key) const {
  const auto found =
      std::ranges::lower_bound(leaf.ids, key, {}, [this](std::uint32_t id) { return keyOf(id); });
  return static_cast<std::size_t>(found - leaf.ids.begin());
}

void AgeOrder::changedFrom(std::size_t index) const {
  if (before_.size() > index + 1) before_.resize(index + 1);
}

void AgeOrder::insert(std::uint32_t id) {
  if (leaves_.empty()) leaves_.push_back(emptyLeaf());
  const Key key = keyOf(id);
  std::size_t index = leafFor(key);
  if (leaves_[index].ids.size() == kLeafSize) {
    split(index);
    if (leaves_[index + 1].first <= key) ++index;
  }
  Leaf& leaf = leaves_[index];
  const std::size_t position = positionIn(leaf, key);
  leaf.ids.insert(leaf.ids.begin() + static_cast<std::ptrdiff_t>(position), id);
  if (position == 0) leaf.first = key;
  add(leaf.sum, records_[id]);
  changedFrom(index);
}

void AgeOrder::erase(std::uint32_t id) {
  const Key key = keyOf(id);
  const std::size_t index = leafFor(key);
  Leaf& leaf = leaves_[index];
  const std::size_t position = positionIn(leaf, key);
  leaf.ids.erase(leaf.ids.begin() + static_cast<std::ptrdiff_t>(position));
  subtract(leaf.sum, records_[id]);
  changedFrom(index);
  if (leaf.ids.empty()) {
    leaves_.erase(leaves_.begin() + static_cast<std::ptrdiff_t>(index));
    before_.resize(std::min(before_.size(), index));
    return;
  }
  if (position == 0) leaf.first = keyOf(leaf.ids.front());
  mergeWithNext(index);
  if (index > 0) mergeWithNext(index - 1);
}

void AgeOrder::split(std::size_t index) {
  Leaf upper = emptyLeaf();
  Leaf& lower = leaves_[index];
  for (std::size_t i = kLeafSize / 2; i < kLeafSize; ++i) append(upper, lower.ids[i]);
  lower.ids.resize(kLeafSize / 2);
  lower.sum.bytes -= upper.sum.bytes;
  lower.sum.files -= upper.sum.files;
  leaves_.insert(leaves_.begin() + static_cast<std::ptrdiff_t>(index) + 1, std::move(upper));
  changedFrom(index);
}

/// So that leaves which lost nearly everything do not keep their memory.
void AgeOrder::mergeWithNext(std::size_t index) {
  if (index + 1 >= leaves_.size()) return;
  Leaf& lower = leaves_[index];
  const Leaf& upper = leaves_[index + 1];
  if (lower.ids.size() + upper.ids.size() > kLeafSize / 2) return;
  lower.ids.insert(lower.ids.end(), upper.ids.begin(), upper.ids.end());
  lower.sum.bytes += upper.sum.bytes;
  lower.sum.files += upper.sum.files;
  leaves_.erase(leaves_.begin() + static_cast<std::ptrdiff_t>(index) + 1);
  changedFrom(index);
}

void AgeOrder::assign(std::vector<std::uint32_t> ids) {
  std::vector<Key> keys;
  keys.reserve(ids.size());
  for (const std::uint32_t id : ids) keys.push_back(keyOf(id));
  std::ranges::sort(keys);
  leaves_.clear();
  before_.clear();
  for (const Key& key : keys) {
    // Not full, so that the first insertion does not split it.
    if (leaves_.empty() || leaves_.back().ids.size() == kLeafSize * 7 / 8) {
      leaves_.push_back(emptyLeaf());
    }
    append(leaves_.back(), key.id);
  }
}

void AgeOrder::sumBefore(std::size_t index) const {
  if (before_.empty()) before_.emplace_back();
  while (before_.size() <= index) {
    Amount sum = before_.back();
    const Amount& leaf = leaves_[before_.size() - 1].sum;
    sum.bytes += leaf.bytes;
    sum.files += leaf.files;
    before_.push_back(sum);
  }
}

Amount AgeOrder::upTo(std::int64_t latest_ns) const {
  if (leaves_.empty()) return {};
  const std::size_t index = leafFor({latest_ns, 0xffffffff});
  sumBefore(index);
  Amount sum = before_[index];
  const Leaf& leaf = leaves_[index];
  if (records_[leaf.ids.back()].used_ns <= latest_ns) {
    sum.bytes += leaf.sum.bytes;
    sum.files += leaf.sum.files;
    return sum;
  }
  for (const std::uint32_t id : leaf.ids) {
    if (records_[id].used_ns > latest_ns) break;
    add(sum, records_[id]);
  }
  return sum;
}

std::size_t AgeOrder::bytes() const {
  return leaves_.capacity() * sizeof(Leaf) + before_.capacity() * sizeof(Amount) +
         leaves_.size() * kLeafSize * sizeof(std::uint32_t);
}

}  // namespace spacekeep::cachedir
