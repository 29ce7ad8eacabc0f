#include "support/events/linux/event_files.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <span>
#include <system_error>

#include "support/logging/log.h"
#include "support/values/plist.h"

namespace spacekeep {
namespace {

constexpr std::size_t kMaxFileBytes = 64 * 1024;
using Bytes = std::vector<std::uint8_t>;

std::string textOfErrno() { return std::generic_category().message(errno); }

class OpenFile {
 public:
  OpenFile(const std::string& path, int flags) : fd_(::open(path.c_str(), flags | O_CLOEXEC, 0600)) {}
  ~OpenFile() {
    if (fd_ >= 0) ::close(fd_);
  }
  OpenFile(const OpenFile&) = delete;
  OpenFile& operator=(const OpenFile&) = delete;
  [[nodiscard]] int fd() const { return fd_; }

 private:
  const int fd_;
};

std::variant<Bytes, std::string> readAll(int fd) {
  struct stat status {};
  if (::fstat(fd, &status) < 0) return textOfErrno();
  if (!S_ISREG(status.st_mode)) return "is no regular file";
  Bytes bytes(kMaxFileBytes + 1);
  std::size_t used = 0;
  while (used < bytes.size()) {
    const ssize_t count = ::read(fd, bytes.data() + used, bytes.size() - used);
    if (count < 0 && errno == EINTR) continue;
    if (count < 0) return textOfErrno();
    if (count == 0) break;
    used += static_cast<std::size_t>(count);
  }
  if (used > kMaxFileBytes) return "is too large";
  bytes.resize(used);
  return bytes;
}

std::variant<Value, std::string> readDocument(int fd) {
  const auto bytes = readAll(fd);
  if (const auto* reason = std::get_if<std::string>(&bytes)) return *reason;
  auto document = parsePlist(std::get<Bytes>(bytes));
  if (const auto* error = std::get_if<PlistError>(&document)) return error->reason;
  return std::move(std::get<Value>(document));
}

std::variant<DailySchedule, LaunchFileError> readSchedule(int fd) {
  const auto document = readDocument(fd);
  if (const auto* reason = std::get_if<std::string>(&document)) return LaunchFileError{*reason};
  return scheduleFromDocument(std::get<Value>(document));
}

bool writeAll(int fd, std::span<const std::uint8_t> bytes) {
  while (!bytes.empty()) {
    const ssize_t count = ::write(fd, bytes.data(), bytes.size());
    if (count < 0 && errno != EINTR) return false;
    if (count > 0) bytes = bytes.subspan(static_cast<std::size_t>(count));
  }
  return true;
}

bool writeDurably(const std::string& path, std::span<const std::uint8_t> bytes) {
  const OpenFile file(path, O_WRONLY | O_CREAT | O_TRUNC | O_NOFOLLOW);
  return file.fd() >= 0 && writeAll(file.fd(), bytes) && ::fsync(file.fd()) == 0;
}

/// Makes a rename in the directory of `path` durable.
bool syncDirectoryOf(const std::string& path) {
  const OpenFile directory(path.substr(0, path.rfind('/') + 1), O_RDONLY | O_DIRECTORY);
  return directory.fd() >= 0 && ::fsync(directory.fd()) == 0;
}

}  // namespace

std::optional<DailySchedule> loadSchedule(const std::vector<std::string>& directories,
                                          const std::string& name) {
  for (const std::string& directory : directories) {
    const std::string path = directory + "/" + name + ".plist";
    const OpenFile file(path, O_RDONLY | O_NONBLOCK);
    if (file.fd() < 0 && errno == ENOENT) continue;
    const auto schedule = file.fd() < 0
                              ? std::variant<DailySchedule, LaunchFileError>(
                                    LaunchFileError{textOfErrno()})
                              : readSchedule(file.fd());
    if (const auto* found = std::get_if<DailySchedule>(&schedule)) return *found;
    logProblem("%s launch file %s is not used, the activity %s will not run: %s", "loadSchedule",
               path, name, std::get<LaunchFileError>(schedule).reason);
    return std::nullopt;
  }
  logProblem("%s there is no launch file %s.plist, the activity will not run", "loadSchedule", name);
  return std::nullopt;
}

std::optional<RunRecord> loadRunRecord(const std::string& path) {
  const OpenFile file(path, O_RDONLY | O_NONBLOCK);
  if (file.fd() < 0) {
    if (errno != ENOENT) logProblem("%s cannot read %s: %s", "loadRunRecord", path, textOfErrno());
    return std::nullopt;
  }
  const auto document = readDocument(file.fd());
  if (const auto* reason = std::get_if<std::string>(&document)) {
    logProblem("%s cannot read %s: %s", "loadRunRecord", path, *reason);
    return std::nullopt;
  }
  auto record = runRecordFromDocument(std::get<Value>(document));
  if (!record) logProblem("%s %s holds no run times", "loadRunRecord", path);
  return record;
}

std::optional<std::string> saveRunRecord(const std::string& path, const RunRecord& record) {
  const std::string fresh = path + ".new";
  if (writeDurably(fresh, binaryPlist(documentFromRunRecord(record))) &&
      ::rename(fresh.c_str(), path.c_str()) == 0 && syncDirectoryOf(path)) {
    return std::nullopt;
  }
  const std::string reason = textOfErrno();
  ::unlink(fresh.c_str());
  return reason;
}

}  // namespace spacekeep
