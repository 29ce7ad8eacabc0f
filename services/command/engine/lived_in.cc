#include "services/command/engine/lived_in.h"

#include <dirent.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <sys/sysmacros.h>
#include <unistd.h>

#include <fstream>
#include <memory>
#include <sstream>
#include <utility>

#include "services/cachedir/engine/beneath.h"
#include "services/cachedir/engine/entry.h"

namespace spacekeep::command {
namespace {

struct DirectoryCloser {
  void operator()(DIR* directory) const { ::closedir(directory); }
};
using Directory = std::unique_ptr<DIR, DirectoryCloser>;

unsigned char kindOf(int folder_fd, const dirent& entry) {
  if (entry.d_type != DT_UNKNOWN) return entry.d_type;
  struct stat facts {};
  if (::fstatat(folder_fd, entry.d_name, &facts, AT_SYMLINK_NOFOLLOW) != 0) return DT_UNKNOWN;
  return static_cast<unsigned char>(IFTODT(facts.st_mode));
}

bool look(int folder_fd, const char* name, const std::set<cachedir::Inode>& held,
          std::size_t depth) {
  if (depth > cachedir::kMaxDepth) return true;
  cachedir::UniqueFd fd = cachedir::openBeneath(folder_fd, name, O_RDONLY | O_DIRECTORY);
  struct stat facts {};
  if (!fd || ::fstat(fd.get(), &facts) != 0 || held.contains(cachedir::inodeOf(facts))) return true;
  const Directory directory(::fdopendir(fd.get()));
  if (!directory) return true;
  static_cast<void>(fd.release());
  while (const dirent* entry = ::readdir(directory.get())) {
    if (cachedir::isDotName(entry->d_name)) continue;
    const unsigned char kind = kindOf(::dirfd(directory.get()), *entry);
    if (kind == DT_SOCK || kind == DT_FIFO) return true;
    if (kind == DT_DIR && look(::dirfd(directory.get()), entry->d_name, held, depth + 1)) {
      return true;
    }
  }
  return false;
}

/// Without a question to a server: a descriptor on a dead network mount must not hold us up.
void addIfDirectory(int folder_fd, const char* link, std::set<cachedir::Inode>& to) {
  struct statx facts {};
  if (::statx(folder_fd, link, AT_STATX_DONT_SYNC | AT_NO_AUTOMOUNT, STATX_TYPE | STATX_INO,
              &facts) == 0 &&
      S_ISDIR(facts.stx_mode)) {
    to.insert({makedev(facts.stx_dev_major, facts.stx_dev_minor), facts.stx_ino});
  }
}

void addOpenOnes(const std::string& process, std::set<cachedir::Inode>& to) {
  const Directory descriptors(::opendir((process + "/fd").c_str()));
  while (const dirent* entry = descriptors ? ::readdir(descriptors.get()) : nullptr) {
    if (!cachedir::isDotName(entry->d_name)) {
      addIfDirectory(::dirfd(descriptors.get()), entry->d_name, to);
    }
  }
}

}  // namespace

std::set<cachedir::Inode> heldDirectories(const std::string& proc) {
  std::set<cachedir::Inode> held;
  const std::string own = std::to_string(::getpid());
  const Directory processes(::opendir(proc.c_str()));
  while (const dirent* entry = processes ? ::readdir(processes.get()) : nullptr) {
    if (entry->d_name[0] < '0' || entry->d_name[0] > '9') continue;
    const std::string process = proc + "/" + entry->d_name;
    for (const char* link : {"/cwd", "/root"}) {
      addIfDirectory(AT_FDCWD, (process + link).c_str(), held);
    }
    if (entry->d_name != own) addOpenOnes(process, held);
  }
  return held;
}

bool hasSignOfLife(int fd, const std::set<cachedir::Inode>& held) { return look(fd, ".", held, 0); }

std::set<std::string> mountPoints() {
  std::set<std::string> points;
  std::ifstream table("/proc/self/mountinfo");
  for (std::string line; std::getline(table, line);) {
    std::istringstream fields(line);
    std::string id, parent, device, root, point;
    if (fields >> id >> parent >> device >> root >> point) points.insert(std::move(point));
  }
  return points;
}

bool isAnyWithin(const std::set<std::string>& paths, const std::string& path) {
  if (paths.contains(path)) return true;
  const auto next = paths.lower_bound(path + "/");
  return next != paths.end() && next->starts_with(path + "/");
}

}  // namespace spacekeep::command
