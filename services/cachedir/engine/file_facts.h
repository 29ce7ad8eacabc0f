// Thread safety: plain values.
//
// What the engine knows of one file.
#pragma once

#include <compare>
#include <cstddef>
#include <cstdint>
#include <limits>
#include <memory>
#include <string>
#include <string_view>

#include <sys/stat.h>

namespace spacekeep::cachedir {

inline constexpr std::int64_t kNsPerSecond = 1'000'000'000;

/// Identity of a file as stat(2) gives it.
struct Inode {
  std::uint64_t device = 0;
  std::uint64_t number = 0;
  auto operator<=>(const Inode&) const = default;
};

/// A directory below a root; many files share one.
struct Folder {
  std::size_t root = 0;  // index into the roots
  std::string path;      // relative to the root, "" for the root itself
};

/// `path` of `name` in `folder`, relative to the root.
[[nodiscard]] inline std::string joined(const std::string& folder, std::string_view name) {
  return folder.empty() ? std::string(name) : folder + "/" + std::string(name);
}

/// What there is to know of a regular file, whatever it is called.
struct FileState {
  std::uint64_t inode = 0;
  std::int64_t used_ns = 0;  // wall clock, the later of access and modification
  std::uint64_t bytes = 0;   // allocated
  std::uint64_t links = 1;   // hard links the file has anywhere
};

/// A regular file as a walk found it. `name` is good during the visit only.
struct FoundFile {
  const std::shared_ptr<const Folder>& folder;
  std::string_view name;
  Inode inode;
  std::int64_t used_ns = 0;  // wall clock, the later of access and modification
  std::uint64_t bytes = 0;   // allocated
  std::uint64_t links = 1;   // hard links the file has anywhere
};

[[nodiscard]] inline Inode inodeOf(const struct stat& facts) {
  return {static_cast<std::uint64_t>(facts.st_dev), static_cast<std::uint64_t>(facts.st_ino)};
}

/// Nanoseconds reach from 1677 to 2262; what lies beyond counts as the end on its side. The
/// smallest number of all is no time of a file: it stands for what comes before every file.
[[nodiscard]] inline std::int64_t nsOf(std::int64_t seconds, std::int64_t nanoseconds) {
  constexpr std::int64_t kLatest = std::numeric_limits<std::int64_t>::max();
  if (seconds >= kLatest / kNsPerSecond) return kLatest;
  if (seconds <= -kLatest / kNsPerSecond) return -kLatest;
  return seconds * kNsPerSecond + nanoseconds;
}

[[nodiscard]] inline std::int64_t nsOf(const timespec& time) {
  return nsOf(time.tv_sec, time.tv_nsec);
}

/// A file system that keeps no access times still tells when the content was written.
[[nodiscard]] inline std::int64_t usedNs(const struct stat& facts) {
  const std::int64_t accessed = nsOf(facts.st_atim);
  const std::int64_t modified = nsOf(facts.st_mtim);
  return accessed > modified ? accessed : modified;
}

/// st_blocks counts units of 512 bytes whatever the block size is (stat(2)).
[[nodiscard]] inline std::uint64_t allocatedBytes(const struct stat& facts) {
  return static_cast<std::uint64_t>(facts.st_blocks) * 512;
}

}  // namespace spacekeep::cachedir
