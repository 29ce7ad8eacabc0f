#include "services/cachedir/engine/open_files.h"

#include <dirent.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <sys/sysmacros.h>

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <limits>
#include <memory>

#include "services/cachedir/engine/elapsed.h"

namespace spacekeep::cachedir {
namespace {

struct DirectoryCloser {
  void operator()(DIR* directory) const { ::closedir(directory); }
};
using Directory = std::unique_ptr<DIR, DirectoryCloser>;

struct FileCloser {
  void operator()(std::FILE* file) const { std::fclose(file); }
};
using File = std::unique_ptr<std::FILE, FileCloser>;

File openText(const std::string& path) { return File(std::fopen(path.c_str(), "re")); }

bool isNumber(const char* name) { return name[0] >= '0' && name[0] <= '9'; }

bool isRefusal(int error) { return error == EACCES || error == EPERM; }

std::vector<std::uint64_t> devicesOf(const std::vector<Root>& roots) {
  std::vector<std::uint64_t> devices;
  for (const Root& root : roots) {
    devices.push_back(root.inode.device);
    devices.push_back(root.file_system);
  }
  std::ranges::sort(devices);
  return devices;
}

}  // namespace

bool OpenFiles::ensure(const std::vector<Root>& roots, std::uint64_t max_age_ns,
                       const CancelToken& cancel) {
  return (ageNs() <= max_age_ns && devices_ == devicesOf(roots)) || scan(roots, cancel);
}

bool OpenFiles::scan(const std::vector<Root>& roots, const CancelToken& cancel) {
  good_ = false;
  hidden_ = 0;
  held_.clear();
  devices_ = devicesOf(roots);
  const Directory processes(::opendir(proc_.c_str()));
  if (!processes) return false;
  bool first_seen = false;
  while (const dirent* entry = ::readdir(processes.get())) {
    if (cancel.cancelled() || held_.size() > kMaxHeldFiles) return false;
    if (!isNumber(entry->d_name)) continue;
    first_seen = first_seen || std::string_view(entry->d_name) == "1";
    scanProcess(proc_ + "/" + entry->d_name);
  }
  // Where whole processes are left out (hidepid, proc(5)) the first one is, too.
  if (!first_seen) ++hidden_;
  scanLocks();
  std::ranges::sort(held_);
  held_.erase(std::unique(held_.begin(), held_.end()), held_.end());
  scanned_ticks_ = rt::ticks();
  good_ = held_.size() <= kMaxHeldFiles;
  return good_;
}

void OpenFiles::scanProcess(const std::string& process) {
  const bool descriptors = mayScanDescriptors(process);
  const bool mappings = mayScanMappings(process);
  if (!descriptors || !mappings) ++hidden_;
}

/// Who may list the descriptors may not always ask what they are: a process with privileges that we
/// lack shows their numbers alone.
bool OpenFiles::mayScanDescriptors(const std::string& process) {
  const Directory descriptors(::opendir((process + "/fd").c_str()));
  if (!descriptors) return !isRefusal(errno);
  bool allowed = true;
  const int fd = ::dirfd(descriptors.get());
  while (const dirent* entry = ::readdir(descriptors.get())) {
    if (!isNumber(entry->d_name)) continue;
    char first = 0;
    const ssize_t size = ::readlinkat(fd, entry->d_name, &first, 1);
    if (size < 0 && isRefusal(errno)) allowed = false;
    // Only what has a path is a file; asking a socket or a pipe further would be a waste.
    if (size != 1 || first != '/') continue;
    struct statx facts {};
    // Without a question to a server: a descriptor on a dead network mount must not hold us up.
    if (::statx(fd, entry->d_name, AT_STATX_DONT_SYNC | AT_NO_AUTOMOUNT, STATX_INO, &facts) == 0) {
      remember({makedev(facts.stx_dev_major, facts.stx_dev_minor), facts.stx_ino});
    }
  }
  return allowed;
}

bool OpenFiles::mayScanMappings(const std::string& process) {
  const File maps = openText(process + "/maps");
  if (!maps) return !isRefusal(errno);
  char line[512];
  bool at_start = true;
  while (std::fgets(line, sizeof line, maps.get()) != nullptr) {
    const bool was_start = at_start;
    at_start = std::string_view(line).ends_with('\n');
    unsigned major_number = 0, minor_number = 0;
    unsigned long long inode = 0;
    if (was_start &&
        std::sscanf(line, "%*x-%*x %*4s %*x %x:%x %llu", &major_number, &minor_number, &inode) ==
            3 &&
        inode != 0) {
      remember({makedev(major_number, minor_number), inode});
    }
  }
  return true;
}

/// Lines as "1: FLOCK  ADVISORY  WRITE 660 08:02:12345 0 EOF"; the device is hexadecimal
/// (proc_locks(5)). They also show what processes hold whose descriptors are hidden from us.
void OpenFiles::scanLocks() {
  const File locks = openText(proc_ + "/locks");
  if (!locks) return;
  char line[512];
  while (std::fgets(line, sizeof line, locks.get()) != nullptr) {
    unsigned major_number = 0, minor_number = 0;
    unsigned long long inode = 0;
    // A waiter has "->" in front of its kind: the holder's own line tells the same file.
    if (std::sscanf(line, "%*d: %*s %*s %*s %*d %x:%x:%llu", &major_number, &minor_number,
                    &inode) == 3) {
      remember({makedev(major_number, minor_number), inode});
    }
  }
}

void OpenFiles::remember(const Inode& inode) {
  if (std::ranges::binary_search(devices_, inode.device)) held_.push_back(inode);
}

std::uint64_t OpenFiles::ageNs() const {
  return good_ ? elapsedNs(scanned_ticks_) : std::numeric_limits<std::uint64_t>::max();
}

std::set<std::uint64_t> OpenFiles::heldOn(const Root& root) const {
  std::set<std::uint64_t> numbers;
  for (const std::uint64_t device : {root.inode.device, root.file_system}) {
    const auto same = std::ranges::equal_range(held_, device, {}, &Inode::device);
    for (const Inode& inode : same) numbers.insert(inode.number);
  }
  return numbers;
}

bool OpenFiles::holds(const Inode& inode, std::uint64_t file_system) const {
  return std::ranges::binary_search(held_, inode) ||
         std::ranges::binary_search(held_, Inode{file_system, inode.number});
}

}  // namespace spacekeep::cachedir
