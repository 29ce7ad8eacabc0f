// Fills a volume at a steady rate and counts what did not fit.
// Usage: bench-rate-writer DIRECTORY MIB_PER_SECOND TOTAL_MIB LOG
//
// 0 MiB per second means as fast as it goes. A write that fails, or falls short, is counted and not
// tried again; the writer pauses for 100 ms and goes on with the next. LOG gets one line a second:
// wall clock in seconds, free MiB, writes, failed writes.
#include <fcntl.h>
#include <fmt/format.h>
#include <sys/statvfs.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <ctime>
#include <string>
#include <vector>

namespace {

constexpr std::size_t kWriteBytes = 262'144;
constexpr int kWritesPerMib = 4;
constexpr int kWritesPerFile = 256;
constexpr double kPauseAfterFailureS = 0.1;
constexpr double kMostCatchUpS = 1;

double secondsOf(clockid_t clock) {
  timespec now = {};
  clock_gettime(clock, &now);
  return static_cast<double>(now.tv_sec) + static_cast<double>(now.tv_nsec) / 1e9;
}

void sleepUntil(double monotonic_s) {
  const auto whole = static_cast<time_t>(monotonic_s);
  const timespec until = {whole,
                          static_cast<long>((monotonic_s - static_cast<double>(whole)) * 1e9)};
  while (clock_nanosleep(CLOCK_MONOTONIC, TIMER_ABSTIME, &until, nullptr) == EINTR) {
  }
}

struct Outcome {
  int writes = 0;
  int failed = 0;
  int failed_otherwise = 0;  // not for lack of space
  double first_failure_s = 0;
  double lowest_free_mib = 1e12;
};

double freeMib(const std::string& directory) {
  struct statvfs space = {};
  if (statvfs(directory.c_str(), &space) != 0) return 0;
  return static_cast<double>(space.f_bavail) * static_cast<double>(space.f_frsize) / 1'048'576;
}

class Files {
 public:
  explicit Files(std::string directory) : directory_(std::move(directory)) {}
  ~Files() { close(fd_); }
  Files(const Files&) = delete;
  Files& operator=(const Files&) = delete;

  /// 0, or the errno value.
  int writeNext(const std::vector<char>& content) {
    if (fd_ < 0 || in_file_ == kWritesPerFile) {
      if (fd_ >= 0) close(fd_);
      in_file_ = 0;
      const std::string path = fmt::format("{}/{:04}", directory_, number_++);
      fd_ = open(path.c_str(), O_WRONLY | O_CREAT | O_CLOEXEC, 0644);
      if (fd_ < 0) return errno;
    }
    ++in_file_;
    const ssize_t written = write(fd_, content.data(), content.size());
    if (written < 0) return errno;
    return static_cast<std::size_t>(written) == content.size() ? 0 : ENOSPC;
  }

 private:
  const std::string directory_;
  int number_ = 0;
  int in_file_ = 0;
  int fd_ = -1;
};

void note(Outcome& outcome, int error, double elapsed_s) {
  ++outcome.writes;
  if (error == 0) return;
  if (outcome.failed++ == 0) outcome.first_failure_s = elapsed_s;
  if (error != ENOSPC) ++outcome.failed_otherwise;
}

Outcome run(const std::string& directory, int mib_per_s, int writes, std::FILE* log) {
  const std::vector<char> content(kWriteBytes, 'w');
  Files files(directory);
  Outcome outcome;
  const double start_s = secondsOf(CLOCK_MONOTONIC);
  const double step_s = mib_per_s == 0 ? 0 : 1.0 / (mib_per_s * kWritesPerMib);
  double next_s = start_s;
  double next_line_s = start_s;
  while (outcome.writes < writes) {
    sleepUntil(next_s);
    const int error = files.writeNext(content);
    const double now_s = secondsOf(CLOCK_MONOTONIC);
    note(outcome, error, now_s - start_s);
    // A writer that was held up catches up, within limits.
    next_s = std::max(next_s + step_s, now_s - kMostCatchUpS);
    if (error != 0) next_s = now_s + kPauseAfterFailureS;
    const double free_mib = freeMib(directory);
    outcome.lowest_free_mib = std::min(outcome.lowest_free_mib, free_mib);
    if (now_s < next_line_s && error == 0) continue;
    next_line_s = now_s + 1;
    fmt::print(log, "{:.3f} {:.0f} {} {}\n", secondsOf(CLOCK_REALTIME), free_mib, outcome.writes,
               outcome.failed);
  }
  return outcome;
}

}  // namespace

int main(int count, char** arguments) {
  if (count != 5) return 2;
  std::FILE* log = std::fopen(arguments[4], "w");
  if (log == nullptr) return 1;
  const double start_s = secondsOf(CLOCK_MONOTONIC);
  const Outcome outcome =
      run(arguments[1], std::atoi(arguments[2]), std::atoi(arguments[3]) * kWritesPerMib, log);
  std::fclose(log);
  fmt::print("{} {} {} {:.1f} {:.1f} {:.1f}\n", outcome.writes, outcome.failed,
             outcome.failed_otherwise, outcome.first_failure_s, outcome.lowest_free_mib,
             secondsOf(CLOCK_MONOTONIC) - start_s);
}
