// Frees from a directory with many files and tells time and memory. The files are made first, by a
// process of its own, so that the figures are those of the engine alone.
//   bench-cachedir-many-files DIRECTORY [FILES]
#include <fcntl.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <limits>
#include <string>

#include "services/cachedir/engine/cache_cleaner.h"
#include "services/cachedir/engine/elapsed.h"

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
