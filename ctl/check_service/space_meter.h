// Thread safety: for one thread.
//
// What a volume gains while a service works. Other programs write too, and some file systems show
// freed blocks late, so a difference is only called one beyond a slack.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <utility>

#include "ctl/check_service/data_files.h"

namespace spacekeep::ctl {

/// The volume, and the service's own files where they are known, at one moment.
struct SpaceReading {
  std::uint64_t free_bytes = 0;
  std::uint64_t used_bytes = 0;
  std::optional<DataFiles> files;
};

/// What happened between two readings.
struct SpaceChange {
  std::int64_t gained_bytes = 0;     ///< by the volume (statvfs(3)); below 0 when it lost
  std::optional<Vanished> vanished;  ///< where the service's files are known
};

class SpaceMeter {
 public:
  SpaceMeter(std::string volume, std::optional<std::string> data)
      : volume_(std::move(volume)), data_(std::move(data)) {}

  /// Watches the volume for a moment in which nothing is asked of the service.
  void learnNoise();
  [[nodiscard]] SpaceReading read() const;
  [[nodiscard]] std::uint64_t freeBytes() const;
  /// Waits for late blocks, at most three seconds, until the volume has gained `expected_bytes`; for
  /// 0 it does not wait.
  [[nodiscard]] SpaceChange since(const SpaceReading& before, std::uint64_t expected_bytes) const;

  /// A difference below this says nothing: 256 KiB, a sixteenth of the amount, and four times what
  /// the volume moved by itself.
  [[nodiscard]] std::uint64_t slackFor(std::uint64_t amount_bytes) const;
  /// What the service really gave up: by its files where they are known, else by the volume.
  [[nodiscard]] static std::uint64_t freedBy(const SpaceChange& change);

  [[nodiscard]] const std::string& volume() const { return volume_; }
  [[nodiscard]] bool knowsFiles() const { return data_.has_value(); }

 private:
  const std::string volume_;
  const std::optional<std::string> data_;
  std::uint64_t noise_bytes_ = 0;
};

}  // namespace spacekeep::ctl
