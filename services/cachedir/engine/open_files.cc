#include "services/cachedir/engine/open_files.h"

#include <dirent.h>
#include <fcntl.h>
#include <linux/kcmp.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <sys/sysmacros.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <limits>
#include <memory>
#include <string_view>

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

/// A process, a thread or a descriptor that ended meanwhile holds nothing. Anything else that went
/// wrong, a lack of descriptors or memory too, leaves open what there was to see.
bool hasGone(int error) { return error == ENOENT || error == ESRCH; }

/// Shows `visit` the numbers that a directory of /proc holds, with its descriptor. False when not
/// all of them were to be seen.
template <class Visit>
bool forEachNumber(const std::string& path, const Visit& visit) {
  const Directory directory(::opendir(path.c_str()));
  if (!directory) return hasGone(errno);
  bool all = true;
  for (errno = 0; const dirent* entry = ::readdir(directory.get()); errno = 0) {
    if (isNumber(entry->d_name)) all = visit(::dirfd(directory.get()), entry->d_name) && all;
  }
  return hasGone(errno) || (errno == 0 && all);
}

/// In a PID name space of its own, as a container's, /proc has a first process too, and shows nobody
/// who is outside. The kernel gives the name space that it starts in always this number.
bool showsAllNamespaces(const std::string& proc) {
  constexpr std::string_view kFirst = "pid:[4026531836]";
  char target[kFirst.size() + 1];
  const ssize_t size = ::readlink((proc + "/self/ns/pid").c_str(), target, sizeof target);
  return size > 0 && std::string_view(target, static_cast<std::size_t>(size)) == kFirst;
}

/// Whether the thread has the descriptors of its process, as nearly all have, and the main one that
/// the process goes by. No where nobody may tell.
bool sharesDescriptors(const std::string& process, const char* thread) {
  const long pid = std::atol(process.c_str() + process.rfind('/') + 1);
  const long tid = std::atol(thread);
  return pid == tid || ::syscall(SYS_kcmp, pid, tid, KCMP_FILES, 0, 0) == 0;
}

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

bool isOurs(const std::string& process) {
  struct stat facts {};
  const uid_t own = ::geteuid();
  return ::stat(process.c_str(), &facts) == 0 && (own == 0 || facts.st_uid == own);
}

bool OpenFiles::ensure(const std::vector<Root>& roots, std::uint64_t max_age_ns,
                       const CancelToken& cancel) {
  return (ageNs() <= max_age_ns && devices_ == devicesOf(roots)) || scan(roots, cancel);
}

bool OpenFiles::scan(const std::vector<Root>& roots, const CancelToken& cancel) {
  good_ = false;
  hidden_ = hidden_own_ = 0;
  held_.clear();
  devices_ = devicesOf(roots);
  const Directory processes(::opendir(proc_.c_str()));
  if (!processes) return false;
  bool first_seen = false;
  for (errno = 0; const dirent* entry = ::readdir(processes.get()); errno = 0) {
    if (cancel.cancelled() || held_.size() > kMaxHeldFiles) return false;
    if (!isNumber(entry->d_name)) continue;
    first_seen = first_seen || std::string_view(entry->d_name) == "1";
    scanProcess(proc_ + "/" + entry->d_name);
  }
  if (errno != 0) return false;
  // Where whole processes are left out (hidepid, proc(5)) the first one is, too.
  if (!first_seen || !showsAllNamespaces(proc_)) ++hidden_;
  scanLocks();
  std::ranges::sort(held_);
  held_.erase(std::unique(held_.begin(), held_.end()), held_.end());
  scanned_ticks_ = rt::ticks();
  good_ = held_.size() <= kMaxHeldFiles;
  return good_;
}

void OpenFiles::scanProcess(const std::string& process) {
  if (sawAllOf(process) && sawThreads(process)) return;
  ++hidden_;
  if (isOurs(process)) ++hidden_own_;
}

bool OpenFiles::sawAllOf(const std::string& process) {
  const bool descriptors = sawDescriptors(process);
  return sawMappings(process) && descriptors;
}

/// A process shows what its main thread has: nothing once that has ended while others go on, and not
/// the descriptors of a thread that has some of its own (unshare(2)).
bool OpenFiles::sawThreads(const std::string& process) {
  const std::string threads = process + "/task";
  return forEachNumber(threads, [&](int, const char* thread) {
    return sharesDescriptors(process, thread) || sawAllOf(threads + "/" + thread);
  });
}

/// Who may list the descriptors may not always ask what they are: a process with privileges that we
/// lack shows their numbers alone.
bool OpenFiles::sawDescriptors(const std::string& process) {
  return forEachNumber(process + "/fd", [this](int folder, const char* name) {
    char first = 0;
    // A path that is too long to be told is still that of a file.
    if (::readlinkat(folder, name, &first, 1) < 0 && errno != ENAMETOOLONG) return hasGone(errno);
    // Only what has a path is a file; asking a socket or a pipe further would be a waste.
    if (first != '/' && first != 0) return true;
    struct statx facts {};
    // Without a question to a server: a descriptor on a dead network mount must not hold us up.
    constexpr int kFlags = AT_STATX_DONT_SYNC | AT_NO_AUTOMOUNT;
    if (::statx(folder, name, kFlags, STATX_INO, &facts) == 0) {
      remember({makedev(facts.stx_dev_major, facts.stx_dev_minor), facts.stx_ino});
      return true;
    }
    // Who mounted a file system in user space may keep all but its device to himself.
    return hasGone(errno) || (::statx(folder, name, kFlags, 0, &facts) == 0 &&
                              !isOnOurs(makedev(facts.stx_dev_major, facts.stx_dev_minor)));
  });
}

bool OpenFiles::sawMappings(const std::string& process) {
  const File maps = openText(process + "/maps");
  if (!maps) return hasGone(errno);
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
  return std::ferror(maps.get()) == 0 || hasGone(errno);
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

bool OpenFiles::isOnOurs(std::uint64_t device) const {
  return std::ranges::binary_search(devices_, device);
}

void OpenFiles::remember(const Inode& inode) {
  if (isOnOurs(inode.device)) held_.push_back(inode);
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
