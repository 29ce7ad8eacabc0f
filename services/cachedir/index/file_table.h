// Thread safety: one thread at a time.
//
// The files of one cache directory as the index knows them: found by directory and name, found by
// inode, and in the order of their last use.
//
// Names of files with several hard links stand apart from the order and the sums: whether they give
// anything back depends on all of their names, and a directory's watch is silent about a change
// through another name, so whoever asks looks at them anew each time.
#pragma once

#include <cstdint>
#include <set>
#include <string_view>

#include "services/cachedir/engine/file_facts.h"
#include "services/cachedir/index/age_order.h"
#include "services/cachedir/index/file_records.h"
#include "services/cachedir/index/id_table.h"
#include "services/cachedir/index/keyed_hash.h"
#include "services/cachedir/index/name_store.h"

namespace spacekeep::cachedir {

class FileTable {
 public:
  enum class Put { kSame, kChanged, kNew, kTooBig };

  FileTable() : order_(records_) {}
  FileTable(const FileTable&) = delete;
  FileTable& operator=(const FileTable&) = delete;

  /// Between these two nothing is put in order, and no sum asked: for a first filling.
  void beginFilling() { filling_ = true; }
  void endFilling();

  /// Makes or updates the record of `name` in directory `folder`, and notes `round` in it. kTooBig:
  /// the file has 2 TiB or more, which no record can hold; nothing was done.
  Put put(std::uint32_t folder, std::string_view name, const FileState& state, std::uint8_t round);
  void erase(std::uint32_t id);

  [[nodiscard]] std::uint32_t find(std::uint32_t folder, std::string_view name) const;
  /// Among the files with one name; kNoId when there is none.
  [[nodiscard]] std::uint32_t findInode(std::uint64_t inode) const;

  [[nodiscard]] bool live(std::uint32_t id) const {
    return id < records_.end() && records_[id].live();
  }
  [[nodiscard]] const FileRecord& at(std::uint32_t id) const { return records_[id]; }
  [[nodiscard]] std::string_view nameOf(std::uint32_t id) const {
    return names_.at(records_[id].name_place, records_[id].name_bytes);
  }
  /// Numbers go from 0 to one less than this; not all are live.
  [[nodiscard]] std::uint32_t end() const { return records_.end(); }
  [[nodiscard]] std::size_t size() const { return records_.size(); }
  /// All rounds become 0.
  void forgetRounds();

  /// Of the files with one name.
  [[nodiscard]] const AgeOrder& order() const { return order_; }
  [[nodiscard]] const std::set<std::uint32_t>& linked() const { return linked_; }
  /// Memory held.
  [[nodiscard]] std::size_t bytes() const;
  [[nodiscard]] std::size_t nameBytes() const { return names_.bytes(); }

 private:
  [[nodiscard]] std::uint64_t hashOfName(std::uint32_t folder, std::string_view name) const {
    return hash_.of(folder, name);
  }
  [[nodiscard]] std::uint64_t hashOfInode(std::uint64_t inode) const { return hash_.of(inode, {}); }
  void enter(std::uint32_t id);
  void leave(std::uint32_t id);

  KeyedHash hash_;
  FileRecords records_;
  NameStore names_;
  IdTable by_name_;
  IdTable by_inode_;  // those with one name
  AgeOrder order_;    // the same
  std::set<std::uint32_t> linked_;
  bool filling_ = false;
};

}  // namespace spacekeep::cachedir
