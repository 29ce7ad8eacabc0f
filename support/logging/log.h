// Thread safety: every function may be called from any thread at any time; gMOLogWrite may be
// replaced at any time.
//
// Log lines. Two levels are used: 3 for problems (refusals, failures, timeouts, low space) and 5
// for tracing (entry and exit, progress, results). Every format begins with "%s ", which is filled
// with the name of the reporting operation.
#pragma once

#include <atomic>
#include <concepts>
#include <cstdint>
#include <initializer_list>
#include <limits>
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

/// The process-wide log-write entry. Starts as writeLogLine; the Linux half puts the journal in
/// its place where there is one (installPlatformLog()), or a writer that does not wait.
extern std::atomic<LogWrite> gMOLogWrite;

/// One line as it is written where nothing but text can be, with its line feed.
[[nodiscard]] std::string logLineText(std::int32_t level, const char* category, const char* format,
                                      std::span<const LogArgument> arguments);

/// The default writer: one line to standard error. It waits where that is full, and what happens
/// where that is closed (SIGPIPE) is for the program to say, since a library is not to change it.
void writeLogLine(const LogHandle* handle, std::int32_t level, const char* category,
                  const char* format, std::span<const LogArgument> arguments);

/// Fills `format`. A placeholder without an argument is left as it stands; numbers print as
/// printf(3) prints them in the "C" locale; texts are made one line (lineOf). An argument of
/// another kind than its placeholder prints as its own kind.
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
  } else if constexpr (std::is_convertible_v<const T&, const Dictionary*>) {
    return LogArgument{static_cast<const Dictionary*>(value)};
  } else if constexpr (std::is_pointer_v<T>) {
    return LogArgument{value == nullptr ? std::string_view("(none)") : std::string_view(value)};
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

template <class T>
inline constexpr bool kIsText = std::is_convertible_v<const T&, std::string_view>;

/// Called, and so named by the compiler, when a log call does not fit its format. Never defined.
void logFormatHasTooManyPlaceholdersOrAnUnknownOne();
void logFormatDoesNotFitItsArguments();
void logFormatLeavesArgumentsUnused();

/// Length of the placeholder at `text` ("%llu" gives 4), 0 when it is none that formatLogLine
/// knows.
constexpr std::size_t placeholderLength(std::string_view text) {
  for (const std::string_view known : {"%s", "%d", "%u", "%f", "%@", "%lld", "%llu", "%%"}) {
    if (text.substr(0, known.size()) == known) return known.size();
  }
  return 0;
}

template <class T>
constexpr bool fits(std::string_view placeholder) {
  if (placeholder == "%@") return true;
  if (placeholder == "%s") return kIsText<T>;
  if (placeholder == "%f") return std::is_floating_point_v<T>;
  if constexpr (std::is_integral_v<T>) {
    return placeholder.size() == 4 || std::numeric_limits<T>::digits <= 32;
  }
  return false;
}

/// A format that was checked against the types of its arguments when it was compiled.
template <class... Arguments>
class CheckedFormat {
 public:
  template <class Text>
  requires std::convertible_to<const Text&, const char*>
  consteval CheckedFormat(const Text& text) : text_(text) {  // NOLINT: literals convert
    std::string_view rest = text_;
    const bool each_fits = (nextFits<Arguments>(rest) && ...);
    if (!each_fits) logFormatDoesNotFitItsArguments();
    if (!nextPlaceholder(rest).empty()) logFormatHasTooManyPlaceholdersOrAnUnknownOne();
  }
  [[nodiscard]] constexpr const char* text() const { return text_; }

 private:
  // The next placeholder that takes an argument, empty when there is none. Moves past it.
  static constexpr std::string_view nextPlaceholder(std::string_view& rest) {
    while (true) {
      const std::size_t start = rest.find('%');
      if (start == std::string_view::npos) return {};
      rest.remove_prefix(start);
      const std::size_t length = placeholderLength(rest);
      if (length == 0) logFormatHasTooManyPlaceholdersOrAnUnknownOne();
      const std::string_view found = rest.substr(0, length);
      rest.remove_prefix(length);
      if (found != "%%") return found;
    }
  }

  template <class T>
  static constexpr bool nextFits(std::string_view& rest) {
    const std::string_view placeholder = nextPlaceholder(rest);
    if (placeholder.empty()) logFormatLeavesArgumentsUnused();
    return fits<T>(placeholder);
  }

  const char* text_;
};

template <class... Arguments>
using Format = CheckedFormat<const char*, std::type_identity_t<Arguments>...>;

template <class... Arguments>
void write(const LogHandle* handle, std::int32_t level, const char* format,
           const Arguments&... arguments) {
  const LogArgument list[] = {argument(arguments)...};
  gMOLogWrite.load(std::memory_order_acquire)(handle, level, kLogCategory, format,
                                              std::span(list, sizeof...(arguments)));
}

}  // namespace log_internal

/// Level 5. The format is a literal; a placeholder that does not fit its argument, is missing or is
/// left over is a compile error. `operation` is the name of the reporting operation and fills the
/// leading "%s ".
template <class... Arguments>
void logTrace(log_internal::Format<Arguments...> format, const char* operation,
              const Arguments&... arguments) {
  const LogHandle* handle = getLogHandle();
  if (!shouldLogTrace(handle)) return;
  log_internal::write(handle, kLogTrace, format.text(), std::string_view(operation), arguments...);
}

/// Level 3, otherwise as logTrace.
template <class... Arguments>
void logProblem(log_internal::Format<Arguments...> format, const char* operation,
                const Arguments&... arguments) {
  const LogHandle* handle = getLogHandle();
  if (!shouldLogProblem(handle)) return;
  log_internal::write(handle, kLogProblem, format.text(), std::string_view(operation),
                      arguments...);
}

}  // namespace spacekeep
