#include "services/command/base/path_patterns.h"

#include <dirent.h>
#include <fcntl.h>
#include <fnmatch.h>
#include <sys/stat.h>

#include <algorithm>
#include <memory>
#include <string_view>

#include "services/cachedir/engine/beneath.h"
#include "services/cachedir/engine/entry.h"

namespace spacekeep::command {
namespace {

struct DirectoryCloser {
  void operator()(DIR* directory) const { ::closedir(directory); }
};

bool hasPattern(std::string_view text) { return text.find_first_of("*?[") != text.npos; }

bool isDirectory(DIR* in, const dirent& entry) {
  if (entry.d_type != DT_UNKNOWN) return entry.d_type == DT_DIR;
  struct stat facts {};
  return ::fstatat(::dirfd(in), entry.d_name, &facts, AT_SYMLINK_NOFOLLOW) == 0 &&
         S_ISDIR(facts.st_mode);
}

std::vector<std::string> namesIn(const std::string& folder, const std::string& pattern) {
  std::vector<std::string> names;
  cachedir::UniqueFd fd = cachedir::openDirectoryWithoutLinks(folder.empty() ? "/" : folder);
  if (!fd) return names;
  const std::unique_ptr<DIR, DirectoryCloser> directory(::fdopendir(fd.get()));
  if (!directory) return names;
  static_cast<void>(fd.release());
  while (const dirent* entry = ::readdir(directory.get())) {
    if (cachedir::isDotName(entry->d_name) ||
        ::fnmatch(pattern.c_str(), entry->d_name, FNM_PERIOD) != 0 ||
        !isDirectory(directory.get(), *entry)) {
      continue;
    }
    names.emplace_back(entry->d_name);
    if (names.size() >= kMaxMatches) break;
  }
  std::ranges::sort(names);
  return names;
}

}  // namespace

bool isPattern(const std::string& path) { return hasPattern(path); }

std::vector<std::string> matchesOf(const std::string& path) {
  std::vector<std::string> found{""};
  for (std::size_t begin = 1; begin <= path.size() && !found.empty();) {
    const std::size_t end = std::min(path.find('/', begin), path.size());
    const std::string part = path.substr(begin, end - begin);
    std::vector<std::string> next;
    for (const std::string& folder : found) {
      const auto names = hasPattern(part) ? namesIn(folder, part) : std::vector{part};
      for (const std::string& name : names) {
        if (next.size() < kMaxMatches) next.push_back(folder + "/" + name);
      }
    }
    found = std::move(next);
    begin = end + 1;
  }
  return found;
}

}  // namespace spacekeep::command
