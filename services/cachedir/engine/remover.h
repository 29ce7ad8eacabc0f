// Thread safety: one thread at a time.
//
// Deletes one candidate, or says why not. Whatever was known of the file is read again from the
// file, through descriptors, before its name goes.
#pragma once

#include <cstdint>
#include <optional>
#include <variant>
#include <vector>

#include "services/cachedir/engine/candidates.h"
#include "services/cachedir/engine/open_files.h"
#include "services/cachedir/engine/roots.h"
#include "services/cachedir/engine/tally.h"

namespace spacekeep::cachedir {

struct Removal {
  std::uint64_t bytes = 0;  // that come back
  std::uint64_t directories = 0;
};

class Remover {
 public:
  struct Settings {
    bool dry_run = false;
    /// Whether a file that gives nothing back goes as well (the daily pass tidies up).
    bool take_empty = false;
    /// Whether names go although the file has others that are not known.
    bool single_names = false;
  };

  /// All must outlive this.
  Remover(const std::vector<Root>& roots, OpenFiles& open_files, Settings settings)
      : roots_(roots), open_files_(open_files), settings_(settings) {}

  [[nodiscard]] std::variant<Removal, Left> take(const Candidate& candidate,
                                                 const CancelToken& cancel);

 private:
  struct Place {
    UniqueFd folder;
    Inode folder_inode;
    const Link* link = nullptr;
  };
  [[nodiscard]] std::optional<std::vector<Place>> places(const Candidate& candidate) const;
  [[nodiscard]] std::optional<Left> objection(int fd, const Candidate& candidate,
                                              struct stat& facts) const;
  [[nodiscard]] bool seenOpen(const Candidate& candidate, bool proven, const CancelToken& cancel);
  [[nodiscard]] std::uint64_t removeEmpty(const Folder& folder) const;

  const std::vector<Root>& roots_;
  OpenFiles& open_files_;
  const Settings settings_;
};

}  // namespace spacekeep::cachedir
