#include "ctl/volume_space.h"

#include <sys/statvfs.h>

namespace spacekeep::ctl {

std::optional<MeasuredSpace> measuredSpaceOf(const std::string& path) {
  struct statvfs numbers = {};
  if (statvfs(path.c_str(), &numbers) != 0) return std::nullopt;
  return MeasuredSpace{.size_bytes = std::uint64_t{numbers.f_blocks} * numbers.f_frsize,
                       .free_bytes = std::uint64_t{numbers.f_bavail} * numbers.f_frsize};
}

std::string withoutTrailingSlashes(std::string path) {
  while (path.size() > 1 && path.back() == '/') path.pop_back();
  return path;
}

}  // namespace spacekeep::ctl
