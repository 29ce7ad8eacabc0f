// Thread safety: one thread at a time.
//
// The directories of one cache directory as the index knows them, by path and by number.
#pragma once

#include <cstdint>
#include <map>
#include <string>
#include <string_view>
#include <vector>

namespace spacekeep::cachedir {

struct IndexedFolder {
  std::string path;         // below the cache directory, "" for itself
  std::uint64_t inode = 0;  // 0 until it was opened
  int watch = -1;           // of the event inbox; -1: it is looked through at each request
  std::uint32_t files = 0;  // records that name it
  bool known = false;       // it has not been dropped
  std::uint8_t round = 0;   // of the last listing that met it
};

class FolderTree {
 public:
  static constexpr std::uint32_t kNone = 0xffffffff;

  /// There is no directory of that path yet.
  std::uint32_t add(const std::string& path);
  [[nodiscard]] std::uint32_t find(std::string_view path) const;
  [[nodiscard]] bool knows(std::uint32_t id) const {
    return id < folders_.size() && folders_[id].known;
  }
  [[nodiscard]] IndexedFolder& at(std::uint32_t id) { return folders_[id]; }
  [[nodiscard]] const IndexedFolder& at(std::uint32_t id) const { return folders_[id]; }
  /// Numbers go from 0 to one less than this.
  [[nodiscard]] std::uint32_t end() const { return static_cast<std::uint32_t>(folders_.size()); }
  [[nodiscard]] std::size_t size() const { return by_path_.size(); }

  /// All below `id` and itself, in the order of paths.
  [[nodiscard]] std::vector<std::uint32_t> withAllBelow(std::uint32_t id) const;
  /// Those directly in `id`.
  [[nodiscard]] std::vector<std::uint32_t> directlyIn(std::uint32_t id) const;
  /// All from `path` on, in the order of paths.
  [[nodiscard]] std::vector<std::uint32_t> from(const std::string& path) const;

  /// The path is free again; the number only after release.
  void drop(std::uint32_t id);
  void release(std::uint32_t id);

 private:
  template <class Visit>
  void forEachBelow(const std::string& path, const Visit& visit) const;

  std::vector<IndexedFolder> folders_;
  std::vector<std::uint32_t> free_;
  std::map<std::string, std::uint32_t, std::less<>> by_path_;
};

}  // namespace spacekeep::cachedir
