// What becomes of log lines that nobody reads.
#include "support/logging/linux/standard_error.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <climits>
#include <csignal>
#include <string>

#include "support/logging/linux/log_level.h"

namespace spacekeep {
namespace {

constexpr std::size_t kRoom = 65536;  // of a pipe, as the kernel makes it

/// A pipe or a pair of sockets. The writing end waits when there is no room, as one that was
/// inherited does.
class Ends {
 public:
  static Ends ofPipe() {
    std::array<int, 2> ends{};
    EXPECT_EQ(::pipe2(ends.data(), O_CLOEXEC), 0);
    EXPECT_EQ(::fcntl(ends[1], F_SETPIPE_SZ, kRoom), static_cast<int>(kRoom));
    return Ends(ends);
  }
  static Ends ofSockets() {
    std::array<int, 2> ends{};
    EXPECT_EQ(::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends.data()), 0);
    return Ends(ends);
  }
  ~Ends() {
    closeReader();
    ::close(writer_);
  }
  Ends(const Ends&) = delete;
  Ends& operator=(const Ends&) = delete;

  [[nodiscard]] int writer() const { return writer_; }
  void closeReader() {
    if (reader_ >= 0) ::close(reader_);
    reader_ = -1;
  }
  /// All that is there now.
  [[nodiscard]] std::string read() const {
    EXPECT_EQ(::fcntl(reader_, F_SETFL, O_NONBLOCK), 0);
    std::string all;
    std::array<char, 4096> part{};
    for (ssize_t got = 0; (got = ::read(reader_, part.data(), part.size())) > 0;) {
      all.append(part.data(), static_cast<std::size_t>(got));
    }
    return all;
  }

 private:
  explicit Ends(const std::array<int, 2>& ends) : reader_(ends[0]), writer_(ends[1]) {}
  int reader_;
  const int writer_;
};

/// Whether a process of which nothing was changed before lives through it, with the end as its
/// standard error.
bool isLivedThrough(int standard_error, void (*body)()) {
  const pid_t child = ::fork();
  if (child == 0) {
    std::signal(SIGPIPE, SIG_DFL);
    ::dup2(standard_error, STDERR_FILENO);
    body();
    ::_exit(0);
  }
  int status = -1;
  EXPECT_EQ(::waitpid(child, &status, 0), child);
  return WIFEXITED(status) && WEXITSTATUS(status) == 0;
}

/// The daemon's own set-up, which has something to complain about: this is no level file.
void setUpAndComplain() {
  static LogHandle handle;
  setUpLogging(handle, "/");
}

TEST(StandardErrorOutput, ALineThatNobodyReadsAnyMoreDoesNotEndTheProcess) {
  for (const auto make : {&Ends::ofPipe, &Ends::ofSockets}) {
    Ends ends = make();
    ends.closeReader();
    EXPECT_TRUE(isLivedThrough(ends.writer(), &setUpAndComplain));
  }
}

TEST(StandardErrorOutput, WhatSomebodyElseWritesThereDoesNotEndTheProcessEither) {
  Ends ends = Ends::ofPipe();
  ends.closeReader();
  EXPECT_TRUE(isLivedThrough(ends.writer(), [] {
    setUpAndComplain();
    if (::write(STDERR_FILENO, "x", 1) != -1 || errno != EPIPE) ::_exit(1);
  }));
}

TEST(StandardErrorOutput, TheSetUpWritesItsComplaintToAPipe) {
  Ends ends = Ends::ofPipe();
  EXPECT_TRUE(isLivedThrough(ends.writer(), &setUpAndComplain));
  EXPECT_EQ(ends.read(),
            "Spacekeep[3] setUpLogging / is not used, the log level is 4: it is not a regular "
            "file\n");
}

TEST(LineOutput, AFullPipeIsNotWaitedForAndWhatWasDroppedIsCounted) {
  Ends ends = Ends::ofPipe();
  LineOutput output(ends.writer());
  const std::string line = std::string(PIPE_BUF - 1, 'x') + "\n";
  std::string expected;
  for (std::size_t used = 0; used < kRoom; used += line.size()) expected += line;
  for (std::size_t i = 0; i < kRoom / line.size() + 3; ++i) output.write(line);
  EXPECT_EQ(ends.read(), expected);
  output.write("one\n");
  output.write("two\n");
  EXPECT_EQ(ends.read(), "3 log lines were dropped here\none\ntwo\n");
}

TEST(LineOutput, AFullSocketIsNotWaitedFor) {
  Ends ends = Ends::ofSockets();
  LineOutput output(ends.writer());
  for (int i = 0; i < 100'000; ++i) output.write("line\n");
  const std::string got = ends.read();
  EXPECT_TRUE(got.starts_with("line\nline\n"));
  output.write("after\n");
  const std::string rest = ends.read();
  EXPECT_TRUE(rest.ends_with(" log lines were dropped here\nafter\n")) << rest;
}

TEST(LineOutput, ALineThatCouldOnlyBeBegunIsEndedBeforeTheNext) {
  Ends ends = Ends::ofPipe();
  LineOutput output(ends.writer());
  output.write(std::string(2 * kRoom, 'x') + "\n");
  EXPECT_EQ(ends.read(), std::string(kRoom, 'x'));
  output.write("next\n");
  EXPECT_EQ(ends.read(), "\n1 log lines were dropped here\nnext\n");
}

TEST(LineOutput, ALongLineArrivesWhole) {
  Ends ends = Ends::ofPipe();
  LineOutput output(ends.writer());
  const std::string line = std::string(20'000, 'x') + "\n";
  output.write(line);
  EXPECT_EQ(ends.read(), line);
}

TEST(LineOutput, TheFlagsThatOthersShareStayAsTheyAre) {
  for (const auto make : {&Ends::ofPipe, &Ends::ofSockets}) {
    Ends ends = make();
    const int before = ::fcntl(ends.writer(), F_GETFL);
    LineOutput(ends.writer()).write("line\n");
    EXPECT_EQ(::fcntl(ends.writer(), F_GETFL), before);
  }
}

}  // namespace
}  // namespace spacekeep
