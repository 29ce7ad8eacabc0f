#include "support/linux/reserve_file.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <sys/statvfs.h>
#include <unistd.h>

#include <mutex>
#include <utility>

#include "support/files/linux/atomic_file.h"
#include "support/files/linux/descriptor.h"

namespace spacekeep {

ReserveFile::ReserveFile(std::string path, std::uint64_t bytes)
    : path_(std::move(path)), bytes_(bytes) {}

bool ReserveFile::take() {
  const std::scoped_lock lock(mutex_);
  if (isThere()) return true;
  if (!hasRoom()) return false;
  const FileDescriptor file(
      ::open(path_.c_str(), O_WRONLY | O_CREAT | O_CLOEXEC | O_NOFOLLOW, 0600));
  if (!file.valid()) return false;
  if (::posix_fallocate(file.get(), 0, static_cast<off_t>(bytes_)) == 0) return true;
  ::unlink(path_.c_str());
  return false;
}

// Emptied before it is removed: what a removed file held comes back some time later on file systems
// that do that part in the background.
bool ReserveFile::giveBack() {
  const std::scoped_lock lock(mutex_);
  {
    const FileDescriptor file(::open(path_.c_str(), O_WRONLY | O_CLOEXEC | O_NOFOLLOW));
    if (file.valid() && ::ftruncate(file.get(), 0) == 0) ::fsync(file.get());
  }
  if (::unlink(path_.c_str()) < 0) return false;
  // Some file systems give the blocks out again only after the deletion is on the disk.
  const FileDescriptor directory(
      ::open(directoryOf(path_).c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  if (directory.valid()) ::syncfs(directory.get());
  return true;
}

bool ReserveFile::isThere() const {
  struct stat status {};
  return ::lstat(path_.c_str(), &status) == 0 && S_ISREG(status.st_mode) &&
         static_cast<std::uint64_t>(status.st_size) >= bytes_;
}

bool ReserveFile::hasRoom() const {
  struct statvfs status {};
  if (::statvfs(directoryOf(path_).c_str(), &status) < 0) return false;
  return status.f_bavail * status.f_frsize >= bytes_ * kRoomFactor;
}

}  // namespace spacekeep
