// Thread safety: every member may be called from any thread.
//
// Reading directories and whole files, for the descriptor scan.
#pragma once

#include <cstdint>
#include <string>
#include <variant>
#include <vector>

namespace spacekeep {

struct FileError {
  std::string reason;  ///< in words for a person
};

class DirectoryReader {
 public:
  virtual ~DirectoryReader() = default;
  /// Every entry below `directory` (files, directories and the rest), as paths relative to it, in
  /// the order in which the file system gives them, a directory before what it holds. Symbolic
  /// links are listed and not followed. A missing directory gives none.
  [[nodiscard]] virtual std::vector<std::string> entriesBelow(const std::string& directory) = 0;
  /// The whole file, at most kMaxPlistBytes. Refuses what is not a regular file.
  [[nodiscard]] virtual std::variant<std::vector<std::uint8_t>, FileError> readWholeFile(
      const std::string& path) = 0;
};

}  // namespace spacekeep
