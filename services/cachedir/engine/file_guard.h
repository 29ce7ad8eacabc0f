// Thread safety: one thread at a time.
//
// The last check before a file goes, made on the opened file itself, and held while it is unlinked.
// Each part sees what the others do not:
//   - flock(2), exclusive and not waiting: fails while anybody has a flock lock on the file. Held,
//   it
//     keeps those out who would take one now.
//   - F_OFD_GETLK (fcntl_locking(2)): shows record locks, of a process or of a descriptor, which
//     flock does not see.
//   - F_SETLEASE with F_WRLCK (fcntl(2)): the kernel grants it only when nobody else has the file
//     open, in whichever process, visible to us or not, and mappings and running programs count as
//     open. It needs the file's owner or CAP_LEASE, and a file system that knows leases. Held, it
//     tells whether somebody came to open the file in between.
#pragma once

#include "services/cachedir/engine/unique_fd.h"

namespace spacekeep::cachedir {

class FileGuard {
 public:
  enum class Verdict {
    kAlone,     // nobody has it: the lease is ours
    kUnproven,  // no lock, and leases are not to be had here; /proc must tell, and show all
    kLocked,
    kOpen,
  };

  /// Takes the locks on `fd`, which was opened for reading only and stays the caller's.
  explicit FileGuard(int fd);

  [[nodiscard]] Verdict verdict() const { return verdict_; }
  /// Whether nobody has asked for the file since; true where there is no lease to tell.
  [[nodiscard]] bool stillAlone() const;

 private:
  const int fd_;
  Verdict verdict_;
};

}  // namespace spacekeep::cachedir
