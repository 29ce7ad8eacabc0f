// Thread safety: one thread at a time.
//
// One cache directory, indexed: what a walk would find, kept from request to request by looking
// again at whatever the event inbox names. Nothing is inferred from what an event says happened; it
// only tells where to look, so that lost order, merged events and races cost a look and no error.
#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <utility>
#include <vector>

#include "services/cachedir/engine/cancel_token.h"
#include "services/cachedir/engine/entry.h"
#include "services/cachedir/engine/roots.h"
#include "services/cachedir/index/event_inbox.h"
#include "services/cachedir/index/file_table.h"
#include "services/cachedir/index/folder_tree.h"

struct dirent;

namespace spacekeep::cachedir {

/// What all cache directories together may use up.
struct IndexBounds {
  std::size_t max_files = 1 << 20;
  std::size_t max_name_bytes = 64 * 1024 * 1024;
  std::size_t max_folders = 65536;
  /// Names of files with several hard links, each looked at again at every request.
  std::size_t max_linked = 32768;
};

struct IndexTotals {
  std::size_t files = 0;
  std::size_t folders = 0;
};

class RootIndex {
 public:
  enum class State {
    kEmpty,  // nothing is known
    kReady,
    kUnfit,  // it cannot be kept: the directory is walked at each request
  };

  /// All must outlive this. `number` names this one to the inbox.
  RootIndex(std::uint32_t number, EventInbox& inbox, const IndexBounds& bounds, IndexTotals& totals)
      : number_(number), inbox_(inbox), bounds_(bounds), totals_(totals) {
    reset();
  }
  ~RootIndex() { reset(); }
  RootIndex(const RootIndex&) = delete;
  RootIndex& operator=(const RootIndex&) = delete;

  [[nodiscard]] State state() const { return state_; }
  /// Whether what is known is of this very directory, with these mounts below it.
  [[nodiscard]] bool isOf(const Root& root, const std::string& mounts) const;
  void reset();

  // Each of these three leaves the state kReady, or nothing is known any more.
  /// Lists everything. False when cancelled.
  bool build(const Root& root, const std::string& mounts, const CancelToken& cancel);
  /// Looks again at what changed, and at what no event tells of. The inode numbers of files that
  /// turned out to have several names are added to `shared`: the other names may not know. False
  /// when cancelled.
  bool apply(const Root& root, const std::vector<Changed>& changes,
             std::vector<std::uint64_t>& shared, const CancelToken& cancel);
  /// Looks again at the file of that inode, if it is thought to have one name.
  void lookAtInode(const Root& root, std::uint64_t inode);
  /// Whether a directory was not where it was expected: something has happened meanwhile that the
  /// inbox will tell. Asking forgets it.
  [[nodiscard]] bool takeTorn() { return std::exchange(torn_, false); }

  struct Verified {
    bool whole = false;             // it came to the end
    std::uint64_t differences = 0;  // names that were not as the index had them; they are now
  };
  /// Compares with the directory, for at most `limit_ns`, going on where the last time ended.
  Verified verify(const Root& root, std::uint64_t limit_ns, const CancelToken& cancel);
  /// Nanoseconds since all of it was last seen with own eyes.
  [[nodiscard]] std::uint64_t sinceVerifiedNs() const;

  [[nodiscard]] const FileTable& files() const { return *files_; }
  [[nodiscard]] const FolderTree& folders() const { return folders_; }
  /// Somebody has the file open: it is looked at again at the next apply, because what is done
  /// through a name that has been removed is told of nowhere.
  void noteHeld(std::uint32_t file) { held_.push_back(file); }
  /// Directories that are not watched, for want of watches.
  [[nodiscard]] std::size_t unwatched() const { return unwatched_.size(); }
  /// What a person should know, in words, each once in the life of this.
  [[nodiscard]] std::vector<std::string> takeProblems() { return std::exchange(problems_, {}); }

 private:
  [[nodiscard]] UniqueFd openFolder(const Root& root, std::uint32_t folder) const;
  void nextRound();
  void dropReplaced(const Root& root, const Changed& changed);
  void lookAtNames(const Root& root, const Changed& changed);
  void look(const Root& root, std::uint32_t folder, int folder_fd, const std::string& name);
  void meetKept(const Entry& entry);
  void lookAgain(const Root& root, std::uint32_t file);
  void enterFolder(const Root& root, const std::string& path, std::uint64_t inode);
  bool listPending(const Root& root, const CancelToken& cancel);
  bool list(const Root& root, std::uint32_t folder, const CancelToken& cancel);
  bool listEntries(const Root& root, std::uint32_t folder, UniqueFd fd, const CancelToken& cancel);
  void dropUnseen(std::uint32_t folder);
  void watch(std::uint32_t folder, int fd);
  bool dropOwner(std::uint32_t folder, const WatchOwner& owner);
  void listEntry(const Root& root, std::uint32_t folder, int folder_fd, const dirent& entry);
  void put(std::uint32_t folder, const std::string& name, const FileState& state);
  void erase(std::uint32_t file);
  void drop(std::uint32_t folder);
  void sweep();
  void tell(std::string problem);
  void finish();

  const std::uint32_t number_;
  EventInbox& inbox_;
  const IndexBounds& bounds_;
  IndexTotals& totals_;

  State state_ = State::kEmpty;
  std::string path_;
  Inode inode_;
  std::uint64_t mount_id_ = 0;
  std::uint64_t settle_ns_ = 0;
  std::string mounts_;
  std::uint64_t verified_ticks_ = 0;
  std::uint64_t verify_began_ticks_ = 0;
  std::string verify_from_;

  std::unique_ptr<FileTable> files_;
  FolderTree folders_;
  std::uint8_t round_ = 0;
  std::vector<std::uint32_t> pending_;  // directories to list
  std::set<std::uint32_t> relisted_;    // of which records were there before
  std::set<std::uint32_t> dropped_;     // of which records may still be there
  std::set<std::uint32_t> unwatched_;
  std::vector<std::uint32_t> held_;
  std::vector<std::uint64_t> shared_;
  std::uint64_t differences_ = 0;
  bool torn_ = false;
  bool unreliable_ = false;  // something could not be read that may be there
  std::string unfit_;        // why this cannot be kept
  std::vector<std::string> problems_;
  std::set<std::string> told_;
};

}  // namespace spacekeep::cachedir
