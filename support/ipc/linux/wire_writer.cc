#include "support/ipc/linux/wire_writer.h"

#include <cstdint>
#include <cstring>
#include <string>
#include <type_traits>
#include <variant>

#include "support/ipc/linux/wire_text.h"

namespace spacekeep::ipc {

namespace {

const char* signatureOfValue(const Value& value) {
  struct Signature {
    const char* operator()(const std::string&) const { return "s"; }
    const char* operator()(bool) const { return "b"; }
    const char* operator()(std::int64_t) const { return "x"; }
    const char* operator()(std::uint64_t) const { return "t"; }
    const char* operator()(double) const { return "d"; }
    const char* operator()(const Data&) const { return "ay"; }
    const char* operator()(const Date&) const { return "(sx)"; }
    const char* operator()(const Array&) const { return "av"; }
    const char* operator()(const Dictionary&) const { return "a{sv}"; }
  };
  return std::visit(Signature{}, value.storage());
}

}  // namespace

bool WireWriter::write(const std::vector<ArgumentDescription>& described,
                       const Arguments& arguments) {
  if (!matches(described, arguments)) return false;
  for (std::size_t i = 0; i < described.size(); ++i) {
    if (!writeArgument(described[i].kind, arguments[i])) return false;
  }
  return true;
}

bool WireWriter::writeArgument(ArgumentKind kind, const Argument& argument) {
  switch (kind) {
    case ArgumentKind::kInt32:
      return writeBasic('i', std::get_if<std::int32_t>(&argument));
    case ArgumentKind::kString:
      return writeText(std::get<std::string>(argument));
    case ArgumentKind::kDictionary:
      return writeDictionary(std::get<Dictionary>(argument), 1);
    case ArgumentKind::kOptionalDictionary: {
      const auto& dictionary = std::get<OptionalDictionary>(argument);
      return open('a', "a{sv}") && (!dictionary || writeDictionary(*dictionary, 1)) && close();
    }
    case ArgumentKind::kOptionalValue: {
      const auto& value = std::get<OptionalValue>(argument);
      return open('a', "v") && (!value || writeVariant(*value, 0)) && close();
    }
    case ArgumentKind::kOptionalString: {
      const auto& text = std::get<OptionalString>(argument);
      return open('a', "s") && (!text || writeText(*text)) && close();
    }
    case ArgumentKind::kDescriptor: {
      const auto& descriptor = std::get<SharedDescriptor>(argument);
      if (descriptor == nullptr) return false;
      const int fd = descriptor->fd();
      return writeBasic('h', &fd);
    }
  }
  return false;
}

bool WireWriter::writeDictionary(const Dictionary& dictionary, int depth) {
  if (depth > kMaxValueDepth || !open('a', "{sv}")) return false;
  for (const Dictionary::Entry& entry : dictionary) {
    if (!open('e', "sv") || !writeText(entry.key) || !writeVariant(entry.value, depth) ||
        !close()) {
      return false;
    }
  }
  return close();
}

bool WireWriter::writeVariant(const Value& value, int depth) {
  return open('v', signatureOfValue(value)) && writeContent(value, depth) && close();
}

bool WireWriter::writeContent(const Value& value, int depth) {
  if (const Dictionary* dictionary = value.dictionary()) {
    return writeDictionary(*dictionary, depth + 1);
  }
  if (const Array* array = value.array()) {
    if (depth + 1 > kMaxValueDepth || !open('a', "v")) return false;
    for (const Value& element : *array) {
      if (!writeVariant(element, depth + 1)) return false;
    }
    return close();
  }
  if (const Data* data = value.data()) {
    count(4, 4 + data->bytes.size());
    return sd_bus_message_append_array(message_, 'y', data->bytes.data(), data->bytes.size()) >= 0;
  }
  if (const Date* date = value.date()) {
    return open('r', "sx") && writeText(kDateTag) && writeBasic('x', &date->unix_ns) && close();
  }
  if (const std::string* text = value.string()) return writeText(*text);
  if (const bool* truth = value.boolean()) {
    const int number = *truth ? 1 : 0;
    return writeBasic('b', &number);
  }
  const char type = signatureOfValue(value)[0];
  return std::visit([this, type](const auto& number) { return writeBasic(type, &number); },
                    value.storage());
}

bool WireWriter::writeText(std::string_view text) {
  const std::string sendable = wireText(text);
  count(4, 4 + sendable.size() + 1);
  return sd_bus_message_append_basic(message_, 's', sendable.c_str()) >= 0;
}

bool WireWriter::writeBasic(char type, const void* value) {
  const std::size_t size = type == 'x' || type == 't' || type == 'd' ? 8 : 4;
  count(size, size);
  return sd_bus_message_append_basic(message_, type, value) >= 0;
}

bool WireWriter::open(char type, const char* contents) {
  if (type == 'v') {
    count(1, 1 + std::strlen(contents) + 1);  // the signature
  } else if (type == 'a') {
    count(4, 4);
    count(contents[0] == '{' ? 8 : 1, 0);  // up to the first element
  } else {
    count(8, 0);
  }
  return sd_bus_message_open_container(message_, type, contents) >= 0;
}

bool WireWriter::close() { return sd_bus_message_close_container(message_) >= 0; }

/// As the D-Bus specification lays bodies out: padding to the alignment, then the bytes.
void WireWriter::count(std::size_t alignment, std::size_t bytes) {
  body_bytes_ = (body_bytes_ + alignment - 1) / alignment * alignment + bytes;
}

}  // namespace spacekeep::ipc
