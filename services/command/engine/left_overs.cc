#include "services/command/engine/left_overs.h"

#include <dirent.h>
#include <fcntl.h>
#include <fnmatch.h>

#include <algorithm>
#include <memory>
#include <string_view>
#include <utility>

#include "services/cachedir/engine/beneath.h"
#include "services/command/base/path_patterns.h"

namespace spacekeep::command {
namespace {

struct DirectoryCloser {
  void operator()(DIR* directory) const { ::closedir(directory); }
};

/// What stands behind `prefix` in `name`; empty when that begins otherwise.
std::string behind(std::string_view prefix, std::string_view name) {
  return std::string(name.starts_with(prefix) ? name.substr(prefix.size()) : "");
}

bool standsFor(const std::string& pattern, const std::string& name) {
  return isPattern(pattern) ? ::fnmatch(pattern.c_str(), name.c_str(), FNM_PERIOD) == 0
                            : pattern == name;
}

}  // namespace

bool isLeftOver(std::string_view name) {
  return name.starts_with(kHalfPrefix) || name.starts_with(kGoingPrefix);
}

std::vector<LeftOver> leftOversIn(int folder_fd, const std::string& pattern) {
  std::vector<LeftOver> found;
  cachedir::UniqueFd fd = cachedir::openBeneath(folder_fd, ".", O_RDONLY | O_DIRECTORY);
  const std::unique_ptr<DIR, DirectoryCloser> directory(fd ? ::fdopendir(fd.get()) : nullptr);
  if (!directory) return found;
  static_cast<void>(fd.release());
  while (const dirent* entry = ::readdir(directory.get())) {
    for (const char* prefix : {kHalfPrefix, kGoingPrefix}) {
      std::string name = behind(prefix, entry->d_name);
      if (!name.empty() && standsFor(pattern, name) && found.size() < kMaxMatches) {
        found.push_back({prefix, std::move(name)});
      }
    }
  }
  std::ranges::sort(found, {}, [](const LeftOver& left) {
    return std::pair(left.prefix != kHalfPrefix, std::string_view(left.name));
  });
  return found;
}

}  // namespace spacekeep::command
