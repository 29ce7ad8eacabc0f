// Thread safety: confined to one thread at a time.
//
// Room that a suite holds for itself, so that it can go on being written when its volume has neither
// a free block nor a free inode: unused pages inside the file, and a journal that is already as
// large as the largest change can make it. A value that replaces one of its size, or somewhat
// more, then only overwrites blocks that the two files have had all along.
#pragma once

#include <cstdint>
#include <string>

#include "support/preferences/linux/sqlite.h"

namespace spacekeep {

class SuiteHeadroom {
 public:
  /// `path` is the database's own. `max_pages` bounds the file, headroom included.
  SuiteHeadroom(sqlite3* database, const std::string& path, std::int64_t max_pages);

  /// Takes stock of the file. Inside a transaction that costs no system call.
  void look();

  enum class Wish {
    kIfThereIsRoom,  ///< only where the volume has plenty: not to make it short again
    kAtAnyCost       ///< room was just made for this very file
  };
  /// Grows what is low, in transactions of its own. Best effort: without room all stays as it was,
  /// and the next call tries again.
  void growIfLow(Wish wish);

 private:
  [[nodiscard]] bool isLow() const;
  [[nodiscard]] std::int64_t wantedPages() const;
  [[nodiscard]] std::uint64_t journalBytes() const;
  [[nodiscard]] bool volumeHasPlenty(std::int64_t wanted) const;
  int fill(std::int64_t pages);
  std::int64_t ask(Statement& statement, const char* sql);

  sqlite3* database_;
  const std::string directory_;
  const std::string journal_path_;
  const std::int64_t max_pages_;
  Statement page_count_;
  Statement freelist_count_;
  std::int64_t used_pages_ = 0;
  std::int64_t free_pages_ = 0;
};

}  // namespace spacekeep
