// Thread safety: for one thread.
//
// The service's own process, started for the check: it finds a daemon's socket and a listening
// socket of its own, so that services of both kinds run as they are.
#pragma once

#include <sys/types.h>

#include <memory>
#include <optional>
#include <string>
#include <variant>
#include <vector>

namespace spacekeep::ctl {

struct LaunchPlan {
  std::vector<std::string> command;  ///< "{socket}" in a word stands for the daemon's socket
  std::string daemon_socket;         ///< also in SPACEKEEP_SOCKET
  int listening_fd = -1;             ///< handed over as a service manager does, sd_listen_fds(3)
  std::string output_path;           ///< what the service writes is added to this file
};

class LaunchedService {
 public:
  /// The process, or why it could not be started.
  [[nodiscard]] static std::variant<std::unique_ptr<LaunchedService>, std::string> start(
      const LaunchPlan& plan);
  /// Ends the process and what it started: SIGTERM, and SIGKILL when it takes too long.
  ~LaunchedService();
  LaunchedService(const LaunchedService&) = delete;
  LaunchedService& operator=(const LaunchedService&) = delete;

  [[nodiscard]] pid_t pid() const { return pid_; }
  /// How it ended (wait(2)), none while it runs.
  [[nodiscard]] std::optional<int> ended();

 private:
  explicit LaunchedService(pid_t pid) : pid_(pid) {}

  const pid_t pid_;
  std::optional<int> status_;
};

/// "ended with status 1", "was ended by signal 11 (Segmentation fault)".
[[nodiscard]] std::string textOfEnd(int wait_status);

}  // namespace spacekeep::ctl
