#include "sim/world/in_memory_history.h"

#include <utility>

#include "support/queues/concurrent_queue.h"
#include "support/runtime/locks.h"

namespace spacekeep::sim {

class InMemoryHistory::Store final : public HistoryStore {
 public:
  explicit Store(InMemoryHistory& disk) : disk_(disk) {}

  std::optional<std::string> append(const std::vector<Dictionary>& entries) override {
    pause();
    const std::scoped_lock lock(disk_.mutex_);
    ++disk_.writes_;
    if (!disk_.failure_.empty()) return disk_.failure_;
    for (const Dictionary& entry : entries) {
      const std::uint64_t last = disk_.entries_.empty() ? 0 : disk_.entries_.back().number;
      disk_.entries_.push_back({.number = last + 1, .entry = entry});
    }
    return std::nullopt;
  }

  std::optional<std::string> visit(const HistoryRange& range, const Visitor& visitor) override {
    const std::scoped_lock lock(disk_.mutex_);
    if (!disk_.failure_.empty()) return disk_.failure_;
    for (auto stored = disk_.entries_.rbegin(); stored != disk_.entries_.rend(); ++stored) {
      const std::string* volume = stringAt(stored->entry, "SPACEKEEP_VOLUME");
      const bool is_before = !range.before || stored->number < *range.before;
      const bool is_there = !range.volume || (volume != nullptr && *volume == *range.volume);
      if (is_before && is_there && !visitor(*stored)) break;
    }
    return std::nullopt;
  }

 private:
  void pause() const {
    std::uint64_t duration_ns = 0;
    {
      const std::scoped_lock lock(disk_.mutex_);
      duration_ns = disk_.write_time_ns_;
    }
    if (duration_ns == 0) return;
    const BlockingRegion writing;
    rt::sleepNs(duration_ns);
  }

  InMemoryHistory& disk_;
};

std::unique_ptr<HistoryStore> InMemoryHistory::open() {
  const std::scoped_lock lock(mutex_);
  if (refuse_to_open_) return nullptr;
  return std::make_unique<Store>(*this);
}

std::vector<StoredEntry> InMemoryHistory::entries() const {
  const std::scoped_lock lock(mutex_);
  return entries_;
}

std::uint64_t InMemoryHistory::writes() const {
  const std::scoped_lock lock(mutex_);
  return writes_;
}

void InMemoryHistory::refuseToOpen(bool refuse) {
  const std::scoped_lock lock(mutex_);
  refuse_to_open_ = refuse;
}

void InMemoryHistory::fail(std::string reason) {
  const std::scoped_lock lock(mutex_);
  failure_ = std::move(reason);
}

void InMemoryHistory::setWriteTimeNs(std::uint64_t duration_ns) {
  const std::scoped_lock lock(mutex_);
  write_time_ns_ = duration_ns;
}

}  // namespace spacekeep::sim
