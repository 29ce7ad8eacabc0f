// Thread safety: pure functions over the file system.
//
// What lies in the directory of the service's data, so that what vanished can be told to the file.
#pragma once

#include <sys/types.h>

#include <cstddef>
#include <cstdint>
#include <map>
#include <string>
#include <vector>

namespace spacekeep::ctl {

/// More files than this are not looked at.
inline constexpr std::size_t kMostDataFiles = 200'000;

struct DataFile {
  dev_t device = 0;
  ino_t inode = 0;
  std::uint64_t occupied_bytes = 0;
};

/// Regular files by path.
using DataFiles = std::map<std::string, DataFile>;

/// Symbolic links are not followed. A path that is itself a regular file is the only entry.
[[nodiscard]] DataFiles dataFilesBelow(const std::string& path);

struct Vanished {
  std::uint64_t occupied_bytes = 0;  ///< of files that have no name left below the directory
  std::vector<std::string> paths;
};
/// What was there before and is not there any more, or is another file.
[[nodiscard]] Vanished vanishedBetween(const DataFiles& before, const DataFiles& after);

[[nodiscard]] std::uint64_t largestOf(const DataFiles& files);

/// "a/b", "a/b and c", "a/b, c and 7 more".
[[nodiscard]] std::string namesOf(const std::vector<std::string>& paths);

}  // namespace spacekeep::ctl
