#include "support/queues/serial_queue.h"

#include <algorithm>
#include <utility>

#include "support/queues/run_task.h"

namespace spacekeep {

/// The queues whose tasks the current thread is in, innermost first, kept on its own stack.
class SerialQueue::Frame {
 public:
  explicit Frame(const SerialQueue& queue) : queue_(&queue), outer_(innermost()) {
    rt::threadSlot(rt::ThreadSlot::kCurrentQueue) = this;
  }
  ~Frame() { rt::threadSlot(rt::ThreadSlot::kCurrentQueue) = outer_; }
  Frame(const Frame&) = delete;
  Frame& operator=(const Frame&) = delete;

  static bool isOn(const SerialQueue& queue) {
    const Frame* frame = innermost();
    while (frame != nullptr && frame->queue_ != &queue) frame = frame->outer_;
    return frame != nullptr;
  }

  static const SerialQueue* queue() {
    const Frame* frame = innermost();
    return frame == nullptr ? nullptr : frame->queue_;
  }

 private:
  static Frame* innermost() {
    return static_cast<Frame*>(rt::threadSlot(rt::ThreadSlot::kCurrentQueue));
  }

  const SerialQueue* const queue_;
  Frame* const outer_;
};

/// A thread in sync() that waits for its turn. Lives on that thread's stack.
struct SerialQueue::Waiter {
  rt::CondVar turn_given;
  bool has_turn = false;
};

/// The turn of a sync() call: held from the end of the constructor, passed on by the destructor.
class SerialQueue::SyncTurn {
 public:
  explicit SyncTurn(SerialQueue& queue) : queue_(queue) {
    if (!takeFreeTurn()) waitForTurn();
  }
  ~SyncTurn() { queue_.passTurn(); }
  SyncTurn(const SyncTurn&) = delete;
  SyncTurn& operator=(const SyncTurn&) = delete;

 private:
  bool takeFreeTurn() {
    const Lock lock(queue_.mutex_);
    if (queue_.running_ || queue_.suspensions_ > 0 || !queue_.items_.empty()) return false;
    queue_.running_ = true;
    return true;
  }

  void waitForTurn() {
    const BlockingRegion region;
    Waiter waiter;
    const Lock lock(queue_.mutex_);
    queue_.items_.push_back({.task = nullptr, .waiter = &waiter});
    queue_.startNext();
    try {
      while (!waiter.has_turn) waiter.turn_given.wait(queue_.mutex_);
    } catch (...) {
      leave(waiter);
      throw;
    }
  }

  // Only the end of a simulated schedule ends a wait this way; the queue must not keep `waiter`.
  void leave(const Waiter& waiter) {
    std::erase_if(queue_.items_, [&waiter](const Item& item) { return item.waiter == &waiter; });
    if (waiter.has_turn) queue_.running_ = false;
  }

  SerialQueue& queue_;
};

std::shared_ptr<SerialQueue> SerialQueue::create(std::string label, ConcurrentQueue& global) {
  return std::make_shared<SerialQueue>(Key{}, std::move(label), global);
}

SerialQueue::SerialQueue(Key, std::string label, ConcurrentQueue& global)
    : label_(std::move(label)), global_(global) {}

void SerialQueue::async(Task task) {
  Lock lock(mutex_);
  items_.push_back({.task = std::move(task)});
  if (running_ || suspensions_ > 0) return;
  running_ = true;
  // Without the lock, which the worker would wait for as soon as it began.
  lock.unlock();
  global_.async([self = shared_from_this()] { self->drain(); });
}

void SerialQueue::sync(const std::function<void()>& task) {
  if (isCurrent()) rt::panic(("sync on queue " + label_ + " from a task of its own").c_str());
  const std::shared_ptr<SerialQueue> self = shared_from_this();  // The task may drop the last one.
  const SyncTurn turn(*this);
  run(task);
}

void SerialQueue::suspend() {
  const Lock lock(mutex_);
  ++suspensions_;
}

void SerialQueue::resume() {
  const Lock lock(mutex_);
  if (suspensions_ == 0) rt::panic(("resume of queue " + label_ + " without suspend").c_str());
  --suspensions_;
  startNext();
}

bool SerialQueue::isCurrent() const { return Frame::isOn(*this); }

const SerialQueue* SerialQueue::current() { return Frame::queue(); }

void SerialQueue::assertCurrent(const char* where) const {
  if (isCurrent()) return;
  rt::panic((std::string(where) + " must run on queue " + label_).c_str());
}

std::size_t SerialQueue::depth() const {
  const Lock lock(mutex_);
  return items_.size();
}

void SerialQueue::letGo() {
  const std::shared_ptr<SerialQueue> self =
      weak_from_this().lock();  // A task may hold the last one.
  std::deque<Item> items;
  const Lock lock(mutex_);
  items.swap(items_);
}

/// Gives the free turn to the first item, if there is one and nothing stands against it.
void SerialQueue::startNext() {
  if (running_ || suspensions_ > 0 || items_.empty()) return;
  running_ = true;
  if (Waiter* const waiter = items_.front().waiter; waiter != nullptr) {
    items_.pop_front();
    waiter->has_turn = true;
    // Under the lock: the waiter leaves its stack frame, and with it the condition, right after.
    waiter->turn_given.notifyOne();
    return;
  }
  global_.async([self = shared_from_this()] { self->drain(); });
}

void SerialQueue::passTurn() {
  const Lock lock(mutex_);
  running_ = false;
  startNext();
}

/// Runs async items on the current worker until a sync item, a suspension or the end stops it.
void SerialQueue::drain() {
  Task task;
  while (takeTask(task)) {
    run(task);
    task = nullptr;  // What it captured may take this queue's lock when it goes.
  }
  passTurn();
}

bool SerialQueue::takeTask(Task& task) {
  const Lock lock(mutex_);
  if (suspensions_ > 0 || items_.empty() || items_.front().waiter != nullptr) return false;
  task = std::move(items_.front().task);
  items_.pop_front();
  return true;
}

void SerialQueue::run(const Task& task) {
  const Frame frame(*this);
  runTask(label_, task);
}

}  // namespace spacekeep
