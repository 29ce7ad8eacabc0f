#include "services/cachedir/engine/entry.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <sys/sysmacros.h>

#include <algorithm>
#include <cerrno>
#include <climits>

namespace spacekeep::cachedir {
namespace {

std::int64_t nsOfStatx(const statx_timestamp& time) { return nsOf(time.tv_sec, time.tv_nsec); }

Entry::Kind kindOf(const struct statx& facts, const Root& root) {
  if (S_ISDIR(facts.stx_mode)) return Entry::Kind::kDirectory;
  return S_ISREG(facts.stx_mode) && facts.stx_mnt_id == root.mount_id ? Entry::Kind::kFile
                                                                      : Entry::Kind::kOther;
}

}  // namespace

Entry entryAt(int folder_fd, const char* name, const Root& root) {
  struct statx facts {};
  if (::statx(folder_fd, name, AT_SYMLINK_NOFOLLOW | AT_NO_AUTOMOUNT,
              STATX_BASIC_STATS | STATX_MNT_ID, &facts) != 0) {
    return {.kind = errno == ENOENT ? Entry::Kind::kNothing : Entry::Kind::kFailed,
            .device = 0,
            .state = {}};
  }
  return {.kind = kindOf(facts, root),
          .device = makedev(facts.stx_dev_major, facts.stx_dev_minor),
          .state = {.inode = facts.stx_ino,
                    .used_ns = std::max(nsOfStatx(facts.stx_atime), nsOfStatx(facts.stx_mtime)),
                    .bytes = facts.stx_blocks * 512,
                    .links = facts.stx_nlink}};
}

bool isDotName(const char* name) {
  return name[0] == '.' && (name[1] == '\0' || (name[1] == '.' && name[2] == '\0'));
}

bool isTooDeep(const std::string& path) {
  const auto steps = static_cast<std::size_t>(std::ranges::count(path, '/')) + 1;
  return steps > kMaxDepth || path.size() + NAME_MAX > kMaxPathBytes;
}

}  // namespace spacekeep::cachedir
