// Thread safety: one thread at a time.
//
// Files with several hard links. Their blocks come back only with the last name, so such a file may
// go only when a walk has met every one of its names.
#pragma once

#include <map>
#include <optional>

#include "services/cachedir/engine/candidates.h"

namespace spacekeep::cachedir {

inline constexpr std::size_t kMaxLinkGroups = 32768;
inline constexpr std::size_t kMaxLinkTextBytes = 8 * 1024 * 1024;
inline constexpr std::uint64_t kMaxLinksOfAFile = 256;

class LinkGroups {
 public:
  /// The file with all its names once `found` is the last of them. Names beyond the bounds are not
  /// remembered; their files stay.
  [[nodiscard]] std::optional<Candidate> offer(const FoundFile& found, int level);
  /// Files of which some name is missing.
  [[nodiscard]] std::uint64_t incomplete() const { return groups_.size() + forgotten_; }

 private:
  std::map<Inode, Candidate> groups_;
  std::size_t text_bytes_ = 0;
  std::uint64_t forgotten_ = 0;
};

/// The candidate of a file met under one name.
[[nodiscard]] Candidate candidateOf(const FoundFile& found, int level);

}  // namespace spacekeep::cachedir
