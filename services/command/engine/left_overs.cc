#include "services/command/engine/left_overs.h"

#include <dirent.h>
#include <fcntl.h>

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

}  // namespace

std::vector<LeftOver> leftOversIn(int folder_fd) {
  std::vector<LeftOver> found;
  cachedir::UniqueFd fd = cachedir::openBeneath(folder_fd, ".", O_RDONLY | O_DIRECTORY);
  const std::unique_ptr<DIR, DirectoryCloser> directory(fd ? ::fdopendir(fd.get()) : nullptr);
  if (!directory) return found;
  static_cast<void>(fd.release());
  while (const dirent* entry = ::readdir(directory.get())) {
    const std::string_view name = entry->d_name;
    for (const std::string_view prefix : {kHalfPrefix, kGoingPrefix}) {
      if (name.starts_with(prefix) && name != prefix && found.size() < kMaxMatches) {
        found.push_back({std::string(prefix), std::string(name.substr(prefix.size()))});
      }
    }
  }
  std::ranges::sort(found, {}, [](const LeftOver& left) {
    return std::pair(left.prefix != kHalfPrefix, std::string_view(left.name));
  });
  return found;
}

}  // namespace spacekeep::command
