#include "services/cachedir/engine/own_blocks.h"

#include <linux/fiemap.h>
#include <linux/fs.h>
#include <linux/magic.h>
#include <sys/ioctl.h>
#include <sys/vfs.h>

#include <algorithm>
#include <array>
#include <cstring>

#include "services/cachedir/engine/file_facts.h"

namespace spacekeep::cachedir {
namespace {

constexpr std::size_t kExtentsAtOnce = 64;
// A file in more pieces than this counts for the pieces seen: too little rather than too much.
constexpr int kMaxRounds = 1024;

struct alignas(fiemap) ExtentQuery {
  std::array<std::byte, sizeof(fiemap) + kExtentsAtOnce * sizeof(fiemap_extent)> bytes{};
};

/// Shared blocks are possible at all only where reflinks or snapshots are.
std::uint32_t flagsThatGiveNothing(int fd) {
  struct statfs facts {};
  if (::fstatfs(fd, &facts) != 0) return 0;
  if (facts.f_type == EXT4_SUPER_MAGIC || facts.f_type == TMPFS_MAGIC) return 0;
  std::uint32_t flags = FIEMAP_EXTENT_SHARED;
  if (facts.f_type == BTRFS_SUPER_MAGIC) {
    flags |= FIEMAP_EXTENT_DATA_INLINE | FIEMAP_EXTENT_DELALLOC;
  }
  return flags;
}

}  // namespace

std::uint64_t ownBytes(int fd, const struct stat& facts) {
  const std::uint64_t allocated = allocatedBytes(facts);
  const std::uint32_t nothing = flagsThatGiveNothing(fd);
  if (nothing == 0 || allocated == 0) return allocated;
  std::uint64_t own = 0;
  std::uint64_t position = 0;
  for (int round = 0; round < kMaxRounds; ++round) {
    ExtentQuery query;
    auto* map = reinterpret_cast<fiemap*>(query.bytes.data());
    map->fm_start = position;
    map->fm_length = FIEMAP_MAX_OFFSET - position;
    map->fm_extent_count = kExtentsAtOnce;
    if (::ioctl(fd, FS_IOC_FIEMAP, map) != 0) return round == 0 ? allocated : own;
    if (map->fm_mapped_extents == 0) return std::min(own, allocated);
    fiemap_extent last{};
    for (std::uint32_t i = 0; i < map->fm_mapped_extents; ++i) {
      std::memcpy(&last, query.bytes.data() + sizeof(fiemap) + i * sizeof last, sizeof last);
      if ((last.fe_flags & nothing) == 0) own += last.fe_length;
    }
    position = last.fe_logical + last.fe_length;
    if ((last.fe_flags & FIEMAP_EXTENT_LAST) != 0) return std::min(own, allocated);
  }
  return std::min(own, allocated);
}

}  // namespace spacekeep::cachedir
