#include "support/logging/log.h"

#include <algorithm>
#include <charconv>
#include <cstdio>
#include <string>

#include "support/values/text.h"

namespace spacekeep {
namespace {

constinit std::atomic<LogHandle*> log_handle{nullptr};

template <class Number>
std::string digitsOf(Number number) {
  char digits[24];
  const auto end = std::to_chars(digits, digits + sizeof(digits), number).ptr;
  return std::string(digits, end);
}

// std::to_chars and not snprintf: the result must not depend on the process's locale.
std::string sixDecimals(double number) {
  char digits[400];  // the largest double has 309 digits before the point
  const auto end =
      std::to_chars(digits, digits + sizeof(digits), number, std::chars_format::fixed, 6).ptr;
  return std::string(digits, end);
}

// Integers go through the width and signedness of the placeholder, as they do in printf(3).
std::string integerText(std::string_view placeholder, std::uint64_t bits) {
  if (placeholder == "%d") return digitsOf(static_cast<std::int32_t>(bits));
  if (placeholder == "%u") return digitsOf(static_cast<std::uint32_t>(bits));
  if (placeholder == "%lld") return digitsOf(static_cast<std::int64_t>(bits));
  return digitsOf(bits);
}

struct ArgumentText {
  std::string_view placeholder;

  std::string operator()(std::int64_t number) const {
    if (placeholder == "%f") return sixDecimals(static_cast<double>(number));
    if (placeholder == "%@" || placeholder == "%s") return digitsOf(number);
    return integerText(placeholder, static_cast<std::uint64_t>(number));
  }
  std::string operator()(std::uint64_t number) const {
    if (placeholder == "%f") return sixDecimals(static_cast<double>(number));
    return integerText(placeholder, number);
  }
  std::string operator()(double number) const {
    return placeholder == "%@" ? textOf(Value(number)) : sixDecimals(number);
  }
  std::string operator()(std::string_view text) const { return lineOf(text); }
  std::string operator()(const Value* value) const { return textOf(value); }
  std::string operator()(const Dictionary* dictionary) const {
    return dictionary == nullptr ? "(none)" : textOf(*dictionary);
  }
};

}  // namespace

constinit std::atomic<LogWrite> gMOLogWrite{&writeLogLine};

LogHandle* getLogHandle() { return log_handle.load(std::memory_order_acquire); }

void setLogHandle(LogHandle* handle) { log_handle.store(handle, std::memory_order_release); }

std::string formatLogLine(const char* format, std::span<const LogArgument> arguments) {
  std::string line;
  std::string_view rest = format;
  while (!rest.empty()) {
    const std::size_t plain = std::min(rest.find('%'), rest.size());
    line += rest.substr(0, plain);
    rest.remove_prefix(plain);
    if (rest.empty()) break;
    const std::size_t length = log_internal::placeholderLength(rest);
    const std::string_view placeholder = rest.substr(0, length == 0 ? 1 : length);
    rest.remove_prefix(placeholder.size());
    if (placeholder == "%%") {
      line += '%';
    } else if (length == 0 || arguments.empty()) {
      line += placeholder;
    } else {
      line += std::visit(ArgumentText{placeholder}, arguments.front());
      arguments = arguments.subspan(1);
    }
  }
  return line;
}

std::string logLineText(std::int32_t level, const char* category, const char* format,
                        std::span<const LogArgument> arguments) {
  return std::string(category) + '[' + digitsOf(level) + "] " + formatLogLine(format, arguments) +
         '\n';
}

void writeLogLine(const LogHandle* /*handle*/, std::int32_t level, const char* category,
                  const char* format, std::span<const LogArgument> arguments) {
  const std::string line = logLineText(level, category, format, arguments);
  // One call for the whole line: stdio locks the stream, so lines of several threads never mix.
  // A standard error that takes nothing leaves nothing to tell anybody.
  static_cast<void>(std::fwrite(line.data(), 1, line.size(), stderr));
}

}  // namespace spacekeep
