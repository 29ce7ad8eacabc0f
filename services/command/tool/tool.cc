#include "services/command/tool/tool.h"

#include <fcntl.h>
#include <poll.h>
#include <spawn.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <csignal>
#include <optional>

#include "services/cachedir/engine/beneath.h"
#include "services/cachedir/engine/elapsed.h"
#include "services/cachedir/engine/unique_fd.h"
#include "support/runtime/runtime.h"

namespace spacekeep::command {
namespace {

using cachedir::UniqueFd;

constexpr int kLookEveryMs = 20;  // at whether the run is still wanted
constexpr const char* kProgramFolders[] = {
    "/usr/local/sbin", "/usr/local/bin", "/usr/sbin", "/usr/bin", "/sbin", "/bin", "/snap/bin"};

bool isProgram(const std::string& path) {
  struct stat facts {};
  return ::stat(path.c_str(), &facts) == 0 && S_ISREG(facts.st_mode) &&
         ::access(path.c_str(), X_OK) == 0;
}

struct Pipe {
  UniqueFd reading;
  UniqueFd writing;
};

Pipe makePipe() {
  int ends[2];
  if (::pipe2(ends, O_CLOEXEC) != 0) return {};
  Pipe pipe{UniqueFd(ends[0]), UniqueFd(ends[1])};
  ::fcntl(pipe.reading.get(), F_SETFL, O_NONBLOCK);
  return pipe;
}

std::vector<char*> pointersTo(const std::vector<std::string>& texts) {
  std::vector<char*> pointers;
  for (const std::string& text : texts) pointers.push_back(const_cast<char*>(text.c_str()));
  pointers.push_back(nullptr);
  return pointers;
}

/// The settings of a new process, given back by their end.
class Settings {
 public:
  Settings(int output, int complaint) {
    ::posix_spawn_file_actions_init(&actions_);
    // tidy-allow: its standard input, which is to live through the start
    ::posix_spawn_file_actions_addopen(&actions_, STDIN_FILENO, "/dev/null", O_RDONLY, 0);
    ::posix_spawn_file_actions_adddup2(&actions_, output, STDOUT_FILENO);
    ::posix_spawn_file_actions_adddup2(&actions_, complaint, STDERR_FILENO);
    // Not even what this process was itself given by mistake.
    ::posix_spawn_file_actions_addclosefrom_np(&actions_, STDERR_FILENO + 1);
    // A tool that remembers where it was started must not keep a volume busy.
    ::posix_spawn_file_actions_addchdir_np(&actions_, "/");
    ::posix_spawnattr_init(&attributes_);
    sigset_t set;
    sigemptyset(&set);
    ::posix_spawnattr_setsigmask(&attributes_, &set);
    sigfillset(&set);
    ::posix_spawnattr_setsigdefault(&attributes_, &set);
    ::posix_spawnattr_setpgroup(&attributes_, 0);
    ::posix_spawnattr_setflags(
        &attributes_, POSIX_SPAWN_SETPGROUP | POSIX_SPAWN_SETSIGMASK | POSIX_SPAWN_SETSIGDEF);
  }
  ~Settings() {
    ::posix_spawn_file_actions_destroy(&actions_);
    ::posix_spawnattr_destroy(&attributes_);
  }
  Settings(const Settings&) = delete;
  Settings& operator=(const Settings&) = delete;

  [[nodiscard]] const posix_spawn_file_actions_t* actions() const { return &actions_; }
  [[nodiscard]] const posix_spawnattr_t* attributes() const { return &attributes_; }

 private:
  posix_spawn_file_actions_t actions_{};
  posix_spawnattr_t attributes_{};
};

/// One process with its group, from its start to its end.
class Running {
 public:
  Running(pid_t pid, UniqueFd output, UniqueFd complaint)
      : pid_(pid),
        process_(static_cast<int>(::syscall(SYS_pidfd_open, pid, 0))),
        output_(std::move(output)),
        complaint_(std::move(complaint)) {}

  void follow(std::uint64_t limit_ns, const cachedir::CancelToken& cancel, ToolRun& run) {
    const std::uint64_t begin = rt::ticks();
    run.end = ToolEnd::kExited;
    while (!hasEnded()) {
      if (run.end == ToolEnd::kExited) {
        if (cancel.cancelled())
          stop(ToolEnd::kCancelled, run);
        else if (cachedir::elapsedNs(begin) >= limit_ns)
          stop(ToolEnd::kTimedOut, run);
      } else if (cachedir::elapsedNs(stopped_ticks_) >= kGraceNs) {
        ::kill(-pid_, SIGKILL);
      }
      wait();
      drain(run);
    }
    // What it left behind in its group; the number cannot be anybody else's before the wait.
    ::kill(-pid_, SIGKILL);
    drain(run);
    int status = 0;
    while (::waitpid(pid_, &status, 0) < 0 && errno == EINTR) {
    }
    run.status = WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
  }

 private:
  [[nodiscard]] bool hasEnded() const {
    siginfo_t info{};
    return ::waitid(P_PID, static_cast<id_t>(pid_), &info, WEXITED | WNOHANG | WNOWAIT) != 0 ||
           info.si_pid == pid_;
  }

  void stop(ToolEnd why, ToolRun& run) {
    run.end = why;
    stopped_ticks_ = rt::ticks();
    ::kill(-pid_, SIGTERM);
  }

  void wait() {
    std::array<pollfd, 3> watched{
        {{process_.get(), POLLIN, 0}, {output_.get(), POLLIN, 0}, {complaint_.get(), POLLIN, 0}}};
    ::poll(watched.data(), watched.size(), kLookEveryMs);
  }

  void drain(ToolRun& run) {
    readSome(output_, [&run](std::string_view part) {
      const std::size_t room = kMaxOutputBytes - run.output.size();
      run.cut = run.cut || part.size() > room;
      run.output += part.substr(0, room);
    });
    readSome(complaint_, [&run](std::string_view part) {
      run.complaint += part;
      if (run.complaint.size() <= kMaxComplaintBytes) return;
      run.complaint.erase(0, run.complaint.size() - kMaxComplaintBytes);
    });
  }

  const pid_t pid_;
  const UniqueFd process_;
  UniqueFd output_;
  UniqueFd complaint_;
  std::uint64_t stopped_ticks_ = 0;
};

}  // namespace

void readSome(UniqueFd& fd, const std::function<void(std::string_view)>& keep) {
  std::array<char, 16384> part;
  // As much as a pipe holds at most, so that nothing stays when the other end has gone.
  for (std::size_t reads = 0; fd && reads < kMaxOutputBytes / part.size(); ++reads) {
    const ssize_t got = ::read(fd.get(), part.data(), part.size());
    if (got < 0) return;
    if (got == 0) {
      fd.reset();
    } else {
      keep({part.data(), static_cast<std::size_t>(got)});
    }
  }
}

std::string whereIs(const std::string& name) {
  if (name.find('/') != std::string::npos) return isProgram(name) ? name : "";
  for (const char* folder : kProgramFolders) {
    std::string path = std::string(folder) + "/" + name;
    if (isProgram(path)) return path;
  }
  return "";
}

std::vector<std::string> environmentFor(const UserFolders* folders) {
  std::string path;
  for (const char* folder : kProgramFolders)
    path += (path.empty() ? "" : ":") + std::string(folder);
  std::vector<std::string> environment{"PATH=" + path, "LC_ALL=C.UTF-8"};
  if (folders == nullptr) {
    environment.insert(environment.end(), {"HOME=/root", "USER=root", "LOGNAME=root"});
    return environment;
  }
  for (const auto& [name, value] :
       {std::pair{"HOME", folders->home}, std::pair{"USER", folders->name},
        std::pair{"LOGNAME", folders->name}, std::pair{"XDG_CACHE_HOME", folders->cache},
        std::pair{"XDG_DATA_HOME", folders->data}, std::pair{"XDG_CONFIG_HOME", folders->config},
        std::pair{"XDG_STATE_HOME", folders->state},
        std::pair{"XDG_RUNTIME_DIR", folders->runtime}}) {
    if (!value.empty()) environment.push_back(std::string(name) + "=" + value);
  }
  return environment;
}

ToolRun runTool(const Words& words, const std::vector<std::string>& environment,
                std::uint64_t limit_ns, const cachedir::CancelToken& cancel) {
  ToolRun run;
  const std::string program = words.empty() ? "" : whereIs(words.front());
  if (program.empty()) {
    run.end = ToolEnd::kAbsent;
    return run;
  }
  Pipe output = makePipe();
  Pipe complaint = makePipe();
  if (!output.writing || !complaint.writing) {
    run.complaint = "this process has no file descriptor left";
    return run;
  }
  const Settings settings(output.writing.get(), complaint.writing.get());
  pid_t pid = -1;
  const int error = ::posix_spawn(&pid, program.c_str(), settings.actions(), settings.attributes(),
                                  pointersTo(words).data(), pointersTo(environment).data());
  if (error != 0) {
    run.complaint = cachedir::errnoText(error);
    return run;
  }
  output.writing.reset();
  complaint.writing.reset();
  Running(pid, std::move(output.reading), std::move(complaint.reading))
      .follow(limit_ns, cancel, run);
  return run;
}

}  // namespace spacekeep::command
