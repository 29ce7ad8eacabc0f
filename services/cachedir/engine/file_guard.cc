#include "services/cachedir/engine/file_guard.h"

#include <fcntl.h>
#include <sys/file.h>

#include <cerrno>
#include <csignal>

namespace spacekeep::cachedir {
namespace {

bool takesFlock(int fd) { return ::flock(fd, LOCK_EX | LOCK_NB) == 0 || errno != EWOULDBLOCK; }

bool hasRecordLock(int fd) {
  struct flock whole {};
  whole.l_type = F_WRLCK;
  whole.l_whence = SEEK_SET;
  return ::fcntl(fd, F_OFD_GETLK, &whole) == 0 && whole.l_type != F_UNLCK;
}

FileGuard::Verdict examine(int fd) {
  if (!takesFlock(fd) || hasRecordLock(fd)) return FileGuard::Verdict::kLocked;
  // The kernel tells the holder of a lease by a signal that somebody wants the file. The usual one,
  // SIGIO, would end this process; SIGURG is ignored unless somebody catches it.
  if (::fcntl(fd, F_SETSIG, SIGURG) == 0 && ::fcntl(fd, F_SETLEASE, F_WRLCK) == 0) {
    return FileGuard::Verdict::kAlone;
  }
  return errno == EAGAIN ? FileGuard::Verdict::kOpen : FileGuard::Verdict::kUnproven;
}

}  // namespace

FileGuard::FileGuard(int fd) : fd_(fd), verdict_(examine(fd)) {}

bool FileGuard::stillAlone() const {
  return verdict_ != Verdict::kAlone || ::fcntl(fd_, F_GETLEASE) == F_WRLCK;
}

}  // namespace spacekeep::cachedir
