// Thread safety: every member may be called from any thread.
//
// Asks serial queues for a sign of life.
#pragma once

#include <cstdint>
#include <memory>
#include <vector>

#include "support/queues/serial_queue.h"
#include "support/runtime/runtime.h"

namespace spacekeep {

class QueueProbe {
 public:
  /// Queues whose tasks are short. A queue that runs whole operations is busy for minutes while all
  /// is well, and does not belong here.
  explicit QueueProbe(std::vector<std::shared_ptr<SerialQueue>> queues);

  /// Whether every queue gets round to a task within `wait_ns`. A queue that still owes the answer
  /// to an earlier question is not asked again, so a stuck queue does not fill up with questions.
  [[nodiscard]] bool answersWithin(std::uint64_t wait_ns);

 private:
  /// Outlives the probe in the questions that are never answered.
  struct State {
    rt::Mutex mutex;
    rt::CondVar answered;
    // Protected by mutex.
    std::vector<bool> asked;
    std::size_t open = 0;
  };

  void askAll();

  const std::vector<std::shared_ptr<SerialQueue>> queues_;
  const std::shared_ptr<State> state_;
};

}  // namespace spacekeep
