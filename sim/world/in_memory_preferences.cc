#include "sim/world/in_memory_preferences.h"
#include "support/queues/concurrent_queue.h"
#include "support/runtime/locks.h"

#include <utility>

namespace spacekeep::sim {
namespace {

Dictionary dictionaryOf(const InMemoryDisk::Contents& contents) {
  Dictionary all;
  for (const auto& [key, value] : contents) all.set(key, value);
  return all;
}

// As a write to a real disk does, it tells the pool that its thread is busy for nobody.
void sleepIfAny(std::uint64_t duration_ns) {
  if (duration_ns == 0) return;
  const BlockingRegion writing;
  rt::sleepNs(duration_ns);
}

}  // namespace

InMemoryDisk::Contents InMemoryDisk::read(const std::string& suite) const {
  const std::scoped_lock lock(mutex_);
  const auto found = suites_.find(suite);
  return found == suites_.end() ? Contents() : found->second;
}

void InMemoryDisk::write(const std::string& suite, Contents contents) {
  const std::scoped_lock lock(mutex_);
  if (is_over_ != nullptr && is_over_()) return;
  if (trace_ != nullptr) trace_->add(DiskWritten{suite, dictionaryOf(contents)});
  suites_[suite] = std::move(contents);
  ++writes_;
}

void InMemoryDisk::restore(const std::string& suite, Contents contents) {
  const std::scoped_lock lock(mutex_);
  suites_[suite] = std::move(contents);
}

void InMemoryDisk::refused(const std::string& suite, const std::string& reason) {
  if (trace_ != nullptr) trace_->add(DiskRefused{suite, reason});
}

void InMemoryDisk::setWriteTimeNs(std::uint64_t duration_ns) {
  const std::scoped_lock lock(mutex_);
  write_time_ns_ = duration_ns;
}

std::uint64_t InMemoryDisk::writeTimeNs() const {
  const std::scoped_lock lock(mutex_);
  return write_time_ns_;
}

std::uint64_t InMemoryDisk::writes() const {
  const std::scoped_lock lock(mutex_);
  return writes_;
}

void InMemoryDisk::refuseToOpen(bool refuse) {
  const std::scoped_lock lock(mutex_);
  refuse_to_open_ = refuse;
}

void InMemoryDisk::failSynchronize(std::string reason) {
  const std::scoped_lock lock(mutex_);
  failure_ = std::move(reason);
}

void InMemoryDisk::limitValuesTo(std::size_t bytes) {
  const std::scoped_lock lock(mutex_);
  largest_value_ = bytes;
}

std::size_t InMemoryDisk::largestValue() const {
  const std::scoped_lock lock(mutex_);
  return largest_value_;
}

bool InMemoryDisk::refusesToOpen() const {
  const std::scoped_lock lock(mutex_);
  return refuse_to_open_;
}

std::optional<std::string> InMemoryDisk::synchronizeFailure() const {
  const std::scoped_lock lock(mutex_);
  return failure_.empty() ? std::nullopt : std::optional(failure_);
}

InMemoryPreferencesSuite::InMemoryPreferencesSuite(InMemoryDisk& disk, std::string name)
    : disk_(disk), name_(std::move(name)), known_(disk.read(name_)) {}

std::optional<std::string> InMemoryPreferencesSuite::synchronize() {
  if (auto failure = refresh()) {
    if (!unwritten_.empty()) disk_.refused(name_, *failure);
    return failure;
  }
  if (unwritten_.empty()) return std::nullopt;
  if (giveUpWhatIsTooLarge()) return "too large to be stored and given up";
  const std::uint64_t half_ns = disk_.writeTimeNs() / 2;
  sleepIfAny(half_ns);
  for (auto& [key, value] : unwritten_) {
    known_.erase(key);
    if (value) known_.emplace(key, std::move(*value));
  }
  unwritten_.clear();
  disk_.write(name_, known_);
  sleepIfAny(half_ns);
  return std::nullopt;
}

bool InMemoryPreferencesSuite::giveUpWhatIsTooLarge() {
  const std::size_t largest = disk_.largestValue();
  if (largest == kMaxPlistBytes) return false;  // nothing here comes near it
  return std::erase_if(unwritten_, [largest](const auto& entry) {
           return entry.second && binaryPlist(*entry.second).size() > largest;
         }) > 0;
}

std::optional<std::string> InMemoryPreferencesSuite::refresh() {
  if (auto failure = disk_.synchronizeFailure()) return failure;
  known_ = disk_.read(name_);
  return std::nullopt;
}

const Value* InMemoryPreferencesSuite::find(std::string_view key) const {
  if (const auto changed = unwritten_.find(key); changed != unwritten_.end()) {
    return changed->second ? &*changed->second : nullptr;
  }
  const auto found = known_.find(key);
  return found == known_.end() ? nullptr : &found->second;
}

void InMemoryPreferencesSuite::set(std::string_view key, std::optional<Value> value) {
  unwritten_.insert_or_assign(std::string(key), std::move(value));
}

void InMemoryPreferencesSuite::discard(std::string_view key) {
  if (const auto set = unwritten_.find(key); set != unwritten_.end()) unwritten_.erase(set);
}

}  // namespace spacekeep::sim
