// Thread safety: every member may be called from any thread; may block on the disk.
//
// A file that holds on to a little space and one inode, to be given back when the daemon itself has
// none left: whoever frees space for others must still be able to note down its own state.
#pragma once

#include <cstdint>
#include <string>

#include "support/runtime/runtime.h"

namespace spacekeep {

class ReserveFile {
 public:
  static constexpr std::uint64_t kBytes = 1024 * 1024;
  /// The reserve is taken only where this many times its size is available: it must not itself make
  /// the volume short again.
  static constexpr std::uint64_t kRoomFactor = 8;

  explicit ReserveFile(std::string path, std::uint64_t bytes = kBytes);

  /// Answers whether the reserve is there afterwards. False when there is too little room, or the
  /// directory does not exist yet.
  bool take();
  /// Answers whether something was given back.
  bool giveBack();

 private:
  [[nodiscard]] bool isThere() const;
  [[nodiscard]] bool hasRoom() const;

  const std::string path_;
  const std::uint64_t bytes_;
  rt::Mutex mutex_;  // one at a time on the file
};

}  // namespace spacekeep
