// Thread safety: none; one test at a time.
//
// What the tests of the outside events have in common: a directory, a service manager's socket, and
// waiting for a condition.
#pragma once

#include <functional>
#include <string>
#include <vector>

namespace spacekeep::test {

/// Looks again every few milliseconds, for at most 20 s.
[[nodiscard]] bool comesTrue(const std::function<bool()>& condition);

/// A directory of the test's own.
class ScratchDirectory {
 public:
  ScratchDirectory();
  ~ScratchDirectory();
  ScratchDirectory(const ScratchDirectory&) = delete;
  ScratchDirectory& operator=(const ScratchDirectory&) = delete;

  [[nodiscard]] const std::string& path() const { return path_; }
  /// Makes directories on the way.
  std::string write(const std::string& name, const std::string& content) const;

 private:
  std::string path_;
};

/// Stands in for the service manager: what sd_notify(3) sends arrives here.
class NotifySocket {
 public:
  /// Points NOTIFY_SOCKET at a socket in `directory`.
  explicit NotifySocket(const ScratchDirectory& directory);
  ~NotifySocket();
  NotifySocket(const NotifySocket&) = delete;
  NotifySocket& operator=(const NotifySocket&) = delete;

  /// The next message, waited for at most `wait_ms`; empty when none came.
  [[nodiscard]] std::string next(int wait_ms = 20'000) const;

 private:
  int fd_;
};

}  // namespace spacekeep::test
