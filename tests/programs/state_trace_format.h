// Thread safety: plain data.
//
// What the recorder writes down of each change to storage, in the order in which they happened.
#pragma once

#include <cstdint>

namespace spacekeep::system_test {

enum class TraceKind : std::uint32_t {
  kOpened = 1,  ///< first text: path of a file that was there
  kCreated,     ///< first text: path of a file or directory that was not
  kWritten,     ///< second text: the bytes, at `offset`
  kResized,     ///< to `offset` bytes
  kSynced,      ///< first text: path of a file or directory whose changes are durable now
  kSyncedAll,   ///< the whole file system
  kRenamed,     ///< first text: from; second text: to
  kRemoved,     ///< first text: path
};

/// In front of each record; its two texts follow it.
struct TraceHeader {
  TraceKind kind;
  std::uint32_t first_length;
  std::uint64_t second_length;
  std::uint64_t inode;
  std::uint64_t offset;
};

}  // namespace spacekeep::system_test
