// Listing directories: how what is there comes into the index.
#include <dirent.h>
#include <fcntl.h>
#include <sys/stat.h>

#include <algorithm>
#include <cerrno>

#include "services/cachedir/index/root_index.h"

namespace spacekeep::cachedir {
namespace {

struct DirectoryCloser {
  void operator()(DIR* directory) const { ::closedir(directory); }
};

constexpr std::size_t kEntriesBetweenQuestions = 256;

/// A walk would also leave such a directory out: it is another mount, a link, or not for us.
bool tellsWhy(int error) {
  return error == ENOENT || error == EXDEV || error == ELOOP || error == ENOTDIR ||
         error == EACCES || error == EPERM;
}

}  // namespace

bool RootIndex::listPending(const Root& root, const CancelToken& cancel) {
  while (!pending_.empty() && unfit_.empty()) {
    if (cancel.cancelled()) return false;
    const std::uint32_t folder = pending_.back();
    pending_.pop_back();
    if (folders_.knows(folder) && !list(root, folder, cancel)) return false;
  }
  pending_.clear();
  return true;
}

/// False when cancelled half-way.
bool RootIndex::list(const Root& root, std::uint32_t folder, const CancelToken& cancel) {
  const bool listed_before = folders_.at(folder).inode != 0;
  UniqueFd fd = openFolder(root, folder);
  struct stat facts {};
  if (!fd || ::fstat(fd.get(), &facts) != 0) {
    if (!tellsWhy(errno) || folders_.at(folder).path.empty()) unreliable_ = true;
    torn_ = torn_ || listed_before;
    drop(folder);
    return true;
  }
  folders_.at(folder).inode = inodeOf(facts).number;
  // Before the listing, so that whatever it misses is told.
  if (folders_.at(folder).watch < 0) watch(folder, fd.get());
  if (folders_.at(folder).files > 0) relisted_.insert(folder);
  if (!listEntries(root, folder, std::move(fd), cancel)) return false;
  if (listed_before) dropUnseen(folder);
  return true;
}

bool RootIndex::listEntries(const Root& root, std::uint32_t folder, UniqueFd fd,
                            const CancelToken& cancel) {
  const std::unique_ptr<DIR, DirectoryCloser> directory(::fdopendir(fd.get()));
  if (!directory) {
    unreliable_ = true;
    return true;
  }
  const int folder_fd = fd.release();
  for (std::size_t count = 0; unfit_.empty(); ++count) {
    if (count % kEntriesBetweenQuestions == 0 && cancel.cancelled()) return false;
    errno = 0;
    const dirent* entry = ::readdir(directory.get());
    if (entry == nullptr) {
      if (errno != 0) unreliable_ = true;
      return true;
    }
    if (!isDotName(entry->d_name)) listEntry(root, folder, folder_fd, *entry);
  }
  return true;
}

void RootIndex::listEntry(const Root& root, std::uint32_t folder, int folder_fd,
                          const dirent& entry) {
  if (entry.d_type != DT_REG && entry.d_type != DT_DIR && entry.d_type != DT_UNKNOWN) return;
  Entry found{.kind = Entry::Kind::kDirectory, .device = 0, .state = {.inode = entry.d_ino}};
  if (entry.d_type != DT_DIR) found = entryAt(folder_fd, entry.d_name, root);
  if (found.kind == Entry::Kind::kFile) {
    if (root.rule->keep.empty() ||
        !isKept(*root.rule, joined(folders_.at(folder).path, entry.d_name))) {
      return put(folder, entry.d_name, found.state);
    }
    return meetKept(found);
  }
  if (found.kind != Entry::Kind::kDirectory) return;
  const std::string path = joined(folders_.at(folder).path, entry.d_name);
  const std::uint32_t known = folders_.find(path);
  if (known == FolderTree::kNone || folders_.at(known).inode != found.state.inode) {
    enterFolder(root, path, found.state.inode);
  }
  const std::uint32_t entered = folders_.find(path);
  if (entered != FolderTree::kNone) folders_.at(entered).round = round_;
}

void RootIndex::dropUnseen(std::uint32_t folder) {
  for (const std::uint32_t each : folders_.directlyIn(folder)) {
    if (folders_.at(each).round != round_) drop(each);
  }
}

void RootIndex::watch(std::uint32_t folder, int fd) {
  for (int attempt = 0; attempt < 2; ++attempt) {
    const EventInbox::Added added = inbox_.add(fd, {number_, folder}, settle_ns_);
    switch (added.outcome) {
      case EventInbox::Outcome::kWatched:
        folders_.at(folder).watch = added.watch;
        unwatched_.erase(folder);
        return;
      case EventInbox::Outcome::kTaken:
        if (!dropOwner(folder, added.taken_by)) return;
        break;
      case EventInbox::Outcome::kNoRoom:
      case EventInbox::Outcome::kFailed:
        unwatched_.insert(folder);
        return;
    }
  }
  unreliable_ = true;
}

/// The directory has moved here from where `owner` stands, and the news of that is still on its
/// way.
bool RootIndex::dropOwner(std::uint32_t folder, const WatchOwner& owner) {
  if (owner.root != number_) {
    unfit_ = path_ +
             ": another directory of the rule file shows the same files; it is walked at "
             "each request";
    return false;
  }
  const std::string& path = folders_.at(folder).path;
  const bool known = folders_.knows(owner.folder);
  // What stands above cannot also stand here: the picture is too old to be mended.
  if (!known || (path + "/").starts_with(folders_.at(owner.folder).path + "/") ||
      folders_.at(owner.folder).path.empty()) {
    unreliable_ = true;
    return false;
  }
  drop(owner.folder);
  return true;
}

}  // namespace spacekeep::cachedir
