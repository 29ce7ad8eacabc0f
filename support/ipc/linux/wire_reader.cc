#include "support/ipc/linux/wire_reader.h"

#include <fcntl.h>

#include <algorithm>
#include <cstdint>
#include <memory>
#include <string_view>
#include <utility>

#include "support/ipc/linux/wire_writer.h"

namespace spacekeep::ipc {

namespace {

const char* wordsFor(ArgumentKind kind) {
  switch (kind) {
    case ArgumentKind::kInt32:
      return "a 32-bit integer (i)";
    case ArgumentKind::kString:
      return "a string (s)";
    case ArgumentKind::kDictionary:
      return "a dictionary (a{sv})";
    case ArgumentKind::kOptionalDictionary:
      return "an array of no or one dictionary (aa{sv})";
    case ArgumentKind::kOptionalValue:
      return "an array of no or one value (av)";
    case ArgumentKind::kOptionalString:
      return "an array of no or one string (as)";
    case ArgumentKind::kDescriptor:
      return "a file descriptor (h)";
  }
  return "";
}

/// Length of the first complete type of a valid signature.
std::size_t firstTypeLength(std::string_view signature) {
  std::size_t length = 0;
  int open = 0;
  while (length < signature.size()) {
    const char c = signature[length++];
    if (c == '(' || c == '{') ++open;
    if (c == ')' || c == '}') --open;
    if (open == 0 && c != 'a') break;
  }
  return length;
}

/// Sorted first, so that no order of keys makes it slow. Of equal keys the last one stays.
Dictionary fromEntries(std::vector<Dictionary::Entry> entries) {
  std::stable_sort(entries.begin(), entries.end(),
                   [](const auto& a, const auto& b) { return a.key < b.key; });
  Dictionary dictionary;
  for (Dictionary::Entry& entry : entries) dictionary.set(entry.key, std::move(entry.value));
  return dictionary;
}

}  // namespace

std::nullopt_t WireReader::refuse(const char* why) {
  if (problem_.empty()) problem_ = why;
  return std::nullopt;
}

std::optional<Arguments> WireReader::read(const std::vector<ArgumentDescription>& described) {
  if (!checkSignature(described)) return std::nullopt;
  Arguments arguments;
  arguments.reserve(described.size());
  for (std::size_t i = 0; i < described.size(); ++i) {
    std::optional<Argument> argument = readArgument(described[i].kind);
    if (!argument) {
      problem_ = "argument " + std::to_string(i + 1) + " (" + std::string(described[i].name) +
                 ") " + (problem_.empty() ? "is malformed" : problem_);
      return std::nullopt;
    }
    arguments.push_back(std::move(*argument));
  }
  return arguments;
}

bool WireReader::checkSignature(const std::vector<ArgumentDescription>& described) {
  const char* text = sd_bus_message_get_signature(message_, 1);
  std::string_view rest = text == nullptr ? "" : text;
  for (std::size_t i = 0; i < described.size(); ++i) {
    const std::string_view given = rest.substr(0, firstTypeLength(rest));
    if (given != signatureOf(described[i].kind)) {
      problem_ = "argument " + std::to_string(i + 1) + " (" + std::string(described[i].name) +
                 ") should be " + wordsFor(described[i].kind) + ", not " +
                 (given.empty() ? "absent" : std::string(given));
      return false;
    }
    rest.remove_prefix(given.size());
  }
  if (!rest.empty()) {
    problem_ = "there should be " + std::to_string(described.size()) + " arguments, not more";
  }
  return rest.empty();
}

std::optional<Argument> WireReader::readArgument(ArgumentKind kind) {
  switch (kind) {
    case ArgumentKind::kInt32: {
      std::int32_t number = 0;
      if (sd_bus_message_read_basic(message_, 'i', &number) <= 0) return malformed();
      return Argument(number);
    }
    case ArgumentKind::kString: {
      auto text = readText('s');
      return text ? std::optional<Argument>(std::move(*text)) : std::nullopt;
    }
    case ArgumentKind::kDictionary: {
      auto dictionary = readDictionary("{sv}", 1);
      return dictionary ? std::optional<Argument>(std::move(*dictionary)) : std::nullopt;
    }
    case ArgumentKind::kOptionalDictionary:
      return readOptional<Dictionary>("a{sv}", [this] { return readDictionary("{sv}", 1); });
    case ArgumentKind::kOptionalValue:
      return readOptional<Value>("v", [this] { return readValue(0); });
    case ArgumentKind::kOptionalString:
      return readOptional<std::string>("s", [this] { return readText('s'); });
    case ArgumentKind::kDescriptor:
      return readDescriptor();
  }
  return std::nullopt;
}

template <class Element, class Read>
std::optional<Argument> WireReader::readOptional(const char* contents, Read read) {
  if (sd_bus_message_enter_container(message_, 'a', contents) <= 0) return malformed();
  std::optional<Element> element;
  if (sd_bus_message_at_end(message_, 0) == 0) {
    element = read();
    if (!element) return std::nullopt;
    if (sd_bus_message_at_end(message_, 0) == 0) return refuse("should have at most one element");
  }
  if (sd_bus_message_exit_container(message_) < 0) return malformed();
  return Argument(std::move(element));
}

std::optional<Argument> WireReader::readDescriptor() {
  int fd = -1;
  if (sd_bus_message_read_basic(message_, 'h', &fd) <= 0) return malformed();
  // What becomes of a call with a useless endpoint is for its handler to say.
  if (std::string wrong = endpointProblem(fd, rules_); !wrong.empty()) {
    return Argument(std::make_shared<Descriptor>(std::move(wrong)));
  }
  const int own = ::fcntl(fd, F_DUPFD_CLOEXEC, 3);
  if (own < 0) return refuse("cannot be kept: this process has no descriptor left");
  return Argument(std::make_shared<Descriptor>(own));
}

std::optional<std::string> WireReader::readText(char type) {
  const char* text = nullptr;
  if (sd_bus_message_read_basic(message_, type, &text) <= 0) return malformed();
  return std::string(text);
}

template <class Wire, class Number>
std::optional<Value> WireReader::readAs(char type) {
  Wire number{};
  if (sd_bus_message_read_basic(message_, type, &number) <= 0) return malformed();
  return Value(static_cast<Number>(number));
}

std::optional<Value> WireReader::readNumber(char type) {
  switch (type) {
    case 'y':
      return readAs<std::uint8_t, std::uint64_t>(type);
    case 'n':
      return readAs<std::int16_t, std::int64_t>(type);
    case 'q':
      return readAs<std::uint16_t, std::uint64_t>(type);
    case 'i':
      return readAs<std::int32_t, std::int64_t>(type);
    case 'u':
      return readAs<std::uint32_t, std::uint64_t>(type);
    case 'x':
      return readAs<std::int64_t, std::int64_t>(type);
    case 't':
      return readAs<std::uint64_t, std::uint64_t>(type);
    case 'd':
      return readAs<double, double>(type);
    case 'b':
      return readAs<int, bool>(type);
    default:
      return refuse("holds a type that no value can have");
  }
}

std::optional<Value> WireReader::readValue(int depth, int wrappings) {
  if (wrappings > kMaxValueDepth) return refuse("is nested too deep");
  if (++values_ > kMaxValuesInMessage) return refuse("holds too many values");
  char type = 0;
  const char* contents = nullptr;
  if (sd_bus_message_peek_type(message_, &type, &contents) <= 0) return malformed();
  switch (type) {
    case 's':
    case 'o':
    case 'g': {
      auto text = readText(type);
      return text ? std::optional<Value>(std::move(*text)) : std::nullopt;
    }
    case 'v': {
      if (sd_bus_message_enter_container(message_, 'v', contents) <= 0) return malformed();
      auto inner = readValue(depth, wrappings + 1);
      if (inner && sd_bus_message_exit_container(message_) < 0) return malformed();
      return inner;
    }
    case 'a':
      return readArray(contents, depth + 1);
    case 'r':
      return readDate(contents);
    case 'h':
      return refuse("holds a descriptor inside a value");
    default:
      return readNumber(type);
  }
}

std::optional<Value> WireReader::readArray(const char* contents, int depth) {
  if (std::string_view(contents) == "y") {  // nests nothing, so that its depth does not count
    const void* bytes = nullptr;
    std::size_t size = 0;
    if (sd_bus_message_read_array(message_, 'y', &bytes, &size) < 0) return malformed();
    const auto* first = static_cast<const std::uint8_t*>(bytes);
    return Value(size == 0 ? Data{} : Data{{first, first + size}});
  }
  if (depth > kMaxValueDepth) return refuse("is nested too deep");
  if (contents[0] == '{') {
    auto dictionary = readDictionary(contents, depth);
    return dictionary ? std::optional<Value>(std::move(*dictionary)) : std::nullopt;
  }
  if (sd_bus_message_enter_container(message_, 'a', contents) <= 0) return malformed();
  Array array;
  int at_end = 0;
  while ((at_end = sd_bus_message_at_end(message_, 0)) == 0) {
    auto element = readValue(depth);
    if (!element) return std::nullopt;
    array.push_back(std::move(*element));
  }
  if (at_end < 0 || sd_bus_message_exit_container(message_) < 0) return malformed();
  return Value(std::move(array));
}

std::optional<Value> WireReader::readDate(const char* contents) {
  if (std::string_view(contents) != "sx") return refuse("holds a structure");
  if (sd_bus_message_enter_container(message_, 'r', contents) <= 0) return malformed();
  const auto tag = readText('s');
  std::int64_t unix_ns = 0;
  if (!tag || sd_bus_message_read_basic(message_, 'x', &unix_ns) <= 0 ||
      sd_bus_message_exit_container(message_) < 0) {
    return malformed();
  }
  if (*tag != kDateTag) return refuse("holds a structure");
  return Value(Date{unix_ns});
}

std::optional<Dictionary> WireReader::readDictionary(const char* contents, int depth) {
  if (depth > kMaxValueDepth) return refuse("is nested too deep");
  if (contents[1] != 's') return refuse("holds a dictionary whose keys are not strings");
  if (sd_bus_message_enter_container(message_, 'a', contents) <= 0) return malformed();
  const std::string entry(contents + 1, std::string_view(contents).size() - 2);
  std::vector<Dictionary::Entry> entries;
  int at_end = 0;
  while ((at_end = sd_bus_message_at_end(message_, 0)) == 0) {
    if (!readEntry(entries, entry.c_str(), depth)) return std::nullopt;
  }
  if (at_end < 0 || sd_bus_message_exit_container(message_) < 0) return malformed();
  return fromEntries(std::move(entries));
}

bool WireReader::readEntry(std::vector<Dictionary::Entry>& entries, const char* contents,
                           int depth) {
  if (sd_bus_message_enter_container(message_, 'e', contents) <= 0) {
    malformed();
    return false;
  }
  auto key = readText('s');
  if (!key) return false;
  auto value = readValue(depth);
  if (!value) return false;
  entries.push_back({std::move(*key), std::move(*value)});
  if (sd_bus_message_exit_container(message_) >= 0) return true;
  malformed();
  return false;
}

}  // namespace spacekeep::ipc
