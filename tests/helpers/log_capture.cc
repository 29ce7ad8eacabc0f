#include "tests/helpers/log_capture.h"

#include <algorithm>
#include <mutex>

#include "support/runtime/runtime.h"

namespace spacekeep::test {
namespace {

// The log-write entry is a plain function, so what it writes to is global. Never destroyed: a
// thread that outlives its test may still be about to log.
struct Store {
  rt::Mutex mutex;
  std::vector<LogLine> lines;
};

Store& store() {
  static auto* the_store = new Store;
  return *the_store;
}

void captureLine(const LogHandle* /*handle*/, std::int32_t level, const char* category,
                 const char* format, std::span<const LogArgument> arguments) {
  LogLine line{level, category, format, formatLogLine(format, arguments)};
  const std::scoped_lock lock(store().mutex);
  store().lines.push_back(std::move(line));
}

}  // namespace

LogCapture::LogCapture(std::optional<std::int32_t> handle_level)
    : handle_level_(handle_level), previous_handle_(getLogHandle()) {
  clear();
  previous_write_ = gMOLogWrite.exchange(&captureLine);
  if (handle_level) handle_.level.store(*handle_level);
  setLogHandle(handle());
}

LogCapture::~LogCapture() {
  setLogHandle(previous_handle_);
  gMOLogWrite.store(previous_write_);
}

std::size_t LogCapture::countIf(const std::function<bool(const LogLine&)>& wanted) const {
  const std::scoped_lock lock(store().mutex);
  return static_cast<std::size_t>(
      std::count_if(store().lines.begin(), store().lines.end(), wanted));
}

bool LogCapture::contains(std::int32_t level, std::string_view text) const {
  return count(level, text) > 0;
}

std::size_t LogCapture::count(std::int32_t level, std::string_view text) const {
  return countIf([level, text](const LogLine& line) {
    return line.level == level && line.text.find(text) != std::string::npos;
  });
}

std::size_t LogCapture::countExact(std::int32_t level, std::string_view text) const {
  return countIf(
      [level, text](const LogLine& line) { return line.level == level && line.text == text; });
}

std::size_t LogCapture::countFormat(std::int32_t level, std::string_view format) const {
  return countIf([level, format](const LogLine& line) {
    return line.level == level && line.format == format;
  });
}

std::vector<LogLine> LogCapture::lines() const {
  const std::scoped_lock lock(store().mutex);
  return store().lines;
}

std::vector<std::string> LogCapture::texts(std::int32_t level) const {
  std::vector<std::string> found;
  for (LogLine& line : lines()) {
    if (line.level == level) found.push_back(std::move(line.text));
  }
  return found;
}

void LogCapture::clear() {
  const std::scoped_lock lock(store().mutex);
  store().lines.clear();
}

}  // namespace spacekeep::test
