#include "services/command/engine/in_use.h"

#include <dirent.h>
#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <sys/sysmacros.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <climits>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <fstream>
#include <memory>
#include <optional>
#include <string_view>

#include "services/cachedir/engine/beneath.h"
#include "services/cachedir/engine/elapsed.h"
#include "services/cachedir/engine/open_files.h"
#include "services/cachedir/engine/roots.h"
#include "services/cachedir/engine/tree_walk.h"
#include "services/command/base/path_patterns.h"
#include "support/runtime/runtime.h"

namespace spacekeep::command {
namespace {

struct DirectoryCloser {
  void operator()(DIR* directory) const { ::closedir(directory); }
};

constexpr std::size_t kCommBytes = 15;  // TASK_COMM_LEN without its end, proc_pid_comm(5)

std::string executableOf(const std::string& process) {
  char target[PATH_MAX];
  const ssize_t size = ::readlink((process + "/exe").c_str(), target, sizeof target);
  if (size <= 0) return "";
  std::string_view path(target, static_cast<std::size_t>(size));
  // An upgrade replaces the file under a program that goes on running.
  constexpr std::string_view kGone = " (deleted)";
  if (path.ends_with(kGone)) path.remove_suffix(kGone.size());
  return std::string(path.substr(path.rfind('/') + 1));
}

std::string commOf(const std::string& process) {
  std::ifstream stream(process + "/comm");
  std::string name;
  std::getline(stream, name);
  return name;
}

/// By the executable, and by the name that the process goes by: an interpreter's script sets it
/// ("npm install"), and it can be read where the executable cannot.
bool isCalled(const std::string& process, const std::string& name) {
  if (executableOf(process) == name) return true;
  const std::string comm = commOf(process);
  return comm == name.substr(0, kCommBytes) || comm.substr(0, comm.find(' ')) == name;
}

/// Some tools leave a process behind that only holds a name space open.
bool isIdle(const std::string& process, const std::vector<std::string>& idle) {
  if (idle.empty()) return false;
  const std::string comm = commOf(process);
  return std::ranges::any_of(
      idle, [&](const std::string& name) { return comm == name.substr(0, kCommBytes); });
}

/// None when nobody can tell.
using Answer = std::optional<bool>;

Answer runs(const Condition& condition, const std::string& proc) {
  const std::unique_ptr<DIR, DirectoryCloser> processes(::opendir(proc.c_str()));
  if (!processes) return std::nullopt;
  while (const dirent* entry = ::readdir(processes.get())) {
    if (entry->d_name[0] < '0' || entry->d_name[0] > '9') continue;
    const std::string process = proc + "/" + entry->d_name;
    if (cachedir::isOurs(process) && isCalled(process, condition.subject) &&
        !isIdle(process, condition.idle)) {
      return true;
    }
  }
  return false;
}

/// The number is asked for and not looked up in /proc, which may hide others' processes (hidepid).
Answer livesByPidFile(const std::string& path) {
  const cachedir::UniqueFd fd(::open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK));
  if (!fd) return errno == ENOENT ? Answer(false) : std::nullopt;
  char text[64] = {};
  if (::read(fd.get(), text, sizeof text - 1) < 0) return std::nullopt;
  long pid = 0;
  return std::sscanf(text, "%ld", &pid) == 1 && pid > 0 && pid <= INT_MAX &&
         (::kill(static_cast<pid_t>(pid), 0) == 0 || errno != ESRCH);
}

/// What is hidden of others does not count for a user, to whom nearly all of them are hidden.
Answer isAnyOpenBelow(const std::string& pattern, const std::string& proc) {
  cachedir::Rules rules;
  for (std::string& path : matchesOf(pattern))
    rules.directories.push_back({.path = std::move(path)});
  const cachedir::OpenedRoots opened = openRoots(rules, std::nullopt);
  if (!opened.problems.empty()) return std::nullopt;
  if (opened.roots.empty()) return false;
  cachedir::OpenFiles open_files(proc);
  if (!open_files.scan(opened.roots, cachedir::CancelToken())) return std::nullopt;
  bool found = false;
  cachedir::Tally tally;
  cachedir::TreeWalk(opened.roots)
      .forEachFile(
          [&](const cachedir::FoundFile& file) {
            const auto& root = opened.roots[file.folder->root];
            found = found || open_files.holds(file.inode, root.file_system);
          },
          cachedir::CancelToken([&found] { return found; }), tally);
  if (found) return true;
  return open_files.hiddenOwnProcesses() == 0 && tally.empty() ? Answer(false) : std::nullopt;
}

/// The lines of /proc/locks as proc_locks(5) describes them. Device numbers in them are those of the
/// file system; on btrfs a file's own differ, so there the number of the inode decides alone.
Answer hasLock(const std::string& path, const std::string& proc) {
  struct stat facts {};
  if (::stat(path.c_str(), &facts) != 0) return errno == ENOENT ? Answer(false) : std::nullopt;
  std::ifstream table(proc + "/locks");
  if (!table) return std::nullopt;
  for (std::string line; std::getline(table, line);) {
    unsigned major_number = 0, minor_number = 0;
    unsigned long long inode = 0;
    if (std::sscanf(line.c_str(), "%*d: %*s %*s %*s %*d %x:%x:%llu", &major_number, &minor_number,
                    &inode) != 3 ||
        inode != facts.st_ino) {
      continue;
    }
    const bool virtual_device = major(facts.st_dev) == 0;
    if (virtual_device || makedev(major_number, minor_number) == facts.st_dev) return true;
  }
  return table.bad() ? std::nullopt : Answer(false);
}

std::string inWords(const Answer& answer, const std::string& what) {
  if (!answer) return "nobody can tell whether " + what;
  return *answer ? what : "";
}

std::string whyNot(const Condition& condition, const std::string& proc) {
  const std::string& subject = condition.subject;
  switch (condition.kind) {
    case Condition::Kind::kProcess:
      return inWords(runs(condition, proc), subject + " is running");
    case Condition::Kind::kLocked:
      return inWords(hasLock(subject, proc), subject + " is locked");
    case Condition::Kind::kPidFile:
      return inWords(livesByPidFile(subject), "the process of " + subject + " is running");
    case Condition::Kind::kOpen:
      return inWords(isAnyOpenBelow(subject, proc), "a file in " + subject + " is open");
  }
  return "";
}

bool locks(int fd, OwnersLock::Kind kind) {
  if (kind == OwnersLock::Kind::kFlock) return ::flock(fd, LOCK_EX | LOCK_NB) == 0;
  struct flock whole {};
  whole.l_type = F_WRLCK;
  whole.l_whence = SEEK_SET;
  // Of the description, not of the process: closing another descriptor of the file keeps it.
  return ::fcntl(fd, F_OFD_SETLK, &whole) == 0;
}

}  // namespace

std::string whyNotNow(const std::vector<Condition>& conditions, const std::string& proc) {
  for (const Condition& condition : conditions) {
    std::string why = whyNot(condition, proc);
    if (!why.empty()) return why;
  }
  return "";
}

ConditionWatch::ConditionWatch(const std::vector<Condition>& conditions, std::uint64_t every_ns)
    : conditions_(conditions),
      every_ns_(every_ns),
      pause_ns_(every_ns),
      asked_ticks_(rt::ticks()) {}

bool ConditionWatch::holds() {
  if (!why_.empty()) return true;
  if (conditions_.empty() || cachedir::elapsedNs(asked_ticks_) < pause_ns_) return false;
  const std::uint64_t begin = rt::ticks();
  why_ = whyNotNow(conditions_);
  pause_ns_ = std::clamp(9 * cachedir::elapsedNs(begin), every_ns_, 10 * every_ns_);
  asked_ticks_ = rt::ticks();
  return !why_.empty();
}

bool isLocked(const std::string& path, const std::string& proc) {
  return hasLock(path, proc).value_or(true);
}

std::string HeldLocks::take(const std::vector<OwnersLock>& wanted) {
  for (const OwnersLock& lock : wanted) {
    cachedir::UniqueFd fd(::open(lock.path.c_str(), O_RDWR | O_CLOEXEC | O_NOFOLLOW | O_NONBLOCK));
    if (!fd && errno == ENOENT) continue;
    if (!fd) return lock.path + " cannot be opened: " + cachedir::errnoText(errno);
    if (!locks(fd.get(), lock.kind)) return lock.path + " is locked";
    held_.push_back(std::move(fd));
  }
  return "";
}

std::string whoHolds(const std::vector<OwnersLock>& locks) {
  for (const OwnersLock& lock : locks) {
    std::string why = inWords(hasLock(lock.path, "/proc"), lock.path + " is locked");
    if (!why.empty()) return why;
  }
  return "";
}

}  // namespace spacekeep::command
