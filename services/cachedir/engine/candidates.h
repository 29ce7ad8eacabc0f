// Thread safety: one thread at a time.
//
// The oldest files of a walk, in bounded memory. What does not fit is the youngest, and the next
// pass begins where this one ended.
#pragma once

#include <compare>
#include <cstdint>
#include <limits>
#include <memory>
#include <string>
#include <vector>

#include "services/cachedir/engine/file_facts.h"

namespace spacekeep::cachedir {

/// The order in which files go: least recently used first, the rest only makes it total.
struct Turn {
  std::int64_t used_ns = std::numeric_limits<std::int64_t>::min();
  Inode inode;
  auto operator<=>(const Turn&) const = default;
};

/// One name of a file.
struct Link {
  std::shared_ptr<const Folder> folder;
  std::string name;
};

/// A file with all its names: most have one.
struct Candidate {
  Turn turn;
  std::uint64_t bytes = 0;
  Link first;
  std::vector<Link> others;
  int level = 0;  // the highest of what its names were offered with
};

/// Bytes of its names and paths. A folder's path counts with each file although files share it: too
/// much rather than too little.
[[nodiscard]] std::size_t textBytes(const Candidate& candidate);

class OldestFiles {
 public:
  OldestFiles(std::size_t max_files, std::size_t max_text_bytes)
      : max_files_(max_files), max_text_bytes_(max_text_bytes) {}

  /// Whether offer would keep a file of that turn; asked first, it saves making a candidate.
  [[nodiscard]] bool wants(const Turn& turn) const { return !overflowed_ || turn < ceiling_; }
  void offer(Candidate candidate);
  /// Something was left out, and all of it comes after everything that is kept.
  [[nodiscard]] bool overflowed() const { return overflowed_; }
  /// Oldest first. Empties this.
  [[nodiscard]] std::vector<Candidate> takeInOrder();

 private:
  void dropYoungest();

  const std::size_t max_files_;
  const std::size_t max_text_bytes_;
  std::vector<Candidate> heap_;  // youngest on top
  std::size_t text_bytes_ = 0;
  bool overflowed_ = false;
  Turn ceiling_;  // the oldest that was left out
};

}  // namespace spacekeep::cachedir
