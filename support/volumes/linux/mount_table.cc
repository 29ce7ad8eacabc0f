#include "support/volumes/linux/mount_table.h"

#include <fcntl.h>
#include <libmount/libmount.h>
#include <poll.h>
#include <sys/stat.h>
#include <sys/statvfs.h>
#include <sys/sysmacros.h>
#include <unistd.h>

#include <cerrno>
#include <memory>
#include <mutex>
#include <system_error>
#include <utility>

#include "support/files/linux/descriptor.h"
#include "support/logging/log.h"

namespace spacekeep {
namespace {

struct FreeTable {
  void operator()(libmnt_table* table) const { mnt_unref_table(table); }
};
struct FreeIterator {
  void operator()(libmnt_iter* iterator) const { mnt_free_iter(iterator); }
};

std::string textOrNothing(const char* text) { return text == nullptr ? "" : text; }

bool hasOption(const char* options, const char* name) {
  char* value = nullptr;
  std::size_t value_size = 0;
  return options != nullptr && mnt_optstr_get_option(options, name, &value, &value_size) == 0;
}

MountEntry entryOf(libmnt_fs* fs) {
  const dev_t device = mnt_fs_get_devno(fs);
  return {.id = mnt_fs_get_id(fs),
          .parent_id = mnt_fs_get_parent_id(fs),
          .device_major = major(device),
          .device_minor = minor(device),
          .mount_point = textOrNothing(mnt_fs_get_target(fs)),
          .type = textOrNothing(mnt_fs_get_fstype(fs)),
          .source = textOrNothing(mnt_fs_get_source(fs)),
          .read_only = hasOption(mnt_fs_get_fs_options(fs), "ro")};
}

std::optional<std::vector<MountEntry>> readTable(const std::string& path) {
  const std::unique_ptr<libmnt_table, FreeTable> table(mnt_new_table_from_file(path.c_str()));
  const std::unique_ptr<libmnt_iter, FreeIterator> iterator(mnt_new_iter(MNT_ITER_FORWARD));
  if (table == nullptr || iterator == nullptr) return std::nullopt;
  std::vector<MountEntry> entries;
  libmnt_fs* fs = nullptr;
  while (mnt_table_next_fs(table.get(), iterator.get(), &fs) == 0) entries.push_back(entryOf(fs));
  return entries;
}

/// A handle on the directory that is mounted there. It neither opens files nor follows the path a
/// second time, so the answers about it are all about one and the same mount.
int openMountPoint(const MountEntry& mount) {
  return ::open(mount.mount_point.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC);
}

bool isThatMount(int fd, const MountEntry& mount) {
  struct statx status {};
  if (::statx(fd, "", AT_EMPTY_PATH | AT_NO_AUTOMOUNT, STATX_MNT_ID, &status) < 0) return false;
  return (status.stx_mask & STATX_MNT_ID) != 0 &&
         status.stx_mnt_id == static_cast<std::uint64_t>(mount.id);
}

/// Single files are mounted too (containers do it); such a mount is no place to keep data in.
bool isDirectoryMount(const MountEntry& mount) {
  const FileDescriptor directory(openMountPoint(mount));
  return directory.valid() && isThatMount(directory.get(), mount);
}

}  // namespace

MountTable::MountTable(std::string path)
    : path_(std::move(path)),
      fd_(::open(path_.c_str(), O_RDONLY | O_CLOEXEC)),
      mounts_(std::make_shared<const std::vector<MountEntry>>()) {}

MountTable::~MountTable() {
  if (fd_ >= 0) ::close(fd_);
}

MountTable::Mounts MountTable::current() {
  const std::scoped_lock lock(mutex_);
  // Asked before reading: a change during the reading is then seen the next time.
  if (changedSinceLastLook() || stale_) readAgain();
  return mounts_;
}

std::uint64_t MountTable::readings() const {
  const std::scoped_lock lock(mutex_);
  return readings_;
}

bool MountTable::changedSinceLastLook() {
  if (fd_ < 0) return true;
  pollfd change{.fd = fd_, .events = POLLPRI, .revents = 0};
  return ::poll(&change, 1, 0) != 0;  // a failure counts as a change
}

void MountTable::readAgain() {
  ++readings_;
  const auto table = readTable(path_);
  stale_ = !table.has_value();
  if (!table) {
    logProblem("%s cannot read the mount table %s: %s", "readAgain", path_,
               std::generic_category().message(errno));
    return;
  }
  std::vector<MountEntry> mounts = localMounts(*table);
  std::erase_if(mounts, [](const MountEntry& mount) { return !isDirectoryMount(mount); });
  mounts_ = std::make_shared<const std::vector<MountEntry>>(std::move(mounts));
}

std::optional<VolumeSpace> measureSpace(const MountEntry& mount) {
  const FileDescriptor directory(openMountPoint(mount));
  if (!directory.valid() || !isThatMount(directory.get(), mount)) return std::nullopt;
  struct statvfs status {};
  while (::fstatvfs(directory.get(), &status) < 0) {
    if (errno != EINTR) return std::nullopt;
  }
  return VolumeSpace{.size_bytes = status.f_blocks * status.f_frsize,
                     .available_bytes = status.f_bavail * status.f_frsize,
                     .inodes = status.f_files,
                     .available_inodes = status.f_favail};
}

}  // namespace spacekeep
