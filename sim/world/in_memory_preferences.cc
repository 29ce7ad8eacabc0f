#include "sim/world/in_memory_preferences.h"
#include "support/runtime/locks.h"

#include <utility>

namespace spacekeep::sim {

InMemoryDisk::Contents InMemoryDisk::read(const std::string& suite) const {
  const std::scoped_lock lock(mutex_);
  const auto found = suites_.find(suite);
  return found == suites_.end() ? Contents() : found->second;
}

void InMemoryDisk::write(const std::string& suite, Contents contents) {
  const std::scoped_lock lock(mutex_);
  suites_[suite] = std::move(contents);
  ++writes_;
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
  if (auto failure = refresh()) return failure;
  if (unwritten_.empty()) return std::nullopt;
  for (auto& [key, value] : unwritten_) {
    known_.erase(key);
    if (value) known_.emplace(key, std::move(*value));
  }
  unwritten_.clear();
  disk_.write(name_, known_);
  return std::nullopt;
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
