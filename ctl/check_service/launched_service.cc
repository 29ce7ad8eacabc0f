#include "ctl/check_service/launched_service.h"

#include <fcntl.h>
#include <fmt/core.h>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <charconv>
#include <csignal>
#include <cstring>
#include <string_view>

#include "ctl/check_service/patience.h"

namespace spacekeep::ctl {
namespace {

constexpr int kFirstHandedOver = 3;  // SD_LISTEN_FDS_START
constexpr int kOutOfTheWay = 16;     // above the descriptors that the new program gets
constexpr std::uint64_t kTimeToEndNs = 5 * kSecondNs;
constexpr std::string_view kPlaceholder = "{socket}";
constexpr std::string_view kListenPid = "LISTEN_PID=";

std::string filledIn(std::string word, const std::string& socket) {
  for (std::size_t at = word.find(kPlaceholder); at != std::string::npos;
       at = word.find(kPlaceholder, at + socket.size())) {
    word.replace(at, kPlaceholder.size(), socket);
  }
  return word;
}

/// The texts of an argument or environment vector and the pointers to them.
class Vector {
 public:
  void add(std::string text) { texts_.push_back(std::move(text)); }
  [[nodiscard]] char** pointers() {
    pointers_.clear();
    for (std::string& text : texts_) pointers_.push_back(text.data());
    pointers_.push_back(nullptr);
    return pointers_.data();
  }
  [[nodiscard]] std::string& last() { return texts_.back(); }

 private:
  std::vector<std::string> texts_;
  std::vector<char*> pointers_;
};

/// The last entry has room for a process number, which only the new process knows.
Vector environmentFor(const LaunchPlan& plan) {
  Vector environment;
  for (char** entry = environ; *entry != nullptr; ++entry) {
    const std::string_view text = *entry;
    const bool replaced = text.starts_with("LISTEN_") || text.starts_with("SPACEKEEP_SOCKET=");
    if (!replaced) environment.add(std::string(text));
  }
  environment.add("SPACEKEEP_SOCKET=" + plan.daemon_socket);
  environment.add("LISTEN_FDS=1");
  environment.add(std::string(kListenPid) + std::string(20, '\0'));
  return environment;
}

struct Descriptors {
  int input;
  int output;
  int listening;
  int failure;
};

/// In the new process, which shares its memory layout with threads that are not there: nothing here
/// may allocate.
[[noreturn]] void become(char** words, char** environment, char* listen_pid, Descriptors fds) {
  setpgid(0, 0);
  prctl(PR_SET_PDEATHSIG, SIGTERM);
  sigset_t none;
  sigemptyset(&none);
  sigprocmask(SIG_SETMASK, &none, nullptr);
  dup2(fds.input, STDIN_FILENO);
  dup2(fds.output, STDOUT_FILENO);
  dup2(fds.output, STDERR_FILENO);
  dup2(fds.listening, kFirstHandedOver);
  *std::to_chars(listen_pid, listen_pid + 20, getpid()).ptr = '\0';
  execvpe(words[0], words, environment);
  const int error = errno;
  [[maybe_unused]] const auto written = write(fds.failure, &error, sizeof error);
  _exit(127);
}

/// Above the numbers that are about to be taken; closed when the new program starts.
int outOfTheWay(int fd) {
  const int moved = fcntl(fd, F_DUPFD_CLOEXEC, kOutOfTheWay);
  close(fd);
  return moved;
}

/// The error with which the program could not be started, 0 when it was.
int failureOf(int reading) {
  int error = 0;
  const bool failed = read(reading, &error, sizeof error) == sizeof error;
  return failed ? error : 0;
}

}  // namespace

std::variant<std::unique_ptr<LaunchedService>, std::string> LaunchedService::start(
    const LaunchPlan& plan) {
  Vector words;
  for (const auto& word : plan.command) words.add(filledIn(word, plan.daemon_socket));
  Vector environment = environmentFor(plan);
  std::array<int, 2> failure{};
  if (pipe2(failure.data(), O_CLOEXEC) != 0) return std::string("this process has no pipe left");
  const Descriptors fds{
      .input = outOfTheWay(open("/dev/null", O_RDONLY | O_CLOEXEC)),
      .output = outOfTheWay(
          open(plan.output_path.c_str(), O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC, 0600)),
      .listening = fcntl(plan.listening_fd, F_DUPFD_CLOEXEC, kOutOfTheWay),
      .failure = outOfTheWay(failure[1])};
  char** const word_pointers = words.pointers();
  char** const environment_pointers = environment.pointers();
  char* const listen_pid = environment.last().data() + kListenPid.size();
  const pid_t pid = fork();
  if (pid == 0) become(word_pointers, environment_pointers, listen_pid, fds);
  for (const int fd : {fds.input, fds.output, fds.listening, fds.failure}) close(fd);
  const int error = pid < 0 ? errno : failureOf(failure[0]);
  close(failure[0]);
  if (error == 0) return std::unique_ptr<LaunchedService>(new LaunchedService(pid));
  if (pid > 0) waitpid(pid, nullptr, 0);
  return fmt::format("cannot start {}: {}", plan.command.front(), std::strerror(error));
}

LaunchedService::~LaunchedService() {
  kill(-pid_, SIGTERM);
  within(kTimeToEndNs, [this] { return ended().has_value(); });
  kill(-pid_, SIGKILL);
  if (!status_) waitpid(pid_, nullptr, 0);
}

std::optional<int> LaunchedService::ended() {
  int status = 0;
  if (!status_ && waitpid(pid_, &status, WNOHANG) == pid_) status_ = status;
  return status_;
}

std::string textOfEnd(int wait_status) {
  if (WIFEXITED(wait_status)) return fmt::format("ended with status {}", WEXITSTATUS(wait_status));
  const int number = WTERMSIG(wait_status);
  return fmt::format("was ended by signal {} ({})", number, strsignal(number));
}

}  // namespace spacekeep::ctl
