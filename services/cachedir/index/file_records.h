// Thread safety: one thread at a time.
//
// What the index keeps of one name of a file, in 32 bytes, and the blocks in which these stand. A
// record keeps its number for as long as it lives.
#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <vector>

namespace spacekeep::cachedir {

inline constexpr std::uint64_t kBlockUnitBytes = 512;  // st_blocks, stat(2)

struct FileRecord {
  std::uint64_t inode = 0;
  std::int64_t used_ns = 0;      // wall clock
  std::uint32_t blocks = 0;      // units of 512 bytes
  std::uint32_t folder = 0;      // number of the directory within its root
  std::uint32_t name_place = 0;  // in the name store
  std::uint16_t links = 1;       // as many as fit
  std::uint8_t name_bytes = 0;   // 0 in a free record
  std::uint8_t round = 0;        // of the last listing that met it

  [[nodiscard]] bool live() const { return name_bytes != 0; }
  [[nodiscard]] std::uint64_t bytes() const { return blocks * kBlockUnitBytes; }
};
static_assert(sizeof(FileRecord) == 32);

class FileRecords {
 public:
  [[nodiscard]] FileRecord& operator[](std::uint32_t id) {
    return blocks_[id / kBlockRecords][id % kBlockRecords];
  }
  [[nodiscard]] const FileRecord& operator[](std::uint32_t id) const {
    return blocks_[id / kBlockRecords][id % kBlockRecords];
  }
  /// The number of a record with its defaults.
  [[nodiscard]] std::uint32_t make() {
    std::uint32_t id = first_free_;
    if (id != kNone) {
      first_free_ = (*this)[id].folder;  // a free record holds the number of the next there
      (*this)[id] = {};
    } else {
      if (end_ % kBlockRecords == 0)
        blocks_.push_back(std::make_unique<FileRecord[]>(kBlockRecords));
      id = end_++;
    }
    ++live_;
    return id;
  }
  void release(std::uint32_t id) {
    (*this)[id] = {};
    (*this)[id].folder = first_free_;
    first_free_ = id;
    --live_;
  }
  /// One past the highest number ever given; not all below it are live.
  [[nodiscard]] std::uint32_t end() const { return end_; }
  [[nodiscard]] std::size_t size() const { return live_; }
  [[nodiscard]] std::size_t bytes() const {
    return blocks_.size() * kBlockRecords * sizeof(FileRecord);
  }

 private:
  static constexpr std::uint32_t kBlockRecords = 2048;
  static constexpr std::uint32_t kNone = 0xffffffff;

  std::vector<std::unique_ptr<FileRecord[]>> blocks_;
  std::uint32_t end_ = 0;
  std::uint32_t first_free_ = kNone;
  std::size_t live_ = 0;
};

}  // namespace spacekeep::cachedir
