// Thread safety: made and destroyed by one thread; the handler runs on a thread of its own.
//
// SIGTERM and SIGINT as a call, outside of any signal handler.
#pragma once

#include <functional>

#include "services/cachedir/engine/unique_fd.h"
#include "support/runtime/runtime.h"

namespace spacekeep::cachedir {

class StopSignals {
 public:
  /// Keeps both signals from ending the process. Before any other thread is started, because each
  /// inherits this.
  static void block();

  /// Calls `stop` at the first of the signals, and again at each further one.
  explicit StopSignals(std::function<void()> stop);
  ~StopSignals();
  StopSignals(const StopSignals&) = delete;
  StopSignals& operator=(const StopSignals&) = delete;

 private:
  UniqueFd signals_;
  UniqueFd ending_;
  rt::Thread thread_;
};

}  // namespace spacekeep::cachedir
