// Thread safety: one test at a time.
//
// The tool as a process, in front of a stand-in for the daemon.
#pragma once

#include <gtest/gtest.h>
#include <sys/wait.h>

#include <cstdio>
#include <fstream>
#include <sstream>
#include <string>

#include "tests/linux/sdk/fake_daemon.h"

namespace spacekeep::ctl {

struct Finished {
  int exit_code = -1;
  std::string out;
  std::string err;
};

inline std::string contentOf(const std::string& path) {
  std::ostringstream text;
  text << std::ifstream(path).rdbuf();
  return text.str();
}

/// A shell's command line. COLUMNS and NO_COLOR of whoever runs the tests are taken away.
inline Finished runShell(const std::string& command_line, const std::string& err_file) {
  const std::string command =
      "env -u COLUMNS -u NO_COLOR bash -c '" + command_line + "' 2>" + err_file;
  Finished run;
  std::FILE* pipe = popen(command.c_str(), "r");
  if (pipe == nullptr) return run;
  char buffer[4096];
  while (const auto size = std::fread(buffer, 1, sizeof buffer, pipe)) run.out.append(buffer, size);
  const int status = pclose(pipe);
  run.exit_code = WIFEXITED(status) ? WEXITSTATUS(status) : -1;
  run.err = contentOf(err_file);
  return run;
}

inline constexpr const char* kItemized = "clientItemizedPurgeableSpace";
inline constexpr const char* kPlain = "clientPurgeableSpace";

inline std::string toolPath() { return std::string(SPACEKEEP_BUILD_DIR) + "/ctl/spacekeepctl"; }

class ToolTest : public testing::Test {
 protected:
  ~ToolTest() override {
    std::remove(errFile().c_str());
    std::remove(terminalFile().c_str());
  }

  /// Runs the tool with `arguments`, as a shell splits them; single quotes must not be in there.
  Finished ctl(const std::string& arguments) {
    return runShell(toolPath() + " " + arguments, errFile());
  }
  Finished ctlWithSocket(const std::string& arguments) {
    return ctl("--socket " + directory_.daemonSocket() + " " + arguments);
  }
  /// The same on a terminal of so many columns (script(1)), standard error included. Line ends are
  /// those of a terminal.
  Finished ctlOnTerminal(int columns, const std::string& arguments) {
    const std::string inner = "stty cols " + std::to_string(columns) + "; " + toolPath() +
                              " --socket " + directory_.daemonSocket() + " " + arguments;
    return runShell("LANG=C.UTF-8 LC_ALL= TERM=xterm script -fqec \"" + inner + "\" " +
                        terminalFile() + " </dev/null",
                    errFile());
  }
  /// The daemon's settings are as after its first start.
  void answerWithEmptyState() {
    daemon_.on("clientGetState", [](const ipc::Arguments&, const ipc::Responder& responder) {
      responder.reply({ipc::OptionalValue(Value(Dictionary{}))});
    });
  }
  /// What stood on the terminal so far.
  [[nodiscard]] std::string onTerminalSoFar() const { return contentOf(terminalFile()); }
  [[nodiscard]] std::string terminalFile() const { return directory_.path() + "/terminal"; }
  [[nodiscard]] std::string errFile() const { return directory_.path() + "/err"; }

  sdk::SocketDirectory directory_;
  rt::Guarded<Dictionary> seen_;
  sdk::FakeDaemon daemon_{directory_.daemonSocket()};
};

}  // namespace spacekeep::ctl
