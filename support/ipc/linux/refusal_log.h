// Thread safety: confined to the IPC thread.
//
// Log lines about connections that were refused or cut off. Whoever can cause them can cause any
// number of them, so only so many go out in a while.
#pragma once

#include <cstdint>
#include <string>

namespace spacekeep::ipc {

class RefusalLog {
 public:
  static constexpr unsigned kLinesPerWindow = 20;
  static constexpr std::uint64_t kWindowNs = 10'000'000'000;

  void write(const std::string& who, const std::string& why);

 private:
  std::uint64_t window_ends_ = 0;  // in ticks
  unsigned written_ = 0;
  std::uint64_t left_out_ = 0;
};

}  // namespace spacekeep::ipc
