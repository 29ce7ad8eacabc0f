// Thread safety: one thread at a time; asking for a sum also changes it.
//
// Records in the order of their last use, least recently used first, with sums: how many bytes were
// last used up to a given instant. The instant is chosen by the one who asks, so files grow old
// without anybody touching this.
//
// The order stands in leaves of at most 512 numbers. Sums over the leaves before each are kept, and
// made again from the first leaf that changed. Asking is two binary searches and at most one
// leaf; after a change also an addition for each leaf behind it (2 to 8 thousand for a million
// files).
#pragma once

#include <cstdint>
#include <vector>

#include "services/cachedir/index/file_records.h"

namespace spacekeep::cachedir {

struct Amount {
  std::uint64_t bytes = 0;
  std::uint64_t files = 0;  // that have bytes
  bool operator==(const Amount&) const = default;
};

class AgeOrder {
 public:
  /// `records` must outlive this. The time of use and the blocks of a record may change only while
  /// it is not in here.
  explicit AgeOrder(const FileRecords& records) : records_(records) {}

  void insert(std::uint32_t id);
  /// `id` is in here.
  void erase(std::uint32_t id);
  /// Replaces everything: quicker than many insertions.
  void assign(std::vector<std::uint32_t> ids);

  /// Over all last used at `latest_ns` or before.
  [[nodiscard]] Amount upTo(std::int64_t latest_ns) const;
  /// Calls visit(id), oldest first, until it answers false.
  template <class Visit>
  void forEach(const Visit& visit) const {
    for (const Leaf& leaf : leaves_) {
      for (const std::uint32_t id : leaf.ids) {
        if (!visit(id)) return;
      }
    }
  }
  [[nodiscard]] std::size_t bytes() const;

 private:
  static constexpr std::size_t kLeafSize = 512;
  struct Key {
    std::int64_t used_ns = 0;
    std::uint32_t id = 0;
    auto operator<=>(const Key&) const = default;
  };
  struct Leaf {
    Key first;
    std::vector<std::uint32_t> ids;  // never empty, except while a leaf is being worked on
    Amount sum;
  };

  [[nodiscard]] Key keyOf(std::uint32_t id) const { return {records_[id].used_ns, id}; }
  [[nodiscard]] static Leaf emptyLeaf();
  void append(Leaf& leaf, std::uint32_t id) const;
  [[nodiscard]] std::size_t leafFor(const Key& key) const;
  [[nodiscard]] std::size_t positionIn(const Leaf& leaf, const Key& key) const;
  void split(std::size_t index);
  void mergeWithNext(std::size_t index);
  void changedFrom(std::size_t index) const;
  void sumBefore(std::size_t index) const;

  const FileRecords& records_;
  std::vector<Leaf> leaves_;
  mutable std::vector<Amount> before_;  // sums of all leaves before each; a prefix of them is valid
};

}  // namespace spacekeep::cachedir
