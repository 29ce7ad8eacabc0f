#include "services/command/engine/remove_tree.h"

#include <dirent.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <memory>
#include <optional>

#include "services/cachedir/engine/beneath.h"
#include "services/cachedir/engine/entry.h"
#include "services/cachedir/engine/file_guard.h"
#include "services/cachedir/engine/own_blocks.h"

namespace spacekeep::command {
namespace {

struct DirectoryCloser {
  void operator()(DIR* directory) const { ::closedir(directory); }
};
using Directory = std::unique_ptr<DIR, DirectoryCloser>;

Directory opened(int folder_fd, const char* name) {
  cachedir::UniqueFd fd = cachedir::openBeneath(folder_fd, name, O_RDONLY | O_DIRECTORY);
  if (!fd) return nullptr;
  struct stat above {};
  struct stat facts {};
  if (::fstat(folder_fd, &above) != 0 || ::fstat(fd.get(), &facts) != 0) return nullptr;
  if (facts.st_dev != above.st_dev) {  // a subvolume
    errno = EXDEV;
    return nullptr;
  }
  // Some programs take the right to write from what they keep, and the right is the owner's to give.
  if ((facts.st_mode & S_IRWXU) != S_IRWXU) {
    static_cast<void>(::fchmod(fd.get(), (facts.st_mode & 07777) | S_IRWXU));
  }
  Directory directory(::fdopendir(fd.get()));
  if (directory) static_cast<void>(fd.release());
  return directory;
}

cachedir::UniqueFd openedFile(int folder_fd, const char* name) {
  struct stat facts {};
  if (::fstatat(folder_fd, name, &facts, AT_SYMLINK_NOFOLLOW) != 0 || !S_ISREG(facts.st_mode)) {
    return cachedir::UniqueFd();
  }
  return cachedir::openBeneath(folder_fd, name, O_RDONLY | O_NONBLOCK | O_NOCTTY);
}

/// One file that is to be unlinked, and what that gives back.
class Going {
 public:
  /// `fd` stays the caller's.
  explicit Going(int fd) : fd_(fd), guard_(fd) {
    struct stat facts {};
    if (::fstat(fd_, &facts) == 0) bytes_ = cachedir::ownBytes(fd_, facts);
  }

  /// Asked afterwards. Nothing while it has another name, or somebody has it open.
  [[nodiscard]] std::uint64_t cameBack() const {
    using Verdict = cachedir::FileGuard::Verdict;
    if (guard_.verdict() == Verdict::kOpen || guard_.verdict() == Verdict::kLocked) return 0;
    struct stat facts {};
    const bool gone = ::fstat(fd_, &facts) == 0 && facts.st_nlink == 0;
    return gone && guard_.stillAlone() ? bytes_ : 0;
  }

 private:
  const int fd_;
  const cachedir::FileGuard guard_;
  std::uint64_t bytes_ = 0;
};

class Removal {
 public:
  explicit Removal(const cachedir::CancelToken& cancel) : cancel_(cancel) {}

  bool remove(int folder_fd, const char* name, std::size_t depth) {
    if (depth > cachedir::kMaxDepth) return false;
    const Directory directory = opened(folder_fd, name);
    if (!directory) return errno == ENOENT;
    bool empty = true;
    while (const dirent* entry = ::readdir(directory.get())) {
      if (cachedir::isDotName(entry->d_name)) continue;
      if (cancel_.cancelled()) return false;
      empty = removeEntry(::dirfd(directory.get()), entry->d_name, depth) && empty;
    }
    return empty && (::unlinkat(folder_fd, name, AT_REMOVEDIR) == 0 || errno == ENOENT);
  }

  [[nodiscard]] std::uint64_t bytes() const { return bytes_; }

 private:
  bool removeEntry(int folder_fd, const char* name, std::size_t depth) {
    const cachedir::UniqueFd fd = openedFile(folder_fd, name);
    const std::optional<Going> going = fd ? std::optional<Going>(fd.get()) : std::nullopt;
    if (::unlinkat(folder_fd, name, 0) == 0) {
      if (going) bytes_ += going->cameBack();
      return true;
    }
    return errno == ENOENT || (errno == EISDIR && remove(folder_fd, name, depth + 1));
  }

  const cachedir::CancelToken& cancel_;
  std::uint64_t bytes_ = 0;
};

}  // namespace

Removed removeTree(int folder_fd, const char* name, const cachedir::CancelToken& cancel) {
  Removal removal(cancel);
  const bool all = removal.remove(folder_fd, name, 0);
  return {all, removal.bytes()};
}

}  // namespace spacekeep::command
