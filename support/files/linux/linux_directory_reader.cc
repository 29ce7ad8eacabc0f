#include "support/files/linux/linux_directory_reader.h"

#include <dirent.h>
#include <fcntl.h>
#include <sys/stat.h>

#include <memory>

#include "support/files/linux/descriptor.h"
#include "support/logging/log.h"
#include "support/values/plist.h"

namespace spacekeep {
namespace {

struct CloseDirectory {
  void operator()(DIR* stream) const { closedir(stream); }
};
using DirectoryStream = std::unique_ptr<DIR, CloseDirectory>;

constexpr int kDirectoryFlags = O_RDONLY | O_DIRECTORY | O_CLOEXEC | O_NONBLOCK;

DirectoryStream openDirectory(int at, const char* name, int more_flags) {
  FileDescriptor descriptor(openat(at, name, kDirectoryFlags | more_flags));
  if (!descriptor.valid()) return nullptr;
  DirectoryStream stream(fdopendir(descriptor.get()));
  if (stream) static_cast<void>(descriptor.release());
  return stream;
}

bool isDirectory(int at, const dirent& entry) {
  if (entry.d_type != DT_UNKNOWN) return entry.d_type == DT_DIR;
  struct stat status {};  // some file systems do not say
  return fstatat(at, entry.d_name, &status, AT_SYMLINK_NOFOLLOW) == 0 && S_ISDIR(status.st_mode);
}

// A walk keeps the directories above the current entry open, so that what is renamed or replaced
// meanwhile cannot lead it elsewhere.
class Walk {
 public:
  Walk(const std::string& root, const LinuxDirectoryReader::Limits& limits)
      : root_(root), limits_(limits) {}

  std::vector<std::string> run() {
    DirectoryStream stream = openDirectory(AT_FDCWD, root_.c_str(), 0);
    if (!stream && errno == ENOENT) return {};
    if (!stream) return report(root_, errno), std::vector<std::string>{};
    open_.push_back({std::move(stream), ""});
    while (!open_.empty() && step()) {
    }
    return std::move(entries_);
  }

 private:
  struct Level {
    DirectoryStream stream;
    std::string prefix;  // of its entries, with the last slash
  };

  // False when the walk is cut.
  bool step() {
    Level& level = open_.back();
    errno = 0;
    const dirent* entry = readdir(level.stream.get());
    if (entry == nullptr) {
      if (errno != 0) report(root_ + "/" + level.prefix, errno);
      open_.pop_back();
      return true;
    }
    const std::string_view name = entry->d_name;
    if (name == "." || name == "..") return true;
    if (entries_.size() >= limits_.entries) {
      logProblem("%s %@ holds more than %llu entries, the others are left out", "entriesBelow",
                 root_, std::uint64_t{limits_.entries});
      return false;
    }
    entries_.push_back(level.prefix + entry->d_name);
    if (isDirectory(dirfd(level.stream.get()), *entry)) enter(dirfd(level.stream.get()), *entry);
    return true;
  }

  void enter(int at, const dirent& entry) {
    const std::string path = entries_.back();
    if (open_.size() > limits_.depth) {
      logProblem("%s %@/%@ is nested deeper than %llu directories, what it holds is left out",
                 "entriesBelow", root_, path, std::uint64_t{limits_.depth});
      return;
    }
    DirectoryStream stream = openDirectory(at, entry.d_name, O_NOFOLLOW);
    if (!stream) return report(root_ + "/" + path, errno);
    open_.push_back({std::move(stream), path + "/"});
  }

  static void report(const std::string& path, int number) {
    logProblem("%s %@ cannot be read: %@", "entriesBelow", path, errorText(number));
  }

  const std::string& root_;
  const LinuxDirectoryReader::Limits& limits_;
  std::vector<Level> open_;
  std::vector<std::string> entries_;
};

std::variant<std::vector<std::uint8_t>, FileError> readAll(int descriptor, std::size_t expected) {
  std::vector<std::uint8_t> bytes(std::min(expected, kMaxPlistBytes) + 1);
  std::size_t used = 0;
  while (true) {
    const ssize_t got = read(descriptor, bytes.data() + used, bytes.size() - used);
    if (got < 0 && errno == EINTR) continue;
    if (got < 0) return FileError{"it cannot be read: " + errorText(errno)};
    if (got == 0) break;
    used += static_cast<std::size_t>(got);
    if (used > kMaxPlistBytes)
      return FileError{"it is larger than " + std::to_string(kMaxPlistBytes) + " bytes"};
    if (used == bytes.size()) bytes.resize(std::min(2 * used, kMaxPlistBytes + 1));
  }
  bytes.resize(used);
  return bytes;
}

const char* kindProblem(const struct stat& status) {
  if (S_ISDIR(status.st_mode)) return "it is a directory";
  return S_ISREG(status.st_mode) ? nullptr : "it is not a regular file";
}

}  // namespace

std::vector<std::string> LinuxDirectoryReader::entriesBelow(const std::string& directory) {
  return Walk(directory, limits_).run();
}

std::variant<std::vector<std::uint8_t>, FileError> LinuxDirectoryReader::readWholeFile(
    const std::string& path) {
  struct stat status {};
  // Asked before opening too: merely opening some devices does something.
  if (stat(path.c_str(), &status) != 0)
    return FileError{"it cannot be opened: " + errorText(errno)};
  if (const char* problem = kindProblem(status)) return FileError{problem};
  const FileDescriptor file(open(path.c_str(), O_RDONLY | O_NONBLOCK | O_CLOEXEC | O_NOCTTY));
  if (!file.valid() || fstat(file.get(), &status) != 0) {
    return FileError{"it cannot be opened: " + errorText(errno)};
  }
  if (const char* problem = kindProblem(status)) return FileError{problem};
  return readAll(file.get(), static_cast<std::size_t>(status.st_size));
}

}  // namespace spacekeep
