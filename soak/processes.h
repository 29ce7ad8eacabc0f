// Thread safety: each object belongs to one thread.
//
// The programs that the soak starts.
#pragma once

#include <sys/types.h>

#include <optional>
#include <string>
#include <vector>

namespace soak {

/// A program of its own. Killed and reaped when it goes out of scope.
class Process {
 public:
  Process() = default;
  /// Output goes to `log`; another user than root has no rights of root's.
  Process(const std::vector<std::string>& command, const std::string& log, uid_t uid = 0);
  Process(Process&& other) noexcept;
  Process& operator=(Process&& other) noexcept;
  ~Process();

  [[nodiscard]] pid_t pid() const { return pid_; }
  /// The exit status once it has ended (128 + the signal that ended it).
  std::optional<int> ended();
  /// Waits for the end, for so long. A program that has not ended by then is killed; none is answered.
  std::optional<int> wait(double patience_seconds);

 private:
  pid_t pid_ = -1;
  std::optional<int> status_;
};

[[nodiscard]] std::string readFile(const std::string& path);
[[nodiscard]] double monotonicSeconds();
void sleepSeconds(double seconds);

}  // namespace soak
