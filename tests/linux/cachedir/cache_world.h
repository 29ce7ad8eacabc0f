// Thread safety: one test at a time.
//
// Real file systems and files for the tests of the cache directory service. Everything is mounted
// in a mount namespace of the test program's own, so nothing outlives it or is seen elsewhere.
#pragma once

#include <sys/types.h>

#include <cstdint>
#include <functional>
#include <string>
#include <vector>

#include "services/cachedir/engine/cache_cleaner.h"
#include "tests/helpers/threads/other_process.h"

namespace spacekeep::cachedir {

inline constexpr std::uint64_t kMiB = 1024 * 1024;

/// A fresh, empty file system of that kind ("ext4", "xfs", "btrfs" or "tmpfs"), mounted.
class Volume {
 public:
  explicit Volume(const std::string& kind, std::uint64_t size_mib = 400);
  ~Volume();
  Volume(const Volume&) = delete;
  Volume& operator=(const Volume&) = delete;

  [[nodiscard]] const std::string& path() const { return path_; }
  [[nodiscard]] std::string operator/(const std::string& name) const { return path_ + "/" + name; }
  /// Free bytes for an unprivileged writer.
  [[nodiscard]] std::uint64_t freeBytes() const;
  /// Everything written is allocated, and counted by the file system.
  void settle() const;

 private:
  std::string base_;
  std::string path_;
};

/// Runs a program and fails the test when it fails.
void run(const std::string& command);
/// A temporary directory under /tmp, never removed before the program ends.
std::string temporaryDirectory();

/// Writes a file of `bytes` that are not zero, with its directories, unused for `days`.
void writeFile(const std::string& path, std::uint64_t bytes, double days = 100);
/// Sets both times of a file that many days back.
void setAge(const std::string& path, double days);
bool exists(const std::string& path);
std::uint64_t allocated(const std::string& path);

/// Another process that has run `hold` and then stays, with all it has open, until this is
/// destroyed.
class Holder {
 public:
  explicit Holder(const std::function<bool()>& hold);

 private:
  test::OtherProcess process_;
};

inline constexpr uid_t kNobody = 65534;
/// Makes this process one of a user without any rights.
bool becomeNobody();
/// Runs `body` in another process once it has become what `become` makes of it; answers whether both
/// said true.
bool asAnother(const std::function<bool()>& become, const std::function<bool()>& body);
bool asNobody(const std::function<bool()>& body);

/// Rules for one directory, with the default ages.
Rules rulesFor(const std::string& directory);

/// The paths that went, in order, and the result.
struct Observed {
  FreeResult result;
  std::vector<std::string> paths;
};
Observed freeWith(CacheCleaner& cleaner, const FreeRequest& request);
/// One request on a fresh engine.
Observed freeIn(const std::string& directory, std::uint64_t amount, int urgency = 4);

}  // namespace spacekeep::cachedir
