#include "sim/program/jobs.h"

#include <poll.h>
#include <sys/wait.h>
#include <time.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <cstring>
#include <string>
#include <vector>

#include "sim/program/play.h"
#include "sim/program/progress.h"

namespace spacekeep::sim {
namespace {

constexpr std::uint64_t kMostStoriesPrinted = 50;
constexpr char kLineBreak = '\x1f';

/// A child process says how far it is that often.
constexpr double kSecondsBetweenReports = 0.25;

/// A child process and what it has said so far.
struct Job {
  pid_t process = -1;
  int output = -1;
  std::string unread;
  std::uint64_t runs = 0;
  std::uint64_t failed = 0;
};

double secondsNow() {
  timespec now{};
  clock_gettime(CLOCK_MONOTONIC, &now);  // tidy-allow: real time of a program about virtual time
  return static_cast<double>(now.tv_sec) + static_cast<double>(now.tv_nsec) / 1e9;
}

void writeLine(int output, std::string line) {
  line.push_back('\n');
  const char* rest = line.data();
  std::size_t left = line.size();
  while (left > 0) {
    const ssize_t written = write(output, rest, left);
    if (written < 0 && errno == EINTR) continue;
    if (written <= 0) _exit(3);
    rest += written;
    left -= static_cast<std::size_t>(written);
  }
}

// A story has several lines; it goes through the pipe as one, so that those of two processes do not
// mix.
std::string onOneLine(std::string story) {
  std::replace(story.begin(), story.end(), '\n', kLineBreak);
  return story;
}

[[noreturn]] void work(const Options& options, unsigned index, int output) {
  double reported_seconds = secondsNow();
  const auto report = [&](const Played& so_far) {
    const double now = secondsNow();
    if (now - reported_seconds < kSecondsBetweenReports) return;
    reported_seconds = now;
    writeLine(output, "+ " + std::to_string(so_far.runs) + " " + std::to_string(so_far.failed));
  };
  const Played played = playSeeds(
      options, index, [&](const std::string& story) { writeLine(output, onOneLine(story)); },
      report);
  writeLine(output, "= " + std::to_string(played.runs) + " " + std::to_string(played.failed) + " " +
                        std::to_string(played.repeated) + " " + std::to_string(played.steps) + " " +
                        std::to_string(played.virtual_seconds));
  _exit(0);
}

Job startJob(const Options& options, unsigned index) {
  int ends[2];
  if (pipe(ends) != 0) return {};
  std::fflush(nullptr);
  const pid_t process = fork();
  if (process == 0) {
    close(ends[0]);
    work(options, index, ends[1]);
  }
  close(ends[1]);
  return {.process = process, .output = ends[0], .unread = {}};
}

/// What the jobs say, as it comes in.
class Listener {
 public:
  Listener(std::vector<Job>& jobs, std::uint64_t seeds)
      : jobs_(jobs),
        seeds_(seeds),
        is_terminal_(isatty(STDERR_FILENO) == 1),
        start_seconds_(secondsNow()),
        pace_(is_terminal_, start_seconds_) {}

  void readAll() {
    std::vector<pollfd> waiting;
    for (const Job& job : jobs_) waiting.push_back({job.output, POLLIN, 0});
    std::size_t open = jobs_.size();
    while (open > 0) {
      if (poll(waiting.data(), waiting.size(), 1000) < 0 && errno != EINTR) return;
      for (std::size_t i = 0; i < jobs_.size(); ++i) {
        if (waiting[i].fd < 0 || waiting[i].revents == 0) continue;
        if (readSome(jobs_[i])) continue;
        waiting[i].fd = -1;
        --open;
      }
      if (open > 0 && pace_.isDue(secondsNow())) showProgress();
    }
    clearLine();
  }

  [[nodiscard]] const Played& total() const { return total_; }

 private:
  /// Answers false once the job has closed its output.
  bool readSome(Job& job) {
    char buffer[4096];
    const ssize_t count = read(job.output, buffer, sizeof buffer);
    if (count < 0 && errno == EINTR) return true;
    if (count <= 0) return false;
    job.unread.append(buffer, static_cast<std::size_t>(count));
    std::size_t newline = job.unread.find('\n');
    while (newline != std::string::npos) {
      takeLine(job, job.unread.substr(0, newline));
      job.unread.erase(0, newline + 1);
      newline = job.unread.find('\n');
    }
    return true;
  }

  /// How far the job is, its summary, or else a story, which is printed.
  void takeLine(Job& job, const std::string& line) {
    unsigned long long runs = 0;
    unsigned long long failed = 0;
    if (std::sscanf(line.c_str(), "+ %llu %llu", &runs, &failed) == 2) {
      job.runs = runs;
      job.failed = failed;
    } else if (!takeSummary(job, line) && printed_++ < kMostStoriesPrinted) {
      std::string story = line;
      std::replace(story.begin(), story.end(), kLineBreak, '\n');
      clearLine();
      std::printf("%s\n", story.c_str());
      std::fflush(stdout);
    }
  }

  bool takeSummary(Job& job, const std::string& line) {
    unsigned long long runs = 0;
    unsigned long long failed = 0;
    unsigned long long repeated = 0;
    unsigned long long steps = 0;
    unsigned long long seconds = 0;
    if (std::sscanf(line.c_str(), "= %llu %llu %llu %llu %llu", &runs, &failed, &repeated, &steps,
                    &seconds) != 5) {
      return false;
    }
    job.runs = runs;
    job.failed = failed;
    total_.runs += runs;
    total_.failed += failed;
    total_.repeated += repeated;
    total_.steps += steps;
    total_.virtual_seconds += seconds;
    return true;
  }

  void showProgress() {
    Progress progress;
    progress.total = seeds_;
    progress.elapsed_seconds = secondsNow() - start_seconds_;
    for (const Job& job : jobs_) {
      progress.done += job.runs;
      progress.failed += job.failed;
    }
    const std::string text = progressText(progress);
    std::fprintf(stderr, is_terminal_ ? "\r%s\x1b[K" : "%s\n", text.c_str());
    std::fflush(stderr);
  }

  void clearLine() const {
    if (is_terminal_) std::fputs("\r\x1b[K", stderr);
  }

  std::vector<Job>& jobs_;
  const std::uint64_t seeds_;
  const bool is_terminal_;
  const double start_seconds_;
  ProgressPace pace_;
  Played total_;
  std::uint64_t printed_ = 0;
};

/// Answers how many jobs did not end by themselves.
unsigned reap(const std::vector<Job>& jobs) {
  unsigned lost = 0;
  for (const Job& job : jobs) {
    int status = 0;
    if (job.process < 0 || waitpid(job.process, &status, 0) < 0 || status != 0) {
      ++lost;
      std::printf("a process was lost: %s\n",
                  WIFSIGNALED(status) ? strsignal(WTERMSIG(status)) : "it ended early");
    }
    if (job.output >= 0) close(job.output);
  }
  return lost;
}

}  // namespace

int playInProcesses(const Options& options) {
  const double start = secondsNow();
  std::vector<Job> jobs;
  for (unsigned index = 0; index < options.jobs; ++index) {
    jobs.push_back(startJob(options, index));
  }
  Listener listener(jobs, options.seeds);
  listener.readAll();
  const Played& total = listener.total();
  const unsigned lost = reap(jobs);
  const double seconds = secondsNow() - start;
  if (options.stop_at_first && total.failed != 0) {
    // The other processes go on to their own first failure: which seed it is must not depend on
    // who is faster.
    std::printf("stopped at the first failure of each process\n");
  }
  std::printf(
      "%llu schedules, %llu failed, %llu played twice; %llu steps, %llu virtual s; %.1f s, "
      "%.0f schedules/s on %u processes\n",
      static_cast<unsigned long long>(total.runs), static_cast<unsigned long long>(total.failed),
      static_cast<unsigned long long>(total.repeated), static_cast<unsigned long long>(total.steps),
      static_cast<unsigned long long>(total.virtual_seconds), seconds,
      static_cast<double>(total.runs) / seconds, options.jobs);
  const bool all_played = total.runs == options.seeds;
  return total.failed == 0 && lost == 0 && all_played ? 0 : 1;
}

}  // namespace spacekeep::sim
