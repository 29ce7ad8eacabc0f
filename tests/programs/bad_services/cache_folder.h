// Thread safety: for one thread.
//
// A folder of files that can be given up, one at a time.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

namespace bad_services {

class CacheFolder {
 public:
  explicit CacheFolder(std::string path) : path_(std::move(path)) {}

  [[nodiscard]] std::uint64_t occupiedBytes() const;
  /// Removes one file; the bytes that come back, none when there is no file left to remove. Files in
  /// use are passed over unless `spare_used` is false.
  [[nodiscard]] std::optional<std::uint64_t> removeOne(bool spare_used) const;

 private:
  [[nodiscard]] std::vector<std::string> files() const;

  const std::string path_;
};

}  // namespace bad_services
