#include "services/cachedir/engine/roots.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <sys/sysmacros.h>

#include <cerrno>
#include <cstdio>
#include <fstream>
#include <map>

#include "services/cachedir/engine/beneath.h"

namespace spacekeep::cachedir {
namespace {

struct Place {
  std::uint64_t mount_id = 0;
  std::uint64_t device = 0;
};

std::optional<Place> placeOf(int fd, const char* path, int flags) {
  struct statx facts {};
  if (::statx(fd, path, flags | AT_NO_AUTOMOUNT, STATX_BASIC_STATS | STATX_MNT_ID, &facts) != 0) {
    return std::nullopt;
  }
  return Place{facts.stx_mnt_id, makedev(facts.stx_dev_major, facts.stx_dev_minor)};
}

/// Mount ID to device of the file system, from /proc/self/mountinfo (proc_pid_mountinfo(5)).
std::map<std::uint64_t, std::uint64_t> fileSystems() {
  std::map<std::uint64_t, std::uint64_t> found;
  std::ifstream table("/proc/self/mountinfo");
  for (std::string line; std::getline(table, line);) {
    unsigned long long id = 0, parent = 0;
    unsigned major_number = 0, minor_number = 0;
    if (std::sscanf(line.c_str(), "%llu %llu %u:%u", &id, &parent, &major_number, &minor_number) ==
        4) {
      found[id] = makedev(major_number, minor_number);
    }
  }
  return found;
}

std::uint64_t fileSystemOf(const Place& place,
                           const std::map<std::uint64_t, std::uint64_t>& file_systems) {
  const auto known = file_systems.find(place.mount_id);
  return known == file_systems.end() ? place.device : known->second;
}

bool alreadyThere(const std::vector<Root>& roots, const Inode& inode) {
  for (const Root& root : roots) {
    if (root.inode == inode) return true;
  }
  return false;
}

}  // namespace

OpenedRoots openRoots(const Rules& rules, const std::optional<std::string>& volume) {
  OpenedRoots opened{.roots = {}, .problems = rules.problems};
  const auto file_systems = fileSystems();
  std::optional<std::uint64_t> wanted;
  if (volume) {
    const std::optional<Place> place = placeOf(AT_FDCWD, volume->c_str(), AT_SYMLINK_NOFOLLOW);
    if (!place) {
      opened.problems.push_back(*volume + ": not a volume: " + errnoText(errno));
      return opened;
    }
    wanted = fileSystemOf(*place, file_systems);
  }
  for (const DirectoryRule& rule : rules.directories) {
    Root root;
    root.rule = &rule;
    root.fd = openDirectoryWithoutLinks(rule.path);
    if (!root.fd) {
      if (errno != ENOENT) {
        opened.problems.push_back(rule.path + ": cannot be opened: " + errnoText(errno) +
                                  (errno == ELOOP ? "; name the real directory" : ""));
      }
      continue;
    }
    struct stat facts {};
    const std::optional<Place> place = placeOf(root.fd.get(), "", AT_EMPTY_PATH);
    if (!place || ::fstat(root.fd.get(), &facts) != 0) continue;
    root.inode = inodeOf(facts);
    root.mount_id = place->mount_id;
    root.file_system = fileSystemOf(*place, file_systems);
    if (wanted && root.file_system != *wanted) continue;
    // Two names of one directory (a bind mount) would count every file twice.
    if (!alreadyThere(opened.roots, root.inode)) opened.roots.push_back(std::move(root));
  }
  return opened;
}

}  // namespace spacekeep::cachedir
