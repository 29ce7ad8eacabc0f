#include "services/cachedir/index/folder_tree.h"

#include <algorithm>

namespace spacekeep::cachedir {

std::uint32_t FolderTree::add(const std::string& path) {
  std::uint32_t id = 0;
  if (free_.empty()) {
    id = end();
    folders_.emplace_back();
  } else {
    id = free_.back();
    free_.pop_back();
  }
  folders_[id] = {};
  folders_[id].path = path;
  folders_[id].known = true;
  by_path_.emplace(path, id);
  return id;
}

std::uint32_t FolderTree::find(std::string_view path) const {
  const auto found = by_path_.find(path);
  return found == by_path_.end() ? kNone : found->second;
}

template <class Visit>
void FolderTree::forEachBelow(const std::string& path, const Visit& visit) const {
  const std::string prefix = path.empty() ? "" : path + "/";
  for (auto each = by_path_.lower_bound(prefix); each != by_path_.end(); ++each) {
    if (!each->first.starts_with(prefix)) return;
    if (!each->first.empty())
      visit(std::string_view(each->first).substr(prefix.size()), each->second);
  }
}

std::vector<std::uint32_t> FolderTree::withAllBelow(std::uint32_t id) const {
  std::vector<std::uint32_t> ids{id};
  forEachBelow(folders_[id].path,
               [&ids](std::string_view, std::uint32_t each) { ids.push_back(each); });
  return ids;
}

std::vector<std::uint32_t> FolderTree::directlyIn(std::uint32_t id) const {
  std::vector<std::uint32_t> ids;
  forEachBelow(folders_[id].path, [&ids](std::string_view below, std::uint32_t each) {
    if (below.find('/') == std::string_view::npos) ids.push_back(each);
  });
  return ids;
}

std::vector<std::uint32_t> FolderTree::from(const std::string& path) const {
  std::vector<std::uint32_t> ids;
  for (auto each = by_path_.lower_bound(path); each != by_path_.end(); ++each) {
    ids.push_back(each->second);
  }
  return ids;
}

void FolderTree::drop(std::uint32_t id) {
  by_path_.erase(folders_[id].path);
  folders_[id].known = false;
}

void FolderTree::release(std::uint32_t id) {
  folders_[id] = {};
  free_.push_back(id);
}

}  // namespace spacekeep::cachedir
