#include "services/cachedir/index/file_table.h"

#include <algorithm>
#include <limits>

namespace spacekeep::cachedir {
namespace {

std::uint16_t linksThatFit(std::uint64_t links) {
  return static_cast<std::uint16_t>(
      std::min<std::uint64_t>(links, std::numeric_limits<std::uint16_t>::max()));
}

bool same(const FileRecord& record, const FileState& state) {
  return record.inode == state.inode && record.used_ns == state.used_ns &&
         record.bytes() == state.bytes && record.links == linksThatFit(state.links);
}

void copy(FileRecord& record, const FileState& state) {
  record.inode = state.inode;
  record.used_ns = state.used_ns;
  record.blocks = static_cast<std::uint32_t>(state.bytes / kBlockUnitBytes);
  record.links = linksThatFit(state.links);
}

}  // namespace

void FileTable::enter(std::uint32_t id) {
  if (records_[id].links != 1) {
    linked_.insert(id);
    return;
  }
  by_inode_.insert(id, [this](std::uint32_t each) { return hashOfInode(records_[each].inode); });
  if (!filling_) order_.insert(id);
}

void FileTable::leave(std::uint32_t id) {
  if (linked_.erase(id) != 0) return;
  by_inode_.erase(id, [this](std::uint32_t each) { return hashOfInode(records_[each].inode); });
  if (!filling_) order_.erase(id);
}

void FileTable::endFilling() {
  std::vector<std::uint32_t> ids;
  ids.reserve(records_.size());
  for (std::uint32_t id = 0; id < records_.end(); ++id) {
    if (records_[id].live() && records_[id].links == 1) ids.push_back(id);
  }
  order_.assign(std::move(ids));
  filling_ = false;
}

FileTable::Put FileTable::put(std::uint32_t folder, std::string_view name, const FileState& state,
                              std::uint8_t round) {
  if (state.bytes / kBlockUnitBytes > std::numeric_limits<std::uint32_t>::max()) {
    return Put::kTooBig;
  }
  std::uint32_t id = find(folder, name);
  if (id != kNoId) {
    FileRecord& record = records_[id];
    record.round = round;
    if (same(record, state)) return Put::kSame;
    leave(id);
    copy(record, state);
    enter(id);
    return Put::kChanged;
  }
  id = records_.make();
  FileRecord& record = records_[id];
  copy(record, state);
  record.folder = folder;
  record.round = round;
  record.name_place = names_.keep(name);
  record.name_bytes = static_cast<std::uint8_t>(name.size());
  by_name_.insert(
      id, [this](std::uint32_t each) { return hashOfName(records_[each].folder, nameOf(each)); });
  enter(id);
  return Put::kNew;
}

void FileTable::erase(std::uint32_t id) {
  leave(id);
  by_name_.erase(
      id, [this](std::uint32_t each) { return hashOfName(records_[each].folder, nameOf(each)); });
  names_.release(records_[id].name_place, records_[id].name_bytes);
  records_.release(id);
}

std::uint32_t FileTable::find(std::uint32_t folder, std::string_view name) const {
  return by_name_.find(hashOfName(folder, name), [this, folder, name](std::uint32_t id) {
    return records_[id].folder == folder && nameOf(id) == name;
  });
}

std::uint32_t FileTable::findInode(std::uint64_t inode) const {
  return by_inode_.find(hashOfInode(inode),
                        [this, inode](std::uint32_t id) { return records_[id].inode == inode; });
}

void FileTable::forgetRounds() {
  for (std::uint32_t id = 0; id < records_.end(); ++id) records_[id].round = 0;
}

std::size_t FileTable::bytes() const {
  // A node of the set holds three pointers and a colour besides the number.
  constexpr std::size_t kSetNodeBytes = 40;
  return records_.bytes() + names_.bytes() + by_name_.bytes() + by_inode_.bytes() + order_.bytes() +
         linked_.size() * kSetNodeBytes;
}

}  // namespace spacekeep::cachedir
