// Thread safety: every function may be called from any thread at any time; gMOLogWrite may be
// replaced at any time.
//
// Log lines. Two levels are used: 3 for problems (refusals, failures, timeouts, low space) and 5 for
// tracing (entry and exit, progress, results). Every format begins with "%s ", which is filled with
// the name of the reporting operation.
#pragma once

#include <atomic>
#include <concepts>
#include <cstdint>
#include <span>
#include <string>
#include <string_view>
#include <type_traits>
#include <variant>

#include "support/values/value.h"

namespace spacekeep {

inline constexpr std::int32_t kLogProblem = 3;
inline constexpr std::int32_t kLogTrace = 5;
inline constexpr const char* kLogCategory = "Spacekeep";

struct LogHandle {
  std::atomic<std::int32_t> level{4};
};

/// The process's log handle, or null when logging is not set up.
[[nodiscard]] LogHandle* getLogHandle();
/// Null takes logging down again. The handle must live until it is replaced and no thread logs.
void setLogHandle(LogHandle* handle);

/// One argument of a log format. `%s` takes a C string or text, `%d` 32-bit, `%lld` and `%llu`
/// 64-bit, `%u` unsigned 32-bit, `%f` double, `%@` the text form of a value, a dictionary, a string
/// or a null pointer. Refers to what it was made from.
using LogArgument = std::variant<std::int64_t, std::uint64_t, double, std::string_view,
                                 const Value*, const Dictionary*>;

/// Writes one line. `format` and `arguments` are good only during the call.
using LogWrite = void (*)(const LogHandle* handle, std::int32_t level, const char* category,
                          const char* format, std::span<const LogArgument> arguments);

/// The process-wide log-write entry. Starts as the platform's own writer (journal, else standard
/// error).
extern std::atomic<LogWrite> gMOLogWrite;

/// The default writer.
void writeLogLine(const LogHandle* handle, std::int32_t level, const char* category,
                  const char* format, std::span<const LogArgument> arguments);

/// Fills `format`. A placeholder without an argument is left as it stands; doubles print as %f does.
[[nodiscard]] std::string formatLogLine(const char* format, std::span<const LogArgument> arguments);

/// Tracing goes out without a handle, or when the handle's level is above 4.
[[nodiscard]] inline bool shouldLogTrace(const LogHandle* handle) {
  return handle == nullptr || handle->level.load(std::memory_order_relaxed) > 4;
}
/// Problems go out only with a handle whose level is above 2. Without a handle tracing still goes
/// out and problems do not: this asymmetry is intended.
[[nodiscard]] inline bool shouldLogProblem(const LogHandle* handle) {
  return handle != nullptr && handle->level.load(std::memory_order_relaxed) > 2;
}

namespace log_internal {

template <class T>
LogArgument argument(const T& value) {
  if constexpr (std::is_same_v<T, Value>) {
    return LogArgument{&value};
  } else if constexpr (std::is_same_v<T, Dictionary>) {
    return LogArgument{&value};
  } else if constexpr (std::is_convertible_v<const T&, const Value*>) {
    return LogArgument{static_cast<const Value*>(value)};
  } else if constexpr (std::is_floating_point_v<T>) {
    return LogArgument{static_cast<double>(value)};
  } else if constexpr (std::is_integral_v<T> && std::is_signed_v<T>) {
    return LogArgument{static_cast<std::int64_t>(value)};
  } else if constexpr (std::is_integral_v<T>) {
    return LogArgument{static_cast<std::uint64_t>(value)};
  } else {
    return LogArgument{std::string_view(value)};
  }
}

template <class... Arguments>
void write(const LogHandle* handle, std::int32_t level, const char* format,
           const Arguments&... arguments) {
  const LogArgument list[] = {argument(arguments)...};
  gMOLogWrite.load(std::memory_order_acquire)(handle, level, kLogCategory, format, list);
}

}  // namespace log_internal

/// Level 5. `operation` is the name of the reporting operation and fills the leading "%s ".
template <class... Arguments>
void logTrace(const char* format, const char* operation, const Arguments&... arguments) {
  const LogHandle* handle = getLogHandle();
  if (!shouldLogTrace(handle)) return;
  log_internal::write(handle, kLogTrace, format, std::string_view(operation), arguments...);
}

/// Level 3, otherwise as logTrace.
template <class... Arguments>
void logProblem(const char* format, const char* operation, const Arguments&... arguments) {
  const LogHandle* handle = getLogHandle();
  if (!shouldLogProblem(handle)) return;
  log_internal::write(handle, kLogProblem, format, std::string_view(operation), arguments...);
}

}  // namespace spacekeep
