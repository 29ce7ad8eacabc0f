// Thread safety: every member may be called from any thread.
//
// A serial queue by label: its tasks run one at a time in the order in which they were submitted,
// on workers of the global concurrent queue. It owns no thread and costs nothing while empty.
#pragma once

#include <cstddef>
#include <deque>
#include <functional>
#include <memory>
#include <mutex>
#include <string>

#include "support/queues/concurrent_queue.h"
#include "support/runtime/runtime.h"

namespace spacekeep {

class SerialQueue final : public std::enable_shared_from_this<SerialQueue>, private rt::Keeper {
 public:
  [[nodiscard]] static std::shared_ptr<SerialQueue> create(std::string label,
                                                           ConcurrentQueue& global);

  [[nodiscard]] const std::string& label() const { return label_; }

  /// Queues the task and returns at once. Queued tasks keep the queue alive, except while it is
  /// suspended: a suspended queue that nobody refers to can never be resumed and drops its tasks.
  void async(Task task);

  /// Runs `task` in its turn, on the calling thread, and returns when it has run. Calling it from a
  /// task of the same queue can never end, so that is a panic that names the queue.
  void sync(const std::function<void()>& task);

  /// While suspended (suspensions nest) no further task starts; one that runs is not interrupted.
  void suspend();
  void resume();

  /// True in a task of this queue, also deep inside a sync() on another queue made from it.
  [[nodiscard]] bool isCurrent() const;

  /// The queue in whose task the calling thread is, the innermost one; null outside of all. It
  /// lives at least until that task ends.
  [[nodiscard]] static const SerialQueue* current();

  /// Panics with the queue's label and `where` unless isCurrent(). For objects that live on a
  /// queue.
  void assertCurrent(const char* where) const;

  /// Tasks waiting, the running one not counted.
  [[nodiscard]] std::size_t depth() const;

 private:
  struct Key {};

 public:
  SerialQueue(Key, std::string label, ConcurrentQueue& global);

 private:
  class Frame;
  class SyncTurn;
  struct Waiter;
  struct Item {
    Task task;                 ///< set for async items
    Waiter* waiter = nullptr;  ///< set for sync items: the thread that takes the turn
  };
  using Lock = std::unique_lock<rt::Mutex>;

  void letGo() override;  // drops its tasks: they may hold who owns this queue
  void startNext();
  void passTurn();
  void drain();
  bool takeTask(Task& task);
  void run(const Task& task);

  const std::string label_;
  ConcurrentQueue& global_;
  mutable rt::Mutex mutex_;
  // Protected by mutex_.
  std::deque<Item> items_;
  bool running_ = false;  ///< somebody has the turn, or is on the way to take it
  unsigned suspensions_ = 0;
};

}  // namespace spacekeep
