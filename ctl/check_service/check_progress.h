// Thread safety: for one thread.
//
// Shows on a terminal which check is being made, once it takes longer than a second.
#pragma once

#include <cstddef>
#include <string>

#include "support/queues/waiting.h"
#include "support/runtime/runtime.h"

namespace spacekeep::ctl {

class CheckProgress {
 public:
  /// Does nothing unless `wanted`.
  CheckProgress(bool wanted, std::string name, std::size_t columns);
  /// Takes the line away.
  ~CheckProgress();
  CheckProgress(const CheckProgress&) = delete;
  CheckProgress& operator=(const CheckProgress&) = delete;

 private:
  void show();

  const std::string name_;
  const std::size_t columns_;
  CountingSemaphore over_{0};
  rt::Thread thread_;
};

}  // namespace spacekeep::ctl
