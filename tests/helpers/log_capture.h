// Thread safety: every member may be called from any thread; one capture at a time.
//
// Collects the log lines of a test. While it lives, every line goes to it and not to the default
// writer, and the process has a log handle of the chosen level (or none).
#pragma once

#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "support/logging/log.h"

namespace spacekeep::test {

struct LogLine {
  std::int32_t level = 0;
  std::string category;
  std::string format;  ///< as the caller wrote it, placeholders and all
  std::string text;    ///< with the placeholders filled
};

class LogCapture {
 public:
  /// None: no log handle, as in a process that has not set up logging.
  explicit LogCapture(std::optional<std::int32_t> handle_level = kLogTrace);
  ~LogCapture();
  LogCapture(const LogCapture&) = delete;
  LogCapture& operator=(const LogCapture&) = delete;

  /// A line of that level whose text holds `text`.
  [[nodiscard]] bool contains(std::int32_t level, std::string_view text) const;
  /// How many lines of that level have a text that holds `text`.
  [[nodiscard]] std::size_t count(std::int32_t level, std::string_view text) const;
  /// How many lines of that level have exactly that text.
  [[nodiscard]] std::size_t countExact(std::int32_t level, std::string_view text) const;
  /// How many lines of that level were written with exactly that format.
  [[nodiscard]] std::size_t countFormat(std::int32_t level, std::string_view format) const;
  [[nodiscard]] std::vector<LogLine> lines() const;
  /// The texts alone, in order, of one level.
  [[nodiscard]] std::vector<std::string> texts(std::int32_t level) const;
  void clear();
  LogHandle* handle() { return handle_level_ ? &handle_ : nullptr; }

 private:
  [[nodiscard]] std::size_t countIf(const std::function<bool(const LogLine&)>& wanted) const;

  LogHandle handle_;
  std::optional<std::int32_t> handle_level_;
  LogHandle* previous_handle_;
  LogWrite previous_write_;
};

}  // namespace spacekeep::test
