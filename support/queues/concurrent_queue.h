// Thread safety: every member may be called from any thread; destroy it only after the last caller.
//
// The global concurrent queue. Tasks start in the order in which they were submitted and run side
// by side on worker threads. The queue keeps `parallelism` workers runnable: while a worker waits
// inside one of the blocking primitives of this folder it does not count, and another one is
// started if work is pending. A task that waits for another task therefore never starves it.
// Idle workers end after a while, so an idle process keeps no wake-ups. Under steady load those end
// of which that long none was needed: the work goes round, so each of them has some now and then.
#pragma once

#include <cstddef>
#include <cstdint>
#include <deque>
#include <functional>
#include <mutex>
#include <string>

#include "support/runtime/runtime.h"

namespace spacekeep {

using Task = std::function<void()>;

class ConcurrentQueue {
 public:
  struct Options {
    std::string name = "global";
    std::size_t parallelism = 4;                    ///< runnable workers kept at most, at least 1
    std::uint64_t idle_worker_ns = 10'000'000'000;  ///< a worker idle or not needed for longer ends
    /// Run by a worker that ends because there is less to do, at most once in `idle_worker_ns`, when
    /// the queue no longer counts on it: to give back what busy times have taken. It may outlive the
    /// queue.
    void (*on_less_to_do)() = nullptr;
  };
  struct Counts {
    std::size_t threads;  ///< workers alive
    std::size_t blocked;  ///< of these, waiting in a blocking primitive
    std::size_t pending;  ///< tasks not started yet
    std::size_t peak_threads;
  };

  explicit ConcurrentQueue(Options options);
  /// Waits for the tasks submitted so far, and for what they submit in turn, then ends the workers.
  ~ConcurrentQueue();
  ConcurrentQueue(const ConcurrentQueue&) = delete;
  ConcurrentQueue& operator=(const ConcurrentQueue&) = delete;

  /// Never waits for other tasks. A task that throws ends the process with the queue's name.
  void async(Task task);
  [[nodiscard]] Counts counts() const;

 private:
  friend class BlockingRegion;
  /// A worker as its own thread sees it, found through ThreadSlot::kPoolWorker.
  struct Worker {
    ConcurrentQueue* queue;
    unsigned open_regions = 0;  ///< nested regions count once
  };
  class Membership;
  using Lock = std::unique_lock<rt::Mutex>;

  void workerBlocks();
  void workerUnblocks();
  void provideWorker();
  void startWorker();
  void work(Worker& self);
  bool takeTask(Lock& lock, Task& task);
  [[nodiscard]] bool mayTakeTask() const;
  void oneLessIdle();
  bool isSurplus();
  bool mayGiveBack();

  const Options options_;
  mutable rt::Mutex mutex_;
  // Protected by mutex_.
  rt::CondVar work_available_;
  rt::CondVar worker_ended_;
  std::deque<Task> pending_;
  std::size_t threads_ = 0;
  std::size_t idle_ = 0;  ///< alive without a task: waiting for one or about to look for one
  std::size_t blocked_ = 0;
  std::size_t peak_threads_ = 0;
  std::uint64_t window_ends_ = 0;    ///< ticks
  std::size_t least_idle_ = 0;       ///< of this window
  std::uint64_t may_give_back_ = 0;  ///< ticks
  std::size_t surplus_ = 0;          ///< workers that were idle throughout the window before
  bool stopping_ = false;
};

/// Marks the calling thread as waiting for the time of its scope. A no-op outside of a worker.
/// Opened before any lock is taken, since it takes the queue's own.
class BlockingRegion {
 public:
  BlockingRegion();
  ~BlockingRegion();
  BlockingRegion(const BlockingRegion&) = delete;
  BlockingRegion& operator=(const BlockingRegion&) = delete;

 private:
  ConcurrentQueue::Worker* worker_;
};

}  // namespace spacekeep
