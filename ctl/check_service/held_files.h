// Thread safety: for one thread.
//
// Files of the service that this tool uses while the service purges: one is open, one is locked,
// one is mapped.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <vector>

#include "ctl/check_service/data_files.h"

namespace spacekeep::ctl {

enum class Hold { kOpen, kLocked, kMapped };

class HeldFiles {
 public:
  /// A file, which is held in all three ways, or a directory, of whose files up to three are taken.
  /// Holds nothing when there is nothing to hold.
  explicit HeldFiles(const std::string& path);
  ~HeldFiles();
  HeldFiles(const HeldFiles&) = delete;
  HeldFiles& operator=(const HeldFiles&) = delete;

  [[nodiscard]] bool empty() const { return files_.empty(); }
  [[nodiscard]] std::size_t size() const { return files_.size(); }
  /// How much of the service's data is kept from it.
  [[nodiscard]] std::uint64_t occupiedBytes() const;
  /// Lets go of what was removed although it is held, so that its blocks come back and only this one
  /// fault shows. It is kept in losses().
  void releaseRemoved();
  /// "thumbs/7, which was locked".
  [[nodiscard]] const std::vector<std::string>& losses() const { return losses_; }

 private:
  struct File {
    std::string path;
    Hold hold = Hold::kOpen;
    DataFile facts;
    int fd = -1;  ///< none for a mapped file, which has to be in use by its mapping alone
    void* mapping = nullptr;  ///< of a mapped file
    std::size_t mapped_bytes = 0;
  };

  void hold(const std::string& path, Hold how);
  [[nodiscard]] static bool isRemoved(const File& file);
  static void release(const File& file);

  std::vector<File> files_;
  std::vector<std::string> losses_;
};

}  // namespace spacekeep::ctl
