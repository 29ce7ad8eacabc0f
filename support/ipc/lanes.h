// Thread safety: every member may be called from any thread.
//
// Lanes of work on the global concurrent queue: tasks of one lane start in the order in which they
// came, at most `width` of them run at once. What waits needs no thread.
#pragma once

#include <cstddef>
#include <deque>
#include <map>
#include <memory>
#include <string>
#include <string_view>

#include "support/queues/concurrent_queue.h"
#include "support/runtime/runtime.h"

namespace spacekeep::ipc {

class Lanes : public std::enable_shared_from_this<Lanes> {
 public:
  explicit Lanes(ConcurrentQueue& global) : global_(global) {}

  void run(std::string_view lane, std::size_t width, Task task);
  /// Tasks that have not started yet.
  [[nodiscard]] std::size_t waiting(std::string_view lane) const;

 private:
  struct Lane {
    std::size_t running = 0;
    std::deque<Task> waiting;
  };
  void start(Lane& lane, Task task);
  void ended(Lane& lane);

  ConcurrentQueue& global_;
  mutable rt::Mutex mutex_;
  std::map<std::string, Lane, std::less<>> lanes_;  // protected by mutex_; lanes are never removed
};

}  // namespace spacekeep::ipc
