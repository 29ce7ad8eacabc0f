#include "services/cachedir/index/file_systems.h"

#include <linux/magic.h>
#include <sys/vfs.h>

#include <fstream>
#include <sstream>
#include <string_view>

namespace spacekeep::cachedir {
namespace {

constexpr std::uint64_t kSecondNs = 1'000'000'000;
constexpr std::uint64_t kSlackSeconds = 30;  // btrfs commits every 30 seconds, too

std::uint64_t secondsOf(const char* setting, std::uint64_t otherwise) {
  std::ifstream stream(std::string("/proc/sys/vm/") + setting);
  std::uint64_t hundredths = 0;
  return stream >> hundredths ? hundredths / 100 : otherwise;
}

std::uint64_t writtenOutNs() {
  return (secondsOf("dirty_expire_centisecs", 30) + secondsOf("dirty_writeback_centisecs", 5) +
          kSlackSeconds) *
         kSecondNs;
}

/// Blanks, tabs, line ends and backslashes stand as three octal digits behind a backslash.
std::string plain(std::string_view field) {
  std::string text;
  for (std::size_t i = 0; i < field.size(); ++i) {
    if (field[i] == '\\' && i + 3 < field.size()) {
      const int code = (field[i + 1] - '0') * 64 + (field[i + 2] - '0') * 8 + (field[i + 3] - '0');
      text += static_cast<char>(code);
      i += 3;
    } else {
      text += field[i];
    }
  }
  return text;
}

}  // namespace

std::optional<std::uint64_t> settleNs(int fd) {
  constexpr std::uint64_t kXfsReservesNs = 300 * kSecondNs;  // speculative_prealloc_lifetime
  struct statfs facts {};
  if (::fstatfs(fd, &facts) != 0) return std::nullopt;
  switch (static_cast<std::uint64_t>(facts.f_type)) {
    case TMPFS_MAGIC:
    case RAMFS_MAGIC:
      return 0;
    case EXT4_SUPER_MAGIC:
    case F2FS_SUPER_MAGIC:
    case BTRFS_SUPER_MAGIC:
      return writtenOutNs();
    case XFS_SUPER_MAGIC:
      return writtenOutNs() + kXfsReservesNs;
    default:
      return std::nullopt;
  }
}

std::string mountsBelow(const std::string& path, const std::string& table) {
  std::ifstream stream(table);
  std::string found;
  for (std::string line; std::getline(stream, line);) {
    std::istringstream fields(line);
    std::string id, parent, device, root, place;
    if (!(fields >> id >> parent >> device >> root >> place)) continue;
    if (plain(place).starts_with(path + "/")) found += id + " " + device + " " + place + "\n";
  }
  return found;
}

}  // namespace spacekeep::cachedir
