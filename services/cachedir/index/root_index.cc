#include "services/cachedir/index/root_index.h"

#include <fcntl.h>
#include <sys/stat.h>

#include <algorithm>
#include <cerrno>

#include "services/cachedir/engine/beneath.h"
#include "services/cachedir/engine/elapsed.h"
#include "services/cachedir/index/file_systems.h"

namespace spacekeep::cachedir {
namespace {

/// A file made without a name, linked in later, goes on to be told of as "#" and its inode.
std::optional<std::uint64_t> inodeInName(const std::string& name) {
  if (name.size() < 2 || name.size() > 20 || name[0] != '#') return std::nullopt;
  std::uint64_t inode = 0;
  for (std::size_t i = 1; i < name.size(); ++i) {
    if (name[i] < '0' || name[i] > '9') return std::nullopt;
    inode = inode * 10 + static_cast<std::uint64_t>(name[i] - '0');
  }
  return inode;
}

}  // namespace

bool RootIndex::isOf(const Root& root, const std::string& mounts) const {
  return root.inode == inode_ && root.mount_id == mount_id_ && mounts == mounts_;
}

void RootIndex::reset() {
  for (std::uint32_t id = 0; id < folders_.end(); ++id) {
    if (folders_.knows(id) && folders_.at(id).watch >= 0) inbox_.remove(folders_.at(id).watch);
  }
  if (files_) totals_.files -= files_->size();
  totals_.folders -= folders_.size();
  state_ = State::kEmpty;
  files_ = std::make_unique<FileTable>();
  folders_ = {};
  pending_.clear();
  relisted_.clear();
  dropped_.clear();
  unwatched_.clear();
  held_.clear();
  shared_.clear();
  verify_from_.clear();
  unfit_.clear();
  torn_ = unreliable_ = false;
}

void RootIndex::tell(std::string problem) {
  if (told_.insert(problem).second) problems_.push_back(std::move(problem));
}

/// What was found out on the way has its consequence here, when nobody works on the tables.
void RootIndex::finish() {
  if (!unfit_.empty()) {
    tell(std::exchange(unfit_, {}));
    reset();
    state_ = State::kUnfit;
  } else if (unreliable_) {
    reset();
  } else if (!unwatched_.empty()) {
    tell(path_ +
         ": no inotify watches are left (fs.inotify.max_user_watches); directories without "
         "one are looked through at each request");
  }
}

std::uint64_t RootIndex::sinceVerifiedNs() const { return elapsedNs(verified_ticks_); }

bool RootIndex::build(const Root& root, const std::string& mounts, const CancelToken& cancel) {
  reset();
  path_ = root.rule->path;
  inode_ = root.inode;
  mount_id_ = root.mount_id;
  mounts_ = mounts;
  const std::optional<std::uint64_t> settle = settleNs(root.fd.get());
  if (!settle) {
    unfit_ =
        path_ + ": on a file system that does not tell all changes; it is walked at each request";
    finish();
    return true;
  }
  settle_ns_ = *settle;
  verified_ticks_ = rt::ticks();
  nextRound();
  files_->beginFilling();
  pending_.push_back(folders_.add(""));
  ++totals_.folders;
  if (!listPending(root, cancel)) {
    reset();
    return false;
  }
  sweep();
  shared_.clear();
  files_->endFilling();
  state_ = State::kReady;
  finish();
  return true;
}

/// Rounds are told apart by 8 bits, so before one comes again no record may bear it.
void RootIndex::nextRound() {
  if (++round_ != 0) return;
  files_->forgetRounds();
  for (std::uint32_t id = 0; id < folders_.end(); ++id) folders_.at(id).round = 0;
  round_ = 1;
}

bool RootIndex::apply(const Root& root, const std::vector<Changed>& changes,
                      std::vector<std::uint64_t>& shared, const CancelToken& cancel) {
  nextRound();
  // What has gone, or moved away, first: it may stand again elsewhere, with the same watch.
  for (const Changed& changed : changes) dropReplaced(root, changed);
  sweep();
  for (const Changed& changed : changes) lookAtNames(root, changed);
  for (const std::uint32_t file : std::exchange(held_, {})) lookAgain(root, file);
  const std::set<std::uint32_t> linked = files_->linked();
  for (const std::uint32_t file : linked) lookAgain(root, file);
  pending_.insert(pending_.end(), unwatched_.begin(), unwatched_.end());
  if (!listPending(root, cancel)) {
    reset();
    return false;
  }
  sweep();
  shared.insert(shared.end(), shared_.begin(), shared_.end());
  shared_.clear();
  finish();
  return true;
}

/// The directory, if it still stands where it is expected.
UniqueFd RootIndex::openFolder(const Root& root, std::uint32_t folder) const {
  const IndexedFolder& known = folders_.at(folder);
  UniqueFd fd = openBeneath(root.fd.get(), known.path.empty() ? "." : known.path.c_str(),
                            O_RDONLY | O_DIRECTORY);
  struct stat facts {};
  if (!fd || ::fstat(fd.get(), &facts) != 0) return UniqueFd();
  if (inodeOf(facts).device != root.inode.device ||
      (known.inode != 0 && known.inode != inodeOf(facts).number)) {
    fd.reset();
    errno = EXDEV;
  }
  return fd;
}

void RootIndex::dropReplaced(const Root& root, const Changed& changed) {
  if (!folders_.knows(changed.owner.folder)) return;
  UniqueFd fd;
  for (const std::string& name : changed.names) {
    const std::string path = joined(folders_.at(changed.owner.folder).path, name);
    const std::uint32_t known = folders_.find(path);
    if (known == FolderTree::kNone) continue;
    if (!fd) fd = openFolder(root, changed.owner.folder);
    if (!fd) return;
    const Entry entry = entryAt(fd.get(), name.c_str(), root);
    if (entry.kind != Entry::Kind::kDirectory || entry.state.inode != folders_.at(known).inode) {
      drop(known);
    }
  }
}

void RootIndex::lookAtNames(const Root& root, const Changed& changed) {
  const std::uint32_t folder = changed.owner.folder;
  if (!folders_.knows(folder)) return;
  if (changed.whole) {
    pending_.push_back(folder);
    return;
  }
  const UniqueFd fd = openFolder(root, folder);
  if (!fd) {
    torn_ = true;
    return;
  }
  for (const std::string& name : changed.names) look(root, folder, fd.get(), name);
}

void RootIndex::look(const Root& root, std::uint32_t folder, int folder_fd,
                     const std::string& name) {
  const std::string path = joined(folders_.at(folder).path, name);
  const Entry entry = entryAt(folder_fd, name.c_str(), root);
  if (isKept(*root.rule, path)) return meetKept(entry);
  if (entry.kind == Entry::Kind::kFile) return put(folder, name, entry.state);
  const std::uint32_t file = files_->find(folder, name);
  if (file != kNoId) erase(file);
  if (entry.kind == Entry::Kind::kDirectory) return enterFolder(root, path, entry.state.inode);
  if (const auto inode = inodeInName(name)) lookAtInode(root, *inode);
}

/// A name that is never taken may be a further one of a file that would be.
void RootIndex::meetKept(const Entry& entry) {
  if (entry.kind == Entry::Kind::kFile && entry.state.links > 1) {
    shared_.push_back(entry.state.inode);
  }
}

void RootIndex::lookAtInode(const Root& root, std::uint64_t inode) {
  const std::uint32_t file = files_->findInode(inode);
  if (file != kNoId) lookAgain(root, file);
}

void RootIndex::lookAgain(const Root& root, std::uint32_t file) {
  if (!files_->live(file)) return;
  const std::uint32_t folder = files_->at(file).folder;
  if (!folders_.knows(folder)) return;
  const UniqueFd fd = openFolder(root, folder);
  if (!fd) {
    torn_ = true;
    return;
  }
  const std::string name(files_->nameOf(file));
  const Entry entry = entryAt(fd.get(), name.c_str(), root);
  if (entry.kind == Entry::Kind::kFile) {
    put(folder, name, entry.state);
  } else {
    erase(file);
  }
}

/// A directory stands at `path`. One that is known may have become unreadable, or readable again.
void RootIndex::enterFolder(const Root& root, const std::string& path, std::uint64_t inode) {
  if (isKept(*root.rule, path) || isTooDeep(path)) return;
  const std::uint32_t known = folders_.find(path);
  if (known != FolderTree::kNone) {
    if (folders_.at(known).inode == inode && openFolder(root, known)) return;
    drop(known);
  }
  pending_.push_back(folders_.add(path));
  if (++totals_.folders > bounds_.max_folders) {
    unfit_ = path_ + ": more than " + std::to_string(bounds_.max_folders) +
             " directories are not followed; it is walked at each request";
  }
}

void RootIndex::put(std::uint32_t folder, const std::string& name, const FileState& state) {
  switch (files_->put(folder, name, state, round_)) {
    case FileTable::Put::kSame:
      return;
    case FileTable::Put::kTooBig:
      unfit_ = path_ + ": a file of 2 TiB or more is not followed; it is walked at each request";
      return;
    case FileTable::Put::kNew:
      ++folders_.at(folder).files;
      ++totals_.files;
      break;
    case FileTable::Put::kChanged:
      break;
  }
  ++differences_;
  if (state.links > 1) shared_.push_back(state.inode);
  if (totals_.files > bounds_.max_files || files_->nameBytes() > bounds_.max_name_bytes) {
    unfit_ = path_ + ": more than " + std::to_string(bounds_.max_files) + " files or " +
             std::to_string(bounds_.max_name_bytes) +
             " bytes of names are not followed; it is walked at each request";
  } else if (files_->linked().size() > bounds_.max_linked) {
    unfit_ = path_ + ": more than " + std::to_string(bounds_.max_linked) +
             " names of hard-linked files are not followed; it is walked at each request";
  }
}

void RootIndex::erase(std::uint32_t file) {
  --folders_.at(files_->at(file).folder).files;
  --totals_.files;
  ++differences_;
  files_->erase(file);
}

void RootIndex::drop(std::uint32_t folder) {
  for (const std::uint32_t each : folders_.withAllBelow(folder)) {
    if (folders_.at(each).watch >= 0) inbox_.remove(folders_.at(each).watch);
    folders_.at(each).watch = -1;
    unwatched_.erase(each);
    folders_.drop(each);
    --totals_.folders;
    dropped_.insert(each);
  }
}

/// Erases the records of directories that were dropped, and of those that were listed again and did
/// not show them. One look at every record, so it is done once for all, and only when one such
/// directory has records.
void RootIndex::sweep() {
  const auto holds_some = [this](std::uint32_t id) { return folders_.at(id).files > 0; };
  if (std::ranges::any_of(dropped_, holds_some) || !relisted_.empty()) {
    enum : char { kStays, kGoes, kUnlessSeen };
    std::vector<char> fate(folders_.end(), kStays);
    for (const std::uint32_t id : relisted_) fate[id] = kUnlessSeen;
    for (const std::uint32_t id : dropped_) fate[id] = kGoes;
    for (std::uint32_t file = 0; file < files_->end(); ++file) {
      if (!files_->live(file)) continue;
      const FileRecord& record = files_->at(file);
      const char what = fate[record.folder];
      if (what == kGoes || (what == kUnlessSeen && record.round != round_)) erase(file);
    }
  }
  for (const std::uint32_t id : dropped_) folders_.release(id);
  dropped_.clear();
  relisted_.clear();
}

RootIndex::Verified RootIndex::verify(const Root& root, std::uint64_t limit_ns,
                                      const CancelToken& cancel) {
  const std::uint64_t begin = rt::ticks();
  if (verify_from_.empty()) verify_began_ticks_ = begin;
  nextRound();
  differences_ = 0;
  Verified verified{.whole = true};
  for (const std::uint32_t folder : folders_.from(verify_from_)) {
    if (!folders_.knows(folder)) continue;
    if (elapsedNs(begin) > limit_ns || cancel.cancelled()) {
      verify_from_ = folders_.at(folder).path;
      verified.whole = false;
      break;
    }
    pending_.push_back(folder);
    if (!listPending(root, cancel)) {
      reset();
      return {};
    }
  }
  sweep();
  verified.differences = differences_;
  if (verified.whole) {
    verify_from_.clear();
    verified_ticks_ = verify_began_ticks_;
  }
  finish();
  return verified;
}

}  // namespace spacekeep::cachedir
