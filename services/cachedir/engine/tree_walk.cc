#include "services/cachedir/engine/tree_walk.h"

#include <dirent.h>
#include <fcntl.h>
#include <sys/stat.h>

#include <cerrno>
#include <optional>

#include "services/cachedir/engine/beneath.h"

namespace spacekeep::cachedir {
namespace {

struct DirectoryCloser {
  void operator()(DIR* directory) const { ::closedir(directory); }
};

/// Why a directory that was listed cannot be opened; none when it has gone meanwhile, or something
/// else stands there, which is none of ours.
std::optional<Left> reasonOf(int error) {
  switch (error) {
    case ENOENT:
    case ELOOP:
    case ENOTDIR:
      return std::nullopt;
    case EXDEV:
      return Left::kElsewhere;
    case EACCES:
      return Left::kUnreadable;
    default:
      return Left::kFailed;
  }
}

}  // namespace

struct TreeWalk::Level {
  std::unique_ptr<DIR, DirectoryCloser> directory;
  std::shared_ptr<const Folder> folder;

  [[nodiscard]] int fd() const { return ::dirfd(directory.get()); }
};

bool TreeWalk::forEachFile(const std::function<void(const FoundFile&)>& visit,
                           const CancelToken& cancel, Tally& tally) {
  for (std::size_t i = 0; i < roots_.size(); ++i) {
    if (!walkRoot(i, visit, cancel, tally)) return false;
  }
  return true;
}

void TreeWalk::enter(std::vector<Level>& levels, UniqueFd fd, Folder folder, Tally& tally) {
  std::unique_ptr<DIR, DirectoryCloser> directory(::fdopendir(fd.get()));
  if (!directory) {
    tally.add(Left::kFailed);
    return;
  }
  static_cast<void>(fd.release());
  levels.push_back({std::move(directory), std::make_shared<const Folder>(std::move(folder))});
}

bool TreeWalk::walkRoot(std::size_t index, const std::function<void(const FoundFile&)>& visit,
                        const CancelToken& cancel, Tally& tally) {
  std::vector<Level> levels;
  // A description of its own: the root's would share its reading position with other walks.
  enter(levels, openBeneath(roots_[index].fd.get(), ".", O_RDONLY | O_DIRECTORY), {index, ""},
        tally);
  while (!levels.empty()) {
    if (cancel.cancelled()) return false;
    const dirent* entry = ::readdir(levels.back().directory.get());
    if (entry == nullptr) {
      levels.pop_back();
    } else if (isDotName(entry->d_name)) {
      continue;
    } else if (entry->d_type == DT_DIR) {
      descend(levels, entry->d_name, tally);
    } else if (entry->d_type == DT_REG) {
      meet(levels.back(), entry->d_name, visit, tally);
    } else if (entry->d_type == DT_UNKNOWN) {
      struct stat facts {};
      if (::fstatat(levels.back().fd(), entry->d_name, &facts, AT_SYMLINK_NOFOLLOW) != 0) continue;
      if (S_ISDIR(facts.st_mode)) descend(levels, entry->d_name, tally);
      if (S_ISREG(facts.st_mode)) meet(levels.back(), entry->d_name, visit, tally);
    }
  }
  return true;
}

void TreeWalk::descend(std::vector<Level>& levels, const char* name, Tally& tally) {
  const Level& above = levels.back();
  const Root& root = roots_[above.folder->root];
  std::string path = joined(above.folder->path, name);
  if (isKept(*root.rule, path)) return;
  if (isTooDeep(path)) {
    tally.add(Left::kTooDeep);
    return;
  }
  UniqueFd fd = openBeneath(above.fd(), name, O_RDONLY | O_DIRECTORY);
  struct stat facts {};
  if (!fd || ::fstat(fd.get(), &facts) != 0) {
    if (const auto why = reasonOf(errno)) tally.add(*why);
    return;
  }
  // A subvolume inside is a file system of its own in all that counts here, snapshots above all.
  if (inodeOf(facts).device != root.inode.device) {
    tally.add(Left::kElsewhere);
    return;
  }
  enter(levels, std::move(fd), {above.folder->root, std::move(path)}, tally);
}

void TreeWalk::meet(const Level& level, const char* name,
                    const std::function<void(const FoundFile&)>& visit, Tally& tally) {
  const Root& root = roots_[level.folder->root];
  if (!root.rule->keep.empty() && isKept(*root.rule, joined(level.folder->path, name))) return;
  const Entry entry = entryAt(level.fd(), name, root);
  if (entry.kind == Entry::Kind::kFailed) tally.add(Left::kFailed);
  if (entry.kind == Entry::Kind::kOther) tally.add(Left::kElsewhere);  // mounted here
  if (entry.kind != Entry::Kind::kFile) return;
  visit(FoundFile{.folder = level.folder,
                  .name = name,
                  .inode = {entry.device, entry.state.inode},
                  .used_ns = entry.state.used_ns,
                  .bytes = entry.state.bytes,
                  .links = entry.state.links});
}

}  // namespace spacekeep::cachedir
