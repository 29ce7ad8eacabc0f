// Thread safety: one thread at a time.
//
// Which files are held by processes, as far as /proc shows it: open descriptors (/proc/PID/fd),
// mappings (/proc/PID/maps) and locks and leases (/proc/locks). One scan serves a whole request;
// only inodes on the file systems of the caches are remembered.
#pragma once

#include <cstdint>
#include <set>
#include <string>
#include <vector>

#include "services/cachedir/engine/cancel_token.h"
#include "services/cachedir/engine/file_facts.h"
#include "services/cachedir/engine/roots.h"

namespace spacekeep::cachedir {

/// Held inodes that are remembered, 16 bytes each. With more the scan counts as failed.
inline constexpr std::size_t kMaxHeldFiles = 1 << 20;

/// Whether the process with that directory in /proc runs as the same user; for root, whether it is
/// there.
[[nodiscard]] bool isOurs(const std::string& process);

class OpenFiles {
 public:
  explicit OpenFiles(std::string proc = "/proc") : proc_(std::move(proc)) {}

  /// Scans unless the last scan saw the same file systems and is at most `max_age_ns` old.
  [[nodiscard]] bool ensure(const std::vector<Root>& roots, std::uint64_t max_age_ns,
                            const CancelToken& cancel);
  /// Scans. False when it was cancelled or the answer is not to be relied on: then nothing may go.
  [[nodiscard]] bool scan(const std::vector<Root>& roots, const CancelToken& cancel);
  /// Nanoseconds since the last good scan; the largest number without one.
  [[nodiscard]] std::uint64_t ageNs() const;
  /// Whether somebody held `inode` (of the file system `file_system`) at the scan.
  [[nodiscard]] bool holds(const Inode& inode, std::uint64_t file_system) const;
  /// The inode numbers on the file system of `root` that somebody held at the scan.
  [[nodiscard]] std::set<std::uint64_t> heldOn(const Root& root) const;
  /// Processes that could not be looked into at the scan. Who owns a process may, if it has no
  /// privileges that the one who looks has not; for others it takes CAP_SYS_PTRACE. Never 0 where
  /// /proc leaves processes out: those that it hides (hidepid), and in a container all outside.
  [[nodiscard]] std::uint64_t hiddenProcesses() const { return hidden_; }
  /// Those of them that are there for all to see and run as the same user; for root anybody's.
  [[nodiscard]] std::uint64_t hiddenOwnProcesses() const { return hidden_own_; }

 private:
  void scanProcess(const std::string& process);
  // Of a process, or of a thread: whether all there was to see was seen, or it has gone.
  [[nodiscard]] bool sawAllOf(const std::string& process);
  [[nodiscard]] bool sawThreads(const std::string& process);
  [[nodiscard]] bool sawDescriptors(const std::string& process);
  [[nodiscard]] bool sawMappings(const std::string& process);
  void scanLocks();
  [[nodiscard]] bool isOnOurs(std::uint64_t device) const;
  void remember(const Inode& inode);

  const std::string proc_;
  std::vector<std::uint64_t> devices_;  // sorted
  std::vector<Inode> held_;             // sorted after a scan
  std::uint64_t hidden_ = 0;
  std::uint64_t hidden_own_ = 0;
  std::uint64_t scanned_ticks_ = 0;
  bool good_ = false;
};

}  // namespace spacekeep::cachedir
