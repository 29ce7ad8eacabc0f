#include "services/command/engine/lived_in.h"

#include <dirent.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <climits>
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

bool look(int folder_fd, const char* name, std::size_t depth) {
  if (depth > cachedir::kMaxDepth) return true;
  cachedir::UniqueFd fd = cachedir::openBeneath(folder_fd, name, O_RDONLY | O_DIRECTORY);
  const Directory directory(fd ? ::fdopendir(fd.get()) : nullptr);
  if (!directory) return true;
  static_cast<void>(fd.release());
  while (const dirent* entry = ::readdir(directory.get())) {
    if (cachedir::isDotName(entry->d_name)) continue;
    const unsigned char kind = kindOf(::dirfd(directory.get()), *entry);
    if (kind == DT_SOCK || kind == DT_FIFO) return true;
    if (kind == DT_DIR && look(::dirfd(directory.get()), entry->d_name, depth + 1)) return true;
  }
  return false;
}

}  // namespace

bool hasMeetingPoint(int fd) { return look(fd, ".", 0); }

std::set<std::string> workingDirectories(const std::string& proc) {
  std::set<std::string> found;
  const Directory processes(::opendir(proc.c_str()));
  while (const dirent* entry = processes ? ::readdir(processes.get()) : nullptr) {
    if (entry->d_name[0] < '0' || entry->d_name[0] > '9') continue;
    char target[PATH_MAX];
    const std::string link = proc + "/" + entry->d_name + "/cwd";
    const ssize_t size = ::readlink(link.c_str(), target, sizeof target);
    if (size > 0) found.emplace(target, static_cast<std::size_t>(size));
  }
  return found;
}

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
