// Fills a directory with equal files that nobody has used for a long time.
// Usage: bench-make-files DIRECTORY COUNT BYTES [reserve]
//
// With "reserve" the blocks are only reserved for the files, which takes as much space and no time.
#include <fcntl.h>
#include <fmt/format.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <ctime>
#include <string>
#include <vector>

namespace {

constexpr int kFilesPerDirectory = 500;
constexpr time_t kDayS = 86'400;

bool fillFile(int fd, const std::vector<char>& content, bool reserve) {
  if (reserve) return posix_fallocate(fd, 0, static_cast<off_t>(content.size())) == 0;
  return write(fd, content.data(), content.size()) == static_cast<ssize_t>(content.size());
}

bool writeFile(int directory, const std::string& name, const std::vector<char>& content, int number,
               bool reserve) {
  const int fd = openat(directory, name.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC, 0644);
  if (fd < 0) return false;
  const bool written = fillFile(fd, content, reserve);
  const time_t when = time(nullptr) - 60 * kDayS + number;
  const timespec times[2] = {{when, 0}, {when, 0}};
  futimens(fd, times);
  close(fd);
  return written;
}

}  // namespace

int main(int count, char** arguments) {
  if (count < 4) return 2;
  const bool reserve = count > 4;
  const std::string root = arguments[1];
  const int files = std::atoi(arguments[2]);
  const std::vector<char> content(static_cast<std::size_t>(std::atoi(arguments[3])), 'x');
  int directory = -1;
  for (int i = 0; i < files; ++i) {
    if (i % kFilesPerDirectory == 0) {
      const std::string path = fmt::format("{}/{:04}", root, i / kFilesPerDirectory);
      if (mkdir(path.c_str(), 0755) != 0 && errno != EEXIST) return 1;
      if (directory >= 0) close(directory);
      directory = open(path.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC);
    }
    if (!writeFile(directory, fmt::format("{:06}", i), content, i, reserve)) {
      fmt::print(stderr, "cannot write file {}\n", i);
      return 1;
    }
  }
  return 0;
}
