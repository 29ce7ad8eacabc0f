#include "support/logging/linux/log_level.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <limits>
#include <optional>
#include <utility>
#include <vector>

#include "support/logging/linux/journal.h"
#include "support/logging/linux/standard_error.h"
#include "support/values/plist.h"

namespace spacekeep {
namespace {

using Bytes = std::vector<std::uint8_t>;

class Descriptor {
 public:
  explicit Descriptor(int descriptor) : descriptor_(descriptor) {}
  ~Descriptor() {
    if (descriptor_ >= 0) close(descriptor_);
  }
  Descriptor(const Descriptor&) = delete;
  Descriptor& operator=(const Descriptor&) = delete;
  [[nodiscard]] int get() const { return descriptor_; }

 private:
  int descriptor_;
};

// None when there is no file. Not by the files room, which itself logs.
std::variant<std::optional<Bytes>, LogLevelProblem> readSmallFile(const std::string& path) {
  // Non-blocking, so that a FIFO in this place cannot hold up the start.
  const Descriptor file(open(path.c_str(), O_RDONLY | O_NONBLOCK | O_CLOEXEC | O_NOCTTY));
  if (file.get() < 0 && errno == ENOENT) return std::optional<Bytes>();
  struct stat status {};
  if (file.get() < 0 || fstat(file.get(), &status) != 0) {
    return LogLevelProblem{std::string("it cannot be opened: ") + std::strerror(errno)};
  }
  if (!S_ISREG(status.st_mode)) return LogLevelProblem{"it is not a regular file"};
  Bytes bytes(kMaxLogLevelFileBytes + 1);
  std::size_t used = 0;
  while (used < bytes.size()) {
    const ssize_t got = read(file.get(), bytes.data() + used, bytes.size() - used);
    if (got < 0 && errno == EINTR) continue;
    if (got < 0) return LogLevelProblem{std::string("it cannot be read: ") + std::strerror(errno)};
    if (got == 0) break;
    used += static_cast<std::size_t>(got);
  }
  if (used > kMaxLogLevelFileBytes) return LogLevelProblem{"it is too large"};
  bytes.resize(used);
  return std::optional<Bytes>(std::move(bytes));
}

std::variant<std::int32_t, LogLevelProblem> levelOf(const Bytes& document) {
  const auto parsed = parsePlist(document);
  if (const auto* error = std::get_if<PlistError>(&parsed)) return LogLevelProblem{error->reason};
  const Dictionary* settings = std::get<Value>(parsed).dictionary();
  if (settings == nullptr) return LogLevelProblem{"its top level is not a dictionary"};
  const Value* level = settings->find(kLogLevelKey);
  if (level == nullptr) return kDefaultLogLevel;
  const std::int64_t number = level->asSigned().value_or(-1);
  if (number < 0 || number > std::numeric_limits<std::int32_t>::max()) {
    return LogLevelProblem{"LogLevel is not a number from 0 upwards"};
  }
  return static_cast<std::int32_t>(number);
}

}  // namespace

std::variant<std::int32_t, LogLevelProblem> readLogLevel(const std::string& path) {
  const auto file = readSmallFile(path);
  if (const auto* problem = std::get_if<LogLevelProblem>(&file)) return *problem;
  const auto& document = std::get<std::optional<Bytes>>(file);
  if (!document) return kDefaultLogLevel;
  return levelOf(*document);
}

void setUpLogging(LogHandle& handle, const std::string& level_file) {
  handle.level.store(kDefaultLogLevel);
  setLogHandle(&handle);
  logToStandardError();
  installPlatformLog();
  const auto level = readLogLevel(level_file);
  if (const auto* problem = std::get_if<LogLevelProblem>(&level)) {
    logProblem("%s %@ is not used, the log level is %d: %@", __func__, level_file, kDefaultLogLevel,
               problem->reason);
    return;
  }
  handle.level.store(std::get<std::int32_t>(level));
}

}  // namespace spacekeep
