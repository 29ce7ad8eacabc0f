// Thread safety: every member may be called from any thread; destroy it before its queue.
//
// Tasks that start later: each is submitted to the global queue when its time has come.
#pragma once

#include <cstdint>
#include <map>
#include <utility>

#include "support/queues/concurrent_queue.h"
#include "support/runtime/runtime.h"

namespace spacekeep::sim {

class DelayLine {
 public:
  explicit DelayLine(ConcurrentQueue& global);
  ~DelayLine();
  DelayLine(const DelayLine&) = delete;
  DelayLine& operator=(const DelayLine&) = delete;

  void after(std::uint64_t delay_ns, Task task);
  /// Drops what has not started and starts nothing any more. Not from one of the tasks.
  void stop();

 private:
  void run();

  ConcurrentQueue& global_;
  rt::Mutex mutex_;
  rt::CondVar changed_;
  // Protected by mutex_.
  std::map<std::pair<std::uint64_t, std::uint64_t>, Task> waiting_;  // by deadline, then order
  std::uint64_t next_order_ = 0;
  bool stopped_ = false;
  bool thread_started_ = false;
  rt::Thread thread_;
};

}  // namespace spacekeep::sim
