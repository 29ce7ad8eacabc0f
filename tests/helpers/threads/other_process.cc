#include "tests/helpers/threads/other_process.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <signal.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <utility>

namespace spacekeep::test {

OtherProcess::OtherProcess(const std::function<void(int ready)>& work) {
  std::array<int, 2> ready{};
  EXPECT_EQ(::pipe2(ready.data(), O_CLOEXEC), 0);
  pid_ = ::fork();
  if (pid_ == 0) {
    ::close(ready[0]);
    // What it throws must not reach the test runner, which would go on in both processes.
    [&]() noexcept { work(ready[1]); }();
    while (true) ::pause();
  }
  ::close(ready[1]);
  char byte = 0;
  EXPECT_EQ(::read(ready[0], &byte, 1), 1) << "the other process did not get ready";
  ::close(ready[0]);
}

void OtherProcess::end() {
  if (pid_ <= 0) return;
  ::kill(pid_, SIGKILL);
  ::waitpid(std::exchange(pid_, -1), nullptr, 0);
}

void tellReady(int ready) {
  if (::write(ready, "x", 1) != 1) ::_exit(1);
}

bool holdsInAnotherProcess(const std::function<bool()>& body) {
  const pid_t child = ::fork();
  if (child == 0) {
    const auto holds = [&]() noexcept { return body(); };
    ::_exit(holds() ? 0 : 1);
  }
  int status = -1;
  EXPECT_EQ(::waitpid(child, &status, 0), child);
  return WIFEXITED(status) && WEXITSTATUS(status) == 0;
}

}  // namespace spacekeep::test
