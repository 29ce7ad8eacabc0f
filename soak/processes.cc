#include "soak/processes.h"

#include <fcntl.h>
#include <grp.h>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <csignal>
#include <ctime>
#include <fstream>
#include <sstream>
#include <utility>

namespace soak {
namespace {

int statusOf(int raw) { return WIFEXITED(raw) ? WEXITSTATUS(raw) : 128 + WTERMSIG(raw); }

[[noreturn]] void become(char** arguments, const std::string& log, uid_t uid) {
  // As the service manager starts programs: each in a session of its own, so that the kernel shares the
  // processors between programs, and not between threads (sched(7), "The autogroup feature").
  ::setsid();
  const int out = ::open(log.c_str(), O_WRONLY | O_CREAT | O_APPEND, 0644);
  const int in = ::open("/dev/null", O_RDONLY);
  ::dup2(in, 0);
  ::dup2(out, 1);
  ::dup2(out, 2);
  if (uid != 0 && (::setgroups(0, nullptr) != 0 || ::setgid(uid) != 0 || ::setuid(uid) != 0)) {
    ::_exit(126);
  }
  // Nothing of a soak that was ended goes on. Here, since another user takes it back.
  ::prctl(PR_SET_PDEATHSIG, SIGKILL);
  ::execv(arguments[0], arguments);
  ::_exit(127);
}

}  // namespace

Process::Process(const std::vector<std::string>& command, const std::string& log, uid_t uid) {
  std::vector<char*> arguments;
  arguments.reserve(command.size() + 1);
  for (const std::string& word : command) arguments.push_back(const_cast<char*>(word.c_str()));
  arguments.push_back(nullptr);
  pid_ = ::fork();
  if (pid_ == 0) become(arguments.data(), log, uid);
}

Process::Process(Process&& other) noexcept
    : pid_(std::exchange(other.pid_, -1)), status_(std::exchange(other.status_, std::nullopt)) {}

// What was held before goes at once, not when `other` does.
Process& Process::operator=(Process&& other) noexcept {
  Process held(std::move(other));
  std::swap(pid_, held.pid_);
  std::swap(status_, held.status_);
  return *this;
}

Process::~Process() {
  if (pid_ <= 0 || status_) return;
  ::kill(pid_, SIGKILL);
  ::waitpid(pid_, nullptr, 0);
}

std::optional<int> Process::ended() {
  int raw = 0;
  if (pid_ > 0 && !status_ && ::waitpid(pid_, &raw, WNOHANG) == pid_) status_ = statusOf(raw);
  return status_;
}

std::optional<int> Process::wait(double patience_seconds) {
  const double give_up_seconds = monotonicSeconds() + patience_seconds;
  while (pid_ > 0 && !ended()) {
    if (monotonicSeconds() >= give_up_seconds) {
      *this = Process();
      return std::nullopt;
    }
    sleepSeconds(0.02);
  }
  return status_;
}

std::string readFile(const std::string& path) {
  std::ifstream stream(path);
  std::ostringstream text;
  text << stream.rdbuf();
  return text.str();
}

double monotonicSeconds() {
  timespec now = {};
  ::clock_gettime(CLOCK_MONOTONIC, &now);
  return static_cast<double>(now.tv_sec) + static_cast<double>(now.tv_nsec) / 1e9;
}

void sleepSeconds(double seconds) {
  const auto whole = static_cast<time_t>(seconds);
  const timespec duration = {whole,
                             static_cast<long>((seconds - static_cast<double>(whole)) * 1e9)};
  ::nanosleep(&duration, nullptr);
}

}  // namespace soak
