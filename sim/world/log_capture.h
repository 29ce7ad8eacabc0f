// Thread safety: at most one capture exists in a process; make and destroy it on one thread.
//
// Sends every log line of both levels to a trace for as long as it lives.
#pragma once

#include "sim/world/trace.h"
#include "support/logging/log.h"

namespace spacekeep::sim {

class LogCapture {
 public:
  explicit LogCapture(Trace& trace);
  ~LogCapture();
  LogCapture(const LogCapture&) = delete;
  LogCapture& operator=(const LogCapture&) = delete;

  /// The handle that is installed; a test may change its level or take it down.
  [[nodiscard]] LogHandle& handle() { return handle_; }

 private:
  Trace& trace_;
  LogHandle handle_;
  LogHandle* previous_handle_;
  LogWrite previous_write_;
};

}  // namespace spacekeep::sim
