// Thread safety: every member may be called from any thread.
//
// Directories and files of the running system.
#pragma once

#include <cstddef>
#include <string>
#include <variant>
#include <vector>

#include "support/files/directory_reader.h"

namespace spacekeep {

class LinuxDirectoryReader : public DirectoryReader {
 public:
  /// What one walk yields at most. A walk that is cut says so in a problem line.
  struct Limits {
    std::size_t entries = 100'000;
    std::size_t depth = 64;  ///< directories below the first one; as many descriptors are open
  };

  LinuxDirectoryReader() = default;
  explicit LinuxDirectoryReader(const Limits& limits) : limits_(limits) {}

  /// A directory that cannot be read is a problem line, and the walk goes on beside it.
  [[nodiscard]] std::vector<std::string> entriesBelow(const std::string& directory) override;
  /// Follows links, since administrators link; never waits for a FIFO and never opens a device.
  [[nodiscard]] std::variant<std::vector<std::uint8_t>, FileError> readWholeFile(
      const std::string& path) override;

 private:
  const Limits limits_{};
};

}  // namespace spacekeep
