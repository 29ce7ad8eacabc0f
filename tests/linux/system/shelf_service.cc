#include "tests/linux/system/shelf_service.h"

#include <cstdio>
#include <filesystem>
#include <fstream>
#include <utility>

namespace spacekeep::system_test {

ShelfService::ShelfService(std::string directory) : directory_(std::move(directory)) {
  std::filesystem::create_directories(directory_);
}

sdk::Answer ShelfService::purgeable(const sdk::Job&) {
  const std::scoped_lock lock(mutex_);
  return {.amount = (next_ - first_) * kFileBytes, .more = {}};
}

sdk::Answer ShelfService::purge(const sdk::Job& job) {
  const std::scoped_lock lock(mutex_);
  std::uint64_t freed_bytes = 0;
  for (; freed_bytes < job.amount && first_ < next_; ++first_) {
    std::remove(pathOf(first_).c_str());
    freed_bytes += kFileBytes;
  }
  ++times_purged_;
  return {.amount = freed_bytes, .more = {}};
}

void ShelfService::fillUpTo(std::uint64_t files) {
  const std::scoped_lock lock(mutex_);
  for (; next_ - first_ < files; ++next_) {
    std::ofstream(pathOf(next_)) << std::string(kFileBytes, 'x');
  }
}

std::string ShelfService::pathOf(std::uint64_t number) const {
  return directory_ + "/" + std::to_string(number);
}

}  // namespace spacekeep::system_test
