#include "services/cachedir/engine/beneath.h"

#include <fcntl.h>
#include <linux/openat2.h>
#include <sys/syscall.h>

#include <cerrno>
#include <cstring>

namespace spacekeep::cachedir {
namespace {

UniqueFd openHow(int folder_fd, const char* path, int flags, std::uint64_t resolve) {
  open_how how{};
  how.flags = static_cast<unsigned>(flags | O_CLOEXEC);
  how.resolve = resolve;
  // EAGAIN tells that a rename elsewhere kept the kernel from proving the path safe; openat2(2)
  // says to try again. A bounded number of times, because whoever renames may go on for ever.
  for (int attempt = 0; attempt < 16; ++attempt) {
    const long fd = ::syscall(SYS_openat2, folder_fd, path, &how, sizeof how);
    if (fd >= 0) return UniqueFd(static_cast<int>(fd));
    if (errno != EAGAIN && errno != EINTR) break;
  }
  return UniqueFd();
}

}  // namespace

UniqueFd openBeneath(int folder_fd, const char* path, int flags) {
  return openHow(folder_fd, path, flags | O_NOFOLLOW,
                 RESOLVE_BENEATH | RESOLVE_NO_SYMLINKS | RESOLVE_NO_MAGICLINKS | RESOLVE_NO_XDEV);
}

UniqueFd openDirectoryWithoutLinks(const std::string& path) {
  // Without O_NOFOLLOW, which would tell of a link in the last place as of something else.
  return openHow(AT_FDCWD, path.c_str(), O_RDONLY | O_DIRECTORY,
                 RESOLVE_NO_SYMLINKS | RESOLVE_NO_MAGICLINKS);
}

std::string errnoText(int error) {
  const char* name = ::strerrorname_np(error);
  const char* words = ::strerrordesc_np(error);
  return std::string(words ? words : "unknown error") + " (" + (name ? name : "?") + ")";
}

}  // namespace spacekeep::cachedir
