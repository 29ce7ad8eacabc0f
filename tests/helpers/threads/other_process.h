// Thread safety: each object belongs to the thread of its test.
//
// Processes beside the test's own, for what only another one can do: hold a file, serve a socket and be
// killed, be another user. They are forks, so they have what the test had at that moment.
#pragma once

#include <sys/types.h>

#include <functional>

namespace spacekeep::test {

/// A process that does `work`, which writes a byte to `ready`, and then nothing until it is ended.
/// Returns to the test once that byte is there.
class OtherProcess {
 public:
  explicit OtherProcess(const std::function<void(int ready)>& work);
  ~OtherProcess() { end(); }
  OtherProcess(const OtherProcess&) = delete;
  OtherProcess& operator=(const OtherProcess&) = delete;

  [[nodiscard]] pid_t pid() const { return pid_; }
  /// Kills it and waits until it has gone.
  void end();

 private:
  pid_t pid_ = -1;
};

/// What `work` writes when all is well; in that process only.
void tellReady(int ready);

/// Whether `body` holds in a process of its own, which may change what it is and comes to its end.
[[nodiscard]] bool holdsInAnotherProcess(const std::function<bool()>& body);

}  // namespace spacekeep::test
