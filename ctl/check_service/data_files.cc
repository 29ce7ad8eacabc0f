#include "ctl/check_service/data_files.h"

#include <fmt/core.h>
#include <sys/stat.h>

#include <algorithm>
#include <filesystem>
#include <set>
#include <system_error>
#include <utility>

#include "ctl/text_layout.h"

namespace spacekeep::ctl {
namespace {

namespace fs = std::filesystem;

constexpr std::uint64_t kBlockBytes = 512;  // the unit of st_blocks, stat(2)

using FileId = std::pair<dev_t, ino_t>;

FileId idOf(const DataFile& file) { return {file.device, file.inode}; }

void add(DataFiles& files, const std::string& path) {
  struct stat facts {};
  if (lstat(path.c_str(), &facts) != 0 || !S_ISREG(facts.st_mode)) return;
  files.emplace(path, DataFile{facts.st_dev, facts.st_ino,
                               static_cast<std::uint64_t>(facts.st_blocks) * kBlockBytes});
}

}  // namespace

DataFiles dataFilesBelow(const std::string& path) {
  DataFiles files;
  add(files, path);
  std::error_code error;
  fs::recursive_directory_iterator entry(path, fs::directory_options::skip_permission_denied,
                                         error);
  const fs::recursive_directory_iterator end;
  // A directory may vanish under the walk; what was seen until then counts.
  for (; !error && entry != end && files.size() < kMostDataFiles; entry.increment(error)) {
    add(files, entry->path().string());
  }
  return files;
}

Vanished vanishedBetween(const DataFiles& before, const DataFiles& after) {
  std::set<FileId> counted;
  for (const auto& [path, file] : after) counted.insert(idOf(file));
  Vanished vanished;
  for (const auto& [path, file] : before) {
    const auto now = after.find(path);
    if (now != after.end() && idOf(now->second) == idOf(file)) continue;
    vanished.paths.push_back(path);
    if (counted.insert(idOf(file)).second) vanished.occupied_bytes += file.occupied_bytes;
  }
  return vanished;
}

std::uint64_t largestOf(const DataFiles& files) {
  std::uint64_t largest = 0;
  for (const auto& [path, file] : files) largest = std::max(largest, file.occupied_bytes);
  return largest;
}

std::string namesOf(const std::vector<std::string>& paths) {
  if (paths.empty()) return "nothing";
  const std::string first = harmless(paths[0]);
  if (paths.size() == 1) return first;
  const std::string second = harmless(paths[1]);
  if (paths.size() == 2) return fmt::format("{} and {}", first, second);
  return fmt::format("{}, {} and {} more", first, second, paths.size() - 2);
}

}  // namespace spacekeep::ctl
