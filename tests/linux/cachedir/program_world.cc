#include "tests/linux/cachedir/program_world.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <signal.h>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <cstdlib>
#include <fstream>
#include <iterator>

#include "tests/linux/cachedir/cache_world.h"

namespace spacekeep::cachedir {
namespace {

constexpr int kFirstHandedOver = 3;  // SD_LISTEN_FDS_START

std::string contentOf(const std::string& path) {
  std::ifstream stream(path);
  return {std::istreambuf_iterator<char>(stream), {}};
}

std::vector<char*> pointersTo(const std::string& program,
                              const std::vector<std::string>& arguments) {
  std::vector<char*> words{const_cast<char*>(program.c_str())};
  for (const std::string& word : arguments) words.push_back(const_cast<char*>(word.c_str()));
  words.push_back(nullptr);
  return words;
}

void sendTo(const std::string& path, int descriptor) {
  const int fd = ::open(path.c_str(), O_WRONLY | O_CREAT | O_TRUNC, 0644);
  if (fd >= 0) ::dup2(fd, descriptor);
}

void handOver(int listening) {
  if (listening < 0) return;
  // dup2 also lets the copy live through exec; the same number must be told so by hand.
  if (listening == kFirstHandedOver) ::fcntl(listening, F_SETFD, 0);
  ::dup2(listening, kFirstHandedOver);
  ::setenv("LISTEN_PID", std::to_string(::getpid()).c_str(), 1);
  ::setenv("LISTEN_FDS", "1", 1);
}

}  // namespace

Program::Program(const std::vector<std::string>& arguments, int listening,
                 const std::string& program) {
  const std::string folder = temporaryDirectory();
  out_ = folder + "/out";
  err_ = folder + "/err";
  std::vector<char*> words = pointersTo(program, arguments);
  pid_ = ::fork();
  if (pid_ != 0) return;
  ::prctl(PR_SET_PDEATHSIG, SIGKILL);
  ::signal(SIGPIPE, SIG_DFL);  // whatever whoever started the tests has made of it
  sendTo(out_, STDOUT_FILENO);
  sendTo(err_, STDERR_FILENO);
  handOver(listening);
  ::execv(program.c_str(), words.data());
  ::_exit(127);
}

Program::~Program() {
  if (pid_ <= 0) return;
  ::kill(pid_, SIGKILL);
  ::waitpid(pid_, nullptr, 0);
}

void Program::signal(int number) const { ASSERT_EQ(::kill(pid_, number), 0); }

std::string Program::errSoFar() const { return contentOf(err_); }

Ended Program::wait() {
  int status = 0;
  EXPECT_EQ(::waitpid(pid_, &status, 0), pid_);
  pid_ = -1;
  return {WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status), contentOf(out_),
          contentOf(err_)};
}

Ended runProgram(const std::vector<std::string>& arguments) { return Program(arguments).wait(); }

int statusWithoutAReader(const std::string& program, const std::vector<std::string>& arguments) {
  std::array<int, 2> ends{};
  EXPECT_EQ(::pipe2(ends.data(), O_CLOEXEC), 0);
  ::close(ends[0]);
  std::vector<char*> words = pointersTo(program, arguments);
  const pid_t pid = ::fork();
  if (pid == 0) {
    ::signal(SIGPIPE, SIG_DFL);
    ::dup2(ends[1], STDERR_FILENO);
    ::execv(program.c_str(), words.data());
    ::_exit(127);
  }
  ::close(ends[1]);
  int status = 0;
  EXPECT_EQ(::waitpid(pid, &status, 0), pid);
  return WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
}

std::string ruleFile(const std::string& content) {
  std::string path = temporaryDirectory() + "/rules.plist";
  std::ofstream(path) << "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n<plist version=\"1.0\"><dict>"
                      << content << "</dict></plist>\n";
  return path;
}

std::string ruleFileFor(const std::string& directory) {
  return ruleFile(
      "<key>SPACEKEEP_ID</key><string>com.example.cache</string><key>DIRECTORIES</key><array><dict>"
      "<key>PATH</key><string>" +
      directory + "</string></dict></array>");
}

}  // namespace spacekeep::cachedir
