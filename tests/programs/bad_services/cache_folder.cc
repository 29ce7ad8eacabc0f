#include "tests/programs/bad_services/cache_folder.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>
#include <system_error>

namespace bad_services {
namespace {

namespace fs = std::filesystem;

std::uint64_t occupied(const std::string& path) {
  struct stat facts {};
  return stat(path.c_str(), &facts) == 0 ? static_cast<std::uint64_t>(facts.st_blocks) * 512 : 0;
}

/// The kernel gives a write lease only on a file that nobody else has open or mapped (fcntl(2)).
bool isUsed(const std::string& path) {
  const int fd = open(path.c_str(), O_RDONLY | O_CLOEXEC);
  if (fd < 0) return true;
  const bool used = fcntl(fd, F_SETLEASE, F_WRLCK) != 0;
  close(fd);
  return used;
}

}  // namespace

std::vector<std::string> CacheFolder::files() const {
  std::vector<std::string> files;
  std::error_code error;
  for (const auto& entry : fs::directory_iterator(path_, error)) files.push_back(entry.path());
  return files;
}

std::uint64_t CacheFolder::occupiedBytes() const {
  std::uint64_t sum = 0;
  for (const auto& file : files()) sum += occupied(file);
  return sum;
}

std::optional<std::uint64_t> CacheFolder::removeOne(bool spare_used) const {
  for (const auto& file : files()) {
    if (spare_used && isUsed(file)) continue;
    const std::uint64_t bytes = occupied(file);
    if (unlink(file.c_str()) == 0) return bytes;
  }
  return std::nullopt;
}

}  // namespace bad_services
