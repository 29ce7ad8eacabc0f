// Frees from a directory with many files and tells time and memory. The files are made first, by a
// process of its own, so that the figures are those of the engine alone.
//   bench-cachedir-many-files DIRECTORY [FILES]
#include <fcntl.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <atomic>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <limits>
#include <memory>
#include <string>

#include "services/cachedir/engine/cache_cleaner.h"
#include "services/cachedir/engine/elapsed.h"
#include "services/cachedir/index/cache_index.h"

namespace spacekeep::cachedir {
namespace {

constexpr std::uint64_t kFilesPerDirectory = 1000;
constexpr std::uint64_t kFileBytes = 4096;

bool makeFile(const std::string& path, std::int64_t used_seconds) {
  const UniqueFd fd(::open(path.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0644));
  const char byte = 'x';
  const timespec times[2] = {{used_seconds, 0}, {used_seconds, 0}};
  return fd && ::write(fd.get(), &byte, 1) == 1 && ::futimens(fd.get(), times) == 0;
}

int makeFiles(const std::string& root, std::uint64_t files) {
  const std::int64_t now_seconds = rt::wallClockNs() / kNsPerSecond;
  for (std::uint64_t i = 0; i < files; ++i) {
    const std::string folder = root + "/directory" + std::to_string(i / kFilesPerDirectory);
    if (i % kFilesPerDirectory == 0) ::mkdir(folder.c_str(), 0755);
    // The order of use has nothing to do with that of the names: 7919 shares no factor with a
    // million.
    const auto age = static_cast<std::int64_t>(i * 7919 % files) + 40 * kSecondsPerDay;
    if (!makeFile(folder + "/thumbnail-" + std::to_string(i) + ".bin", now_seconds - age)) return 1;
  }
  return 0;
}

void report(const char* what, std::uint64_t begin_ticks, std::uint64_t files) {
  rusage used{};
  ::getrusage(RUSAGE_SELF, &used);
  std::printf("%-34s %8.2f s   files %8llu   peak RSS %6.1f MiB\n", what,
              static_cast<double>(elapsedNs(begin_ticks)) / 1e9,
              static_cast<unsigned long long>(files), static_cast<double>(used.ru_maxrss) / 1024.0);
}

/// Bytes of memory that belong to this process alone.
double ownMib() {
  std::ifstream facts("/proc/self/statm");
  double size = 0, resident = 0, shared = 0;
  facts >> size >> resident >> shared;
  return (resident - shared) * static_cast<double>(::sysconf(_SC_PAGESIZE)) / (1024.0 * 1024.0);
}

CacheCleaner::Surroundings with(const std::shared_ptr<CacheIndex>& index) {
  CacheCleaner::Surroundings surroundings;
  surroundings.index = index;
  return surroundings;
}

/// Makes files, 2000 a second, on a thread of its own, until it is told to end.
class Writer {
 public:
  explicit Writer(std::string root) : root_(std::move(root)) {
    thread_ = rt::Thread("writer", [this] { write(); });
  }
  ~Writer() {
    ending_ = true;
    thread_.join();
  }
  Writer(const Writer&) = delete;
  Writer& operator=(const Writer&) = delete;

  [[nodiscard]] std::uint64_t made() const { return made_; }

 private:
  void write() {
    const std::uint64_t begin = rt::ticks();
    for (std::uint64_t i = 0; !ending_; ++i) {
      // The newest of the last ten thousand; older ones are written again.
      made_ = i;
      makeFile(root_ + "/written/w" + std::to_string(i % 10000), rt::wallClockNs() / kNsPerSecond);
      const std::uint64_t due_ns = i * 500'000;
      const std::uint64_t spent_ns = elapsedNs(begin);
      if (spent_ns + kNsPerMs < due_ns) rt::sleepNs(due_ns - spent_ns);
    }
  }

  const std::string root_;
  std::atomic<bool> ending_{false};
  std::atomic<std::uint64_t> made_{0};
  rt::Thread thread_;
};

/// Seconds of processor time of the thread of that name.
double cpuOf(const std::string& name) {
  for (const auto& task : std::filesystem::directory_iterator("/proc/self/task")) {
    std::string comm;
    std::getline(std::ifstream(task.path() / "comm") >> std::ws, comm);
    if (comm != name) continue;
    std::uint64_t run_ns = 0;
    std::ifstream(task.path() / "schedstat") >> run_ns;
    return static_cast<double>(run_ns) / 1e9;
  }
  return 0;
}

void measureWriter(const std::string& root, const std::shared_ptr<CacheIndex>& index,
                   CacheCleaner& cleaner) {
  constexpr std::uint64_t kSeconds = 10;
  ::mkdir((root + "/written").c_str(), 0755);
  static_cast<void>(cleaner.estimate({}));  // a directory is followed from the first look at it
  const double cpu_before = cpuOf("cachedir-events");
  const std::uint64_t wakes_before = index->inbox().wakeUps();
  {
    const Writer writer(root);
    rt::sleepNs(kSeconds * kNsPerSecond);
    const double cpu = cpuOf("cachedir-events") - cpu_before;
    std::printf("%llu files/s written: %.2f %% of a processor, %.1f wake-ups/s, losses %llu\n",
                static_cast<unsigned long long>(writer.made() / kSeconds), cpu * 100 / kSeconds,
                static_cast<double>(index->inbox().wakeUps() - wakes_before) / kSeconds,
                static_cast<unsigned long long>(index->history().losses));
    const std::uint64_t begin = rt::ticks();
    report("asked while it is written", begin, cleaner.estimate({}).files[3]);
  }
  const std::uint64_t wakes_idle = index->inbox().wakeUps();
  rt::sleepNs(3 * kNsPerSecond);
  std::printf("wake-ups in 3 s of rest: %llu\n",
              static_cast<unsigned long long>(index->inbox().wakeUps() - wakes_idle));
}

void measureIndex(const Rules& rules, std::uint64_t files) {
  const auto index = std::make_shared<CacheIndex>();
  CacheCleaner cleaner(rules, {}, with(index));
  const double before_mib = ownMib();
  std::uint64_t begin = rt::ticks();
  report("indexed: first estimate", begin, cleaner.estimate({}).files[3]);
  std::printf("%.1f bytes of memory per file (%.1f MiB)\n",
              (ownMib() - before_mib) * 1024 * 1024 / static_cast<double>(files),
              ownMib() - before_mib);
  for (int i = 0; i < 3; ++i) {
    begin = rt::ticks();
    report("indexed: estimate", begin, cleaner.estimate({}).files[3]);
  }
  begin = rt::ticks();
  report("indexed: 1 % freed", begin,
         cleaner.free({.amount = files / 100 * kFileBytes, .urgency = 1}).files);
  begin = rt::ticks();
  report("indexed: estimate after it", begin, cleaner.estimate({}).files[3]);
  begin = rt::ticks();
  static_cast<void>(cleaner.verifyIndex({}, 60 * kNsPerSecond));
  report("indexed: compared with a walk", begin, files);
  measureWriter(rules.directories[0].path, index, cleaner);
}

int measure(const std::string& root, std::uint64_t files) {
  Rules rules;
  rules.directories.push_back(DirectoryRule{.path = root});
  CacheCleaner cleaner(rules);
  std::uint64_t begin = rt::ticks();
  report("nothing done yet", begin, 0);
  report("estimate", begin, cleaner.estimate({}).files[3]);
  begin = rt::ticks();
  report("1 % freed", begin,
         cleaner.free({.amount = files / 100 * kFileBytes, .urgency = 1}).files);
  measureIndex(rules, files);
  begin = rt::ticks();
  const auto all = std::numeric_limits<std::uint64_t>::max();
  report("all the rest, as a dry run", begin,
         cleaner.free({.amount = all, .urgency = 1, .dry_run = true}).files);
  begin = rt::ticks();
  report("all the rest freed", begin, cleaner.free({.amount = all, .urgency = 1}).files);
  return 0;
}

}  // namespace
}  // namespace spacekeep::cachedir

int main(int argc, char** argv) {
  using namespace spacekeep::cachedir;
  std::setvbuf(stdout, nullptr, _IOLBF, 0);
  if (argc < 2) {
    std::fprintf(stderr, "usage: %s DIRECTORY [FILES]\n", argv[0]);
    return 2;
  }
  const std::uint64_t files = argc > 2 ? std::strtoull(argv[2], nullptr, 10) : 1'000'000;
  const pid_t maker = ::fork();
  if (maker == 0) ::_exit(makeFiles(argv[1], files));
  int status = 0;
  if (::waitpid(maker, &status, 0) != maker || status != 0) {
    std::fprintf(stderr, "%s: the files could not be made\n", argv[1]);
    return 1;
  }
  return measure(argv[1], files);
}
