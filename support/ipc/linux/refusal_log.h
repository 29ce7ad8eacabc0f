// Thread safety: confined to the IPC thread.
//
// Log lines about connections that were refused or cut off, and about calls that were refused. Whoever
// can cause them can cause any number of them, so only so many of each kind go out in a while; how many
// were left out is told when that time is over.
#pragma once

#include <cstdint>
#include <string>
#include <string_view>

#include "support/ipc/linux/ipc_loop.h"

namespace spacekeep::ipc {

class RefusalLog {
 public:
  static constexpr unsigned kLinesPerWindow = 20;
  static constexpr std::uint64_t kWindowNs = 10'000'000'000;

  enum class Of { kConnections, kCalls };

  RefusalLog(IpcLoop& loop, Of kind, std::uint64_t window_ns = kWindowNs)
      : loop_(loop), kind_(kind), window_ns_(window_ns) {}
  RefusalLog(const RefusalLog&) = delete;
  RefusalLog& operator=(const RefusalLog&) = delete;

  /// `what`: the method of a refused call, nothing of a connection.
  void write(std::string_view who, std::string_view why, std::string_view what = {});
  /// Tells what was left out so far. What comes later is written at once.
  void close();

 private:
  static int onWindowEnd(sd_event_source*, std::uint64_t usec, void* self);
  bool mayWrite();
  void endWindow();

  IpcLoop& loop_;
  const Of kind_;
  const std::uint64_t window_ns_;
  sd_event_source* window_end_ = nullptr;  // while a window is open
  unsigned written_ = 0;                   // in it
  std::uint64_t left_out_ = 0;
  bool closed_ = false;
};

}  // namespace spacekeep::ipc
