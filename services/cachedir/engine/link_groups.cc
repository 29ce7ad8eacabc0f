#include "services/cachedir/engine/link_groups.h"

#include <algorithm>

namespace spacekeep::cachedir {

Candidate candidateOf(const FoundFile& found, int level) {
  return {.turn = {found.used_ns, found.inode},
          .bytes = found.bytes,
          .first = {found.folder, std::string(found.name)},
          .others = {},
          .level = level};
}

std::optional<Candidate> LinkGroups::offer(const FoundFile& found, int level) {
  const auto known = groups_.find(found.inode);
  const std::size_t text = found.name.size() + found.folder->path.size();
  if (found.links > kMaxLinksOfAFile || text_bytes_ + text > kMaxLinkTextBytes ||
      (known == groups_.end() && groups_.size() >= kMaxLinkGroups)) {
    ++forgotten_;
    return std::nullopt;
  }
  text_bytes_ += text;
  if (known == groups_.end()) {
    groups_.emplace(found.inode, candidateOf(found, level));
    return std::nullopt;
  }
  Candidate& group = known->second;
  group.others.push_back({found.folder, std::string(found.name)});
  // A name that was used meanwhile makes the whole file that young.
  group.turn.used_ns = std::max(group.turn.used_ns, found.used_ns);
  group.level = std::max(group.level, level);
  if (group.others.size() + 1 != found.links) return std::nullopt;
  Candidate whole = std::move(group);
  groups_.erase(known);
  text_bytes_ -= textBytes(whole);
  return whole;
}

}  // namespace spacekeep::cachedir
