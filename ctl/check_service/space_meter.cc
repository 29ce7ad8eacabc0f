#include "ctl/check_service/space_meter.h"

#include <fcntl.h>
#include <sys/statvfs.h>
#include <unistd.h>

#include <algorithm>

#include "ctl/check_service/patience.h"
#include "support/runtime/runtime.h"

namespace spacekeep::ctl {
namespace {

constexpr std::uint64_t kKiB = 1024;
constexpr std::uint64_t kLeastSlackBytes = 256 * kKiB;
constexpr std::uint64_t kNoiseWatchNs = 300 * kMillisecondNs;
constexpr std::uint64_t kLateBlocksNs = 3 * kSecondNs;
constexpr std::uint64_t kBeforeSyncNs = 100 * kMillisecondNs;

SpaceReading volumeOf(const std::string& path) {
  struct statvfs facts {};
  if (statvfs(path.c_str(), &facts) != 0) return {};
  return {.free_bytes = std::uint64_t{facts.f_bavail} * facts.f_frsize,
          .used_bytes = std::uint64_t{facts.f_blocks - facts.f_bfree} * facts.f_frsize,
          .files = {}};
}

std::int64_t difference(std::uint64_t later, std::uint64_t earlier) {
  return static_cast<std::int64_t>(later - earlier);
}

/// Below the directory, where there is one.
std::string shortName(const std::string& path, const std::string& directory) {
  const std::string beginning = directory.ends_with('/') ? directory : directory + "/";
  return path.starts_with(beginning) ? path.substr(beginning.size()) : path;
}

void writeOut(const std::string& path) {
  const int fd = open(path.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC);
  if (fd < 0) return;
  syncfs(fd);
  close(fd);
}

}  // namespace

void SpaceMeter::learnNoise() {
  const std::uint64_t start = volumeOf(volume_).free_bytes;
  within(kNoiseWatchNs, [&] {
    const std::int64_t moved = difference(volumeOf(volume_).free_bytes, start);
    noise_bytes_ = std::max(noise_bytes_, static_cast<std::uint64_t>(moved < 0 ? -moved : moved));
    return false;
  });
}

SpaceReading SpaceMeter::read() const {
  SpaceReading reading = volumeOf(volume_);
  if (data_) reading.files = dataFilesBelow(*data_);
  return reading;
}

std::uint64_t SpaceMeter::freeBytes() const { return volumeOf(volume_).free_bytes; }

SpaceChange SpaceMeter::since(const SpaceReading& before, std::uint64_t expected_bytes) const {
  const auto gained = [&] { return difference(volumeOf(volume_).free_bytes, before.free_bytes); };
  const std::uint64_t enough = expected_bytes - std::min(expected_bytes, slackFor(expected_bytes));
  const auto arrived = [&] { return gained() >= static_cast<std::int64_t>(enough); };
  if (expected_bytes > 0 && !within(kBeforeSyncNs, arrived)) {
    writeOut(volume_);
    within(kLateBlocksNs, arrived);
  }
  SpaceChange change{.gained_bytes = gained(), .vanished = {}};
  if (before.files && data_) {
    change.vanished = vanishedBetween(*before.files, dataFilesBelow(*data_));
    for (std::string& path : change.vanished->paths) path = shortName(path, *data_);
  }
  return change;
}

std::uint64_t SpaceMeter::slackFor(std::uint64_t amount_bytes) const {
  return kLeastSlackBytes + amount_bytes / 16 + 4 * noise_bytes_;
}

std::uint64_t SpaceMeter::freedBy(const SpaceChange& change) {
  if (change.vanished) return change.vanished->occupied_bytes;
  return static_cast<std::uint64_t>(std::max<std::int64_t>(change.gained_bytes, 0));
}

}  // namespace spacekeep::ctl
