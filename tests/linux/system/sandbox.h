// Thread safety: one test at a time.
//
// A private root for whole programs: the real daemon, services and tools run in it as on a device,
// with their own /run, /var/lib, /etc/spacekeep and descriptor directories, and with real file
// systems under /volumes. Needs root.
#pragma once

#include <sys/types.h>

#include <string>
#include <vector>

namespace spacekeep::system_test {

/// A program running in the sandbox. Killed and reaped when it goes out of scope.
class Process {
 public:
  Process() = default;
  explicit Process(pid_t pid) : pid_(pid) {}
  Process(Process&& other) noexcept;
  Process& operator=(Process&& other) noexcept;
  ~Process();

  [[nodiscard]] pid_t pid() const { return pid_; }
  void signal(int number) const;
  /// Waits for the end; the exit status, or 128 + the signal that ended it.
  int wait();
  [[nodiscard]] bool running();

 private:
  pid_t pid_ = -1;
};

struct Output {
  int status = -1;
  std::string text;  ///< standard output and standard error together
};

class Sandbox {
 public:
  Sandbox();
  ~Sandbox();
  Sandbox(const Sandbox&) = delete;
  Sandbox& operator=(const Sandbox&) = delete;

  /// Makes and mounts a file system before start(): "ext4", "xfs", "btrfs" or "tmpfs". Inside it is
  /// /volumes/<name>.
  void addVolume(const std::string& name, const std::string& type, unsigned size_mib);
  /// Builds the root. Volumes are seen inside from here on.
  void start();

  /// A path of the sandbox as this process reaches it.
  [[nodiscard]] std::string outside(const std::string& inside) const;
  /// The same for a volume, reachable before start() too.
  [[nodiscard]] std::string volume(const std::string& name) const;
  void write(const std::string& inside, const std::string& content) const;
  [[nodiscard]] std::string read(const std::string& inside) const;

  /// Starts a program; its output goes to /tmp/<log> inside. `uid` and `gid` other than 0 drop rights.
  [[nodiscard]] Process spawn(const std::vector<std::string>& command, const std::string& log,
                              uid_t uid = 0, gid_t gid = 0) const;
  [[nodiscard]] Output run(const std::vector<std::string>& command) const;

  /// The daemon with log level 5, once it accepts connections.
  [[nodiscard]] Process startDaemon() const;
  [[nodiscard]] std::string daemonLog() const { return read("/tmp/daemon.log"); }
  /// Waits until the file holds `text`. False after a minute.
  [[nodiscard]] bool waitForText(const std::string& inside, const std::string& text) const;

  [[nodiscard]] std::string socketPath() const { return outside("/run/spacekeep/spacekeep.sock"); }

 private:
  std::string directory_;
  Process holder_;
};

}  // namespace spacekeep::system_test
