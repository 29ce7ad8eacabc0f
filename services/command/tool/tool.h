// Thread safety: pure functions; each run belongs to the thread that waits for it.
//
// Runs another program: no shell, an environment made here, a time limit, bounded output, and its
// whole process group ended when it is not wanted any more.
#pragma once

#include <cstdint>
#include <functional>
#include <string>
#include <string_view>
#include <vector>

#include "services/cachedir/engine/cancel_token.h"
#include "services/cachedir/engine/unique_fd.h"
#include "services/command/base/user_folders.h"

namespace spacekeep::command {

/// The program and its arguments.
using Words = std::vector<std::string>;

inline constexpr std::size_t kMaxOutputBytes = 1024 * 1024;
inline constexpr std::size_t kMaxComplaintBytes = 4096;
/// Between SIGTERM and SIGKILL.
inline constexpr std::uint64_t kGraceNs = 1'000'000'000;

enum class ToolEnd {
  kExited,      // by itself; `status` tells how
  kAbsent,      // there is no such program on this machine
  kNotStarted,  // it could not be started
  kTimedOut,
  kCancelled,
};

struct ToolRun {
  ToolEnd end = ToolEnd::kNotStarted;
  int status = 0;         // exit status, or 128 + the signal
  std::string output;     // standard output, its first kMaxOutputBytes
  bool cut = false;       // there was more
  std::string complaint;  // the end of standard error; why, when it could not be started

  [[nodiscard]] bool good() const { return end == ToolEnd::kExited && status == 0; }
};

/// Where `name` is: itself when it holds a slash, else in the system's program directories (not in
/// PATH, which is the caller's). Empty when there is no such program.
[[nodiscard]] std::string whereIs(const std::string& name);

/// PATH, HOME, USER, LOGNAME, LC_ALL=C.UTF-8 and the XDG directories; nothing is inherited.
[[nodiscard]] std::vector<std::string> environmentFor(const UserFolders* folders);

[[nodiscard]] ToolRun runTool(const Words& words, const std::vector<std::string>& environment,
                              std::uint64_t limit_ns, const cachedir::CancelToken& cancel);

/// Reads what is there, at most a MiB, so that a tool that writes faster than anybody reads can still
/// be stopped in between. At its end `fd` is closed: it would be ready for ever.
void readSome(cachedir::UniqueFd& fd, const std::function<void(std::string_view)>& keep);

/// "journalctl --vacuum-time=30d", with quotation marks where a word needs them.
[[nodiscard]] std::string textOf(const Words& words);
/// What to tell a person of a run that was not good, in one line.
[[nodiscard]] std::string problemOf(const Words& words, const ToolRun& run);

}  // namespace spacekeep::command
