#include "services/cachedir/engine/remover.h"

#include <fcntl.h>
#include <sys/stat.h>

#include <cerrno>

#include "services/cachedir/engine/beneath.h"
#include "services/cachedir/engine/elapsed.h"
#include "services/cachedir/engine/file_guard.h"
#include "services/cachedir/engine/own_blocks.h"

namespace spacekeep::cachedir {
namespace {

// Where leases cannot tell who has a file open, the scan of /proc is all there is, and must be
// fresh.
constexpr std::uint64_t kFreshScanNs = 500 * kNsPerMs;

bool sameName(int folder, const std::string& name, const Inode& inode) {
  struct stat facts {};
  return ::fstatat(folder, name.c_str(), &facts, AT_SYMLINK_NOFOLLOW) == 0 &&
         inodeOf(facts) == inode;
}

}  // namespace

/// The directories of all names, none when one has gone or two names are one and the same.
std::optional<std::vector<Remover::Place>> Remover::places(const Candidate& candidate) const {
  std::vector<Place> found;
  for (std::size_t i = 0; i <= candidate.others.size(); ++i) {
    const Link& link = i == 0 ? candidate.first : candidate.others[i - 1];
    const std::string& path = link.folder->path;
    Place place{openBeneath(roots_[link.folder->root].fd.get(), path.empty() ? "." : path.c_str(),
                            O_RDONLY | O_DIRECTORY),
                {},
                &link};
    struct stat facts {};
    if (!place.folder || ::fstat(place.folder.get(), &facts) != 0) return std::nullopt;
    place.folder_inode = inodeOf(facts);
    for (const Place& other : found) {
      // One directory mounted in two places shows one name twice, and hides the name elsewhere.
      if (other.folder_inode == place.folder_inode && other.link->name == link.name) {
        return std::nullopt;
      }
    }
    found.push_back(std::move(place));
  }
  return found;
}

std::optional<Left> Remover::objection(int fd, const Candidate& candidate,
                                       struct stat& facts) const {
  if (::fstat(fd, &facts) != 0) return Left::kFailed;
  if (inodeOf(facts) != candidate.turn.inode || !S_ISREG(facts.st_mode) ||
      usedNs(facts) > candidate.turn.used_ns) {
    return Left::kUsedSince;
  }
  if (!settings_.single_names && facts.st_nlink != candidate.others.size() + 1) {
    return Left::kLinked;
  }
  return std::nullopt;
}

bool Remover::seenOpen(const Candidate& candidate, bool proven, const CancelToken& cancel) {
  if (!proven && open_files_.ageNs() > kFreshScanNs && !open_files_.scan(roots_, cancel)) {
    return true;
  }
  const Root& root = roots_[candidate.first.folder->root];
  return open_files_.holds(candidate.turn.inode, root.file_system);
}

std::variant<Removal, Left> Remover::take(const Candidate& candidate, const CancelToken& cancel) {
  // Before the file is opened: opening a file is felt by whoever has a lease on it.
  if (seenOpen(candidate, true, cancel)) return Left::kOpen;
  const std::optional<std::vector<Place>> names = places(candidate);
  if (!names) return Left::kUsedSince;
  const UniqueFd fd = openBeneath(names->front().folder.get(), candidate.first.name.c_str(),
                                  O_RDONLY | O_NONBLOCK | O_NOCTTY);
  if (!fd) {
    if (errno == EWOULDBLOCK) return Left::kLocked;  // a lease
    return errno == EACCES || errno == EPERM ? Left::kUnreadable : Left::kUsedSince;
  }
  struct stat facts {};
  if (const auto no = objection(fd.get(), candidate, facts)) return *no;
  const std::uint64_t bytes = ownBytes(fd.get(), facts);
  if (bytes == 0 && !settings_.take_empty) return Left::kNothingBack;

  const FileGuard guard(fd.get());
  switch (guard.verdict()) {
    case FileGuard::Verdict::kLocked:
      return Left::kLocked;
    case FileGuard::Verdict::kOpen:
      return Left::kOpen;
    case FileGuard::Verdict::kUnproven:
      if (seenOpen(candidate, false, cancel)) return Left::kOpen;
      if (open_files_.hiddenProcesses() > 0) return Left::kUnproven;
      break;
    case FileGuard::Verdict::kAlone:
      break;
  }
  if (const auto no = objection(fd.get(), candidate, facts)) return *no;
  Removal removal;
  for (const Place& place : *names) {
    const int folder = place.folder.get();
    const std::string& name = place.link->name;
    if (!sameName(folder, name, candidate.turn.inode) || !guard.stillAlone()) {
      return Left::kUsedSince;
    }
    if (settings_.dry_run) continue;
    if (::unlinkat(folder, name.c_str(), 0) != 0) return Left::kFailed;
    if (roots_[place.link->folder->root].rule->remove_empty_directories) {
      removal.directories += removeEmpty(*place.link->folder);
    }
  }
  if (settings_.dry_run) return Removal{bytes, 0};
  // Whoever opened the file in the last instant, or linked it, keeps its blocks: claim nothing.
  if (::fstat(fd.get(), &facts) == 0 && facts.st_nlink == 0 && guard.stillAlone()) {
    removal.bytes = bytes;
  }
  return removal;
}

/// Removes `folder` and then those above it, as long as they are empty; never the root.
std::uint64_t Remover::removeEmpty(const Folder& folder) const {
  const int root = roots_[folder.root].fd.get();
  std::uint64_t removed = 0;
  std::string path = folder.path;
  while (!path.empty()) {
    const std::size_t slash = path.rfind('/');
    const std::string above = slash == std::string::npos ? "." : path.substr(0, slash);
    const std::string name = slash == std::string::npos ? path : path.substr(slash + 1);
    const UniqueFd parent = openBeneath(root, above.c_str(), O_RDONLY | O_DIRECTORY);
    // The kernel refuses a directory that is not empty, so nothing needs to be looked at first.
    if (!parent || ::unlinkat(parent.get(), name.c_str(), AT_REMOVEDIR) != 0) break;
    ++removed;
    path = slash == std::string::npos ? "" : above;
  }
  return removed;
}

}  // namespace spacekeep::cachedir
