#include "ctl/check_service/held_files.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/mman.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <set>
#include <utility>

#include "ctl/text_layout.h"

namespace spacekeep::ctl {
namespace {

constexpr Hold kHolds[] = {Hold::kOpen, Hold::kLocked, Hold::kMapped};
constexpr std::uint64_t kBlockBytes = 512;  // the unit of st_blocks, stat(2)

const char* textOf(Hold hold) {
  switch (hold) {
    case Hold::kOpen:
      return "open";
    case Hold::kLocked:
      return "locked (flock)";
    case Hold::kMapped:
      return "mapped into memory";
  }
  return "";
}

/// The first, the last and the one in the middle, so that no order of freeing spares them all.
std::set<std::string> someOf(const DataFiles& files) {
  std::vector<std::string> paths;
  for (const auto& [path, file] : files) {
    if (file.occupied_bytes > 0) paths.push_back(path);
  }
  if (paths.empty()) return {};
  return {paths.front(), paths[paths.size() / 2], paths.back()};
}

}  // namespace

HeldFiles::HeldFiles(const std::string& path) {
  const auto chosen = someOf(dataFilesBelow(path));
  if (chosen.size() == 1) {
    for (const Hold how : kHolds) hold(*chosen.begin(), how);
    return;
  }
  std::size_t next = 0;
  for (const auto& each : chosen) hold(each, kHolds[next++]);
}

HeldFiles::~HeldFiles() {
  for (const File& file : files_) release(file);
}

void HeldFiles::hold(const std::string& path, Hold how) {
  File file;
  file.path = path;
  file.hold = how;
  file.fd = open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NOFOLLOW);
  struct stat facts {};
  if (file.fd < 0 || fstat(file.fd, &facts) != 0) return;
  file.facts = {facts.st_dev, facts.st_ino,
                static_cast<std::uint64_t>(facts.st_blocks) * kBlockBytes};
  if (how == Hold::kLocked) flock(file.fd, LOCK_SH | LOCK_NB);
  if (how == Hold::kMapped) {
    file.mapped_bytes = static_cast<std::size_t>(facts.st_size);
    file.mapping = mmap(nullptr, file.mapped_bytes, PROT_READ, MAP_SHARED, file.fd, 0);
    close(std::exchange(file.fd, -1));
    if (file.mapping == MAP_FAILED) return;
  }
  files_.push_back(std::move(file));
}

std::uint64_t HeldFiles::occupiedBytes() const {
  std::uint64_t sum = 0;
  for (const File& file : files_) sum += file.facts.occupied_bytes;
  return sum;
}

/// The inode cannot be another's meanwhile, since it is held.
bool HeldFiles::isRemoved(const File& file) {
  struct stat named {};
  return lstat(file.path.c_str(), &named) != 0 || named.st_ino != file.facts.inode ||
         named.st_dev != file.facts.device;
}

void HeldFiles::releaseRemoved() {
  const auto removed = std::stable_partition(files_.begin(), files_.end(),
                                             [](const File& file) { return !isRemoved(file); });
  for (auto file = removed; file != files_.end(); ++file) {
    losses_.push_back(harmless(file->path) + ", which was " + textOf(file->hold));
    release(*file);
  }
  files_.erase(removed, files_.end());
}

void HeldFiles::release(const File& file) {
  if (file.mapping != nullptr) munmap(file.mapping, file.mapped_bytes);
  if (file.fd >= 0) close(file.fd);
}

}  // namespace spacekeep::ctl
