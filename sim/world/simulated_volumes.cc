#include "sim/world/simulated_volumes.h"
#include "support/runtime/locks.h"

#include <algorithm>
#include <utility>

namespace spacekeep::sim {

void SimulatedVolumes::add(const std::string& volume, std::uint64_t size_bytes,
                           std::uint64_t free_bytes) {
  const std::scoped_lock lock(mutex_);
  if (!volumes_.contains(volume)) mount_order_.push_back(volume);
  Volume& state = volumes_[volume];
  state.size = size_bytes;
  set(volume, state, free_bytes);
}

void SimulatedVolumes::remove(const std::string& volume) {
  const std::scoped_lock lock(mutex_);
  volumes_.erase(volume);
  std::erase(mount_order_, volume);
  std::erase(low_space_, volume);
}

std::uint64_t SimulatedVolumes::write(const std::string& volume, std::uint64_t bytes) {
  const std::scoped_lock lock(mutex_);
  const auto found = volumes_.find(volume);
  if (found == volumes_.end()) return 0;
  const std::uint64_t taken = std::min(bytes, found->second.free);
  set(volume, found->second, found->second.free - taken);
  return taken;
}

void SimulatedVolumes::giveBack(const std::string& volume, std::uint64_t bytes,
                                std::uint64_t after_ns) {
  if (after_ns == 0) {
    addFree(volume, bytes);
    return;
  }
  addOutstanding(volume, bytes);
  delays_.after(after_ns, [this, volume, bytes] {
    addOutstanding(volume, 0 - bytes);
    addFree(volume, bytes);
  });
}

void SimulatedVolumes::setFree(const std::string& volume, std::uint64_t free_bytes) {
  const std::scoped_lock lock(mutex_);
  const auto found = volumes_.find(volume);
  if (found != volumes_.end()) set(volume, found->second, free_bytes);
}

void SimulatedVolumes::setLowSpace(std::vector<std::string> volumes) {
  const std::scoped_lock lock(mutex_);
  low_space_ = std::move(volumes);
}

std::uint64_t SimulatedVolumes::freeBytes(const std::string& volume) const {
  const std::scoped_lock lock(mutex_);
  const auto found = volumes_.find(volume);
  return found == volumes_.end() ? 0 : found->second.free;
}

std::vector<std::string> SimulatedVolumes::getLocalVolumes() {
  const std::scoped_lock lock(mutex_);
  return mount_order_;
}

std::vector<std::string> SimulatedVolumes::lowSpaceVolumes() {
  const std::scoped_lock lock(mutex_);
  return low_space_;
}

bool SimulatedVolumes::validateVolume(const Dictionary& info) {
  const std::string* volume = stringAt(info, "SPACEKEEP_VOLUME");
  const std::scoped_lock lock(mutex_);
  return volume != nullptr && volumes_.contains(*volume);
}

std::uint64_t SimulatedVolumes::volumeFreespace(const Value* volume) {
  const std::string* path = volume == nullptr ? nullptr : volume->string();
  if (path == nullptr) return 0;
  const std::scoped_lock lock(mutex_);
  const auto found = volumes_.find(*path);
  const std::uint64_t free_bytes = found == volumes_.end() ? 0 : found->second.free;
  trace_.add(FreeSpaceLooked{*path, free_bytes});
  return free_bytes;
}

void SimulatedVolumes::setLowSpaceSettings(const LowSpaceSettings& settings) {
  const std::scoped_lock lock(mutex_);
  low_space_settings_ = settings;
}

std::optional<LowSpaceSettings> SimulatedVolumes::lowSpaceSettings() const {
  const std::scoped_lock lock(mutex_);
  return low_space_settings_;
}

std::uint64_t SimulatedVolumes::outstandingBytes(const std::string& volume) const {
  const std::scoped_lock lock(mutex_);
  const auto found = volumes_.find(volume);
  return found == volumes_.end() ? 0 : found->second.outstanding;
}

// Modulo 2^64, so that it takes away as well.
void SimulatedVolumes::addOutstanding(const std::string& volume, std::uint64_t bytes) {
  const std::scoped_lock lock(mutex_);
  const auto found = volumes_.find(volume);
  if (found != volumes_.end()) found->second.outstanding += bytes;
}

void SimulatedVolumes::addFree(const std::string& volume, std::uint64_t bytes) {
  const std::scoped_lock lock(mutex_);
  const auto found = volumes_.find(volume);
  if (found == volumes_.end()) return;
  Volume& state = found->second;
  set(volume, state, state.free + std::min(bytes, state.size - state.free));
}

void SimulatedVolumes::set(const std::string& volume, Volume& state, std::uint64_t free_bytes) {
  state.free = std::min(free_bytes, state.size);
  trace_.add(FreeSpaceIs{volume, state.free});
}

}  // namespace spacekeep::sim
