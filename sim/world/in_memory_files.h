// Thread safety: every member may be called from any thread.
//
// Directories and files that exist in memory only. Entries are listed in the order in which they
// were added, so a test decides what a file system would leave to chance.
#pragma once

#include <cstdint>
#include <string>
#include <string_view>
#include <utility>
#include <variant>
#include <vector>

#include "support/files/directory_reader.h"
#include "support/runtime/runtime.h"
#include "support/values/value.h"

namespace spacekeep::sim {

class InMemoryFiles final : public DirectoryReader {
 public:
  /// Adds a file with its missing directories, or replaces what it holds. Doubled slashes count as
  /// one, as in the file system.
  void add(const std::string& path, std::vector<std::uint8_t> content);
  void addText(const std::string& path, std::string_view content);
  /// A property-list document that holds `content`.
  void addPlist(const std::string& path, const Value& content);
  /// A file that is listed and cannot be read.
  void addUnreadable(const std::string& path, std::string reason);
  void addDirectory(const std::string& path);
  void remove(const std::string& path);

  [[nodiscard]] std::vector<std::string> entriesBelow(const std::string& directory) override;
  [[nodiscard]] std::variant<std::vector<std::uint8_t>, FileError> readWholeFile(
      const std::string& path) override;

 private:
  struct IsDirectory {};
  using Node = std::variant<std::vector<std::uint8_t>, FileError, IsDirectory>;

  void put(const std::string& path, Node node);

  rt::Mutex mutex_;
  // Protected by mutex_.
  std::vector<std::pair<std::string, Node>> nodes_;  // in the order in which they were added
};

}  // namespace spacekeep::sim
