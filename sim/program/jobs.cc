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

namespace spacekeep::sim {
namespace {

constexpr std::uint64_t kMostStoriesPrinted = 50;
constexpr char kLineBreak = '\x1f';

/// A child process and what it has said so far.
struct Job {
  pid_t process = -1;
  int output = -1;
  std::string unread;
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
  const Played played = playSeeds(
      options, index, [&](const std::string& story) { writeLine(output, onOneLine(story)); });
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
  return {process, ends[0], {}};
}

/// Adds up the summary line of a job, prints any other line, which is a story.
void takeLine(const std::string& line, Played& total, std::uint64_t& printed) {
  unsigned long long runs = 0;
  unsigned long long failed = 0;
  unsigned long long repeated = 0;
  unsigned long long steps = 0;
  unsigned long long seconds = 0;
  if (std::sscanf(line.c_str(), "= %llu %llu %llu %llu %llu", &runs, &failed, &repeated, &steps,
                  &seconds) == 5) {
    total.runs += runs;
    total.failed += failed;
    total.repeated += repeated;
    total.steps += steps;
    total.virtual_seconds += seconds;
  } else if (printed++ < kMostStoriesPrinted) {
    std::string story = line;
    std::replace(story.begin(), story.end(), kLineBreak, '\n');
    std::printf("%s\n", story.c_str());
    std::fflush(stdout);
  }
}

/// Answers false once the job has closed its output.
bool readSome(Job& job, Played& total, std::uint64_t& printed) {
  char buffer[4096];
  const ssize_t count = read(job.output, buffer, sizeof buffer);
  if (count < 0 && errno == EINTR) return true;
  if (count <= 0) return false;
  job.unread.append(buffer, static_cast<std::size_t>(count));
  std::size_t newline = job.unread.find('\n');
  while (newline != std::string::npos) {
    takeLine(job.unread.substr(0, newline), total, printed);
    job.unread.erase(0, newline + 1);
    newline = job.unread.find('\n');
  }
  return true;
}

void readAll(std::vector<Job>& jobs, Played& total) {
  std::uint64_t printed = 0;
  std::vector<pollfd> waiting;
  for (const Job& job : jobs) waiting.push_back({job.output, POLLIN, 0});
  std::size_t open = jobs.size();
  while (open > 0) {
    if (poll(waiting.data(), waiting.size(), -1) < 0 && errno != EINTR) return;
    for (std::size_t i = 0; i < jobs.size(); ++i) {
      if (waiting[i].fd < 0 || waiting[i].revents == 0) continue;
      if (readSome(jobs[i], total, printed)) continue;
      waiting[i].fd = -1;
      --open;
    }
  }
}

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
  Played total;
  readAll(jobs, total);
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
