#include "services/command/engine/remove_tree.h"

#include <dirent.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <memory>
#include <string>
#include <vector>

#include "services/cachedir/engine/beneath.h"
#include "services/cachedir/engine/entry.h"

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

 private:
  bool removeEntry(int folder_fd, const char* name, std::size_t depth) {
    if (::unlinkat(folder_fd, name, 0) == 0 || errno == ENOENT) return true;
    return errno == EISDIR && remove(folder_fd, name, depth + 1);
  }

  const cachedir::CancelToken& cancel_;
};

}  // namespace

bool removeTree(int folder_fd, const char* name, const cachedir::CancelToken& cancel) {
  return Removal(cancel).remove(folder_fd, name, 0);
}

}  // namespace spacekeep::command
