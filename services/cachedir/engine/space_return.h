// Thread safety: one thread at a time.
//
// Waits until deleted bytes show in the free space of their file system. ext4 and tmpfs show them
// at once; xfs frees blocks in the background, within milliseconds; btrfs only with the next commit
// of a transaction, which may be 30 seconds away and which syncfs(2) brings about.
#pragma once

#include <cstdint>

#include "services/cachedir/engine/cancel_token.h"
#include "services/cachedir/engine/unique_fd.h"

namespace spacekeep::cachedir {

class SpaceReturn {
 public:
  /// Notes the free space now. `fd` is any descriptor on the file system; a copy is kept.
  explicit SpaceReturn(int fd);

  void add(std::uint64_t bytes) { expected_ += bytes; }
  /// Returns when the space is back, when everything that helps has been tried, or on cancel.
  void wait(const CancelToken& cancel);

 private:
  [[nodiscard]] bool isBack() const;
  bool poll(std::uint64_t limit_ns, const CancelToken& cancel) const;
  void flush(const CancelToken& cancel) const;

  UniqueFd fd_;
  std::uint64_t free_before_ = 0;
  std::uint64_t expected_ = 0;
};

}  // namespace spacekeep::cachedir
