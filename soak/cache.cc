#include "soak/cache.h"

#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cstdio>
#include <filesystem>
#include <random>
#include <utility>

namespace soak {
namespace {

using spacekeep::sdk::Answer;
using spacekeep::sdk::Job;

/// No more than that in one cache, so that one volume is filled by all of them together.
constexpr std::uint64_t kMostFiles = 1000;

unsigned drawBelow(unsigned limit) {
  static thread_local std::mt19937 random(std::random_device{}());
  return static_cast<unsigned>(random() % limit);
}

}  // namespace

// What an earlier process under this name has left is taken over, as a real cache would be.
Cache::Cache(std::string volume, std::string directory, Manners manners, bool may_crash)
    : volume_(std::move(volume)),
      directory_(std::move(directory)),
      manners_(manners),
      may_crash_(may_crash) {
  std::filesystem::create_directories(directory_);
  bool found = false;
  for (const auto& entry : std::filesystem::directory_iterator(directory_)) {
    const std::uint64_t number = std::stoull(entry.path().filename().string());
    first_ = found ? std::min(first_, number) : number;
    next_ = std::max(next_, number + 1);
    found = true;
  }
}

void Cache::beSlow(const Job& job) const {
  if (manners_ == Manners::kSlow) {
    job.cancellation.waitFor(std::chrono::milliseconds(200 + drawBelow(1800)));
  }
  if (manners_ == Manners::kSilent && drawBelow(50) == 0) {
    job.cancellation.waitFor(std::chrono::seconds(30));
  }
}

Answer Cache::purgeable(const Job& job) {
  beSlow(job);
  if (job.volume != volume_) return {};
  const std::scoped_lock lock(mutex_);
  return {.amount = (next_ - first_) * kFileBytes, .more = {}};
}

Answer Cache::purge(const Job& job) {
  beSlow(job);
  if (job.volume != volume_) return {};
  const std::uint64_t freed_bytes = removeFiles(job.amount);
  if (may_crash_ && crashes_allowed_ && drawBelow(100) == 0) ::_exit(3);
  return {.amount = freed_bytes, .more = {}};
}

std::uint64_t Cache::removeFiles(std::uint64_t bytes) {
  const std::scoped_lock lock(mutex_);
  std::uint64_t freed_bytes = 0;
  for (; freed_bytes < bytes && first_ < next_; ++first_) {
    if (std::remove(pathOf(first_).c_str()) == 0) freed_bytes += kFileBytes;
  }
  return freed_bytes;
}

void Cache::grow() {
  static const std::array<char, kFileBytes> kContent = {'x'};
  const std::scoped_lock lock(mutex_);
  if (next_ - first_ >= kMostFiles) return;
  const std::string path = pathOf(next_);
  const int fd = ::open(path.c_str(), O_WRONLY | O_CREAT | O_CLOEXEC, 0644);
  if (fd < 0) return;
  const bool whole =
      ::write(fd, kContent.data(), kContent.size()) == static_cast<ssize_t>(kContent.size());
  ::close(fd);
  if (whole) {
    ++next_;
  } else {
    ::unlink(path.c_str());  // a full volume is part of the soak
  }
}

std::string Cache::pathOf(std::uint64_t number) const {
  return directory_ + "/" + std::to_string(number);
}

}  // namespace soak
