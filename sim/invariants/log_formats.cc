#include "sim/invariants/log_formats.h"

#include "support/values/text.h"

namespace spacekeep::sim::formats {

std::string textField(const LogLine& line, std::size_t index) {
  if (index >= line.fields.size()) return {};
  if (const auto* text = std::get_if<std::string>(&line.fields[index])) return *text;
  if (const auto* value = std::get_if<Value>(&line.fields[index])) return textOf(*value);
  return {};
}

std::uint64_t numberField(const LogLine& line, std::size_t index) {
  if (index >= line.fields.size()) return 0;
  if (const auto* number = std::get_if<std::uint64_t>(&line.fields[index])) return *number;
  if (const auto* number = std::get_if<std::int64_t>(&line.fields[index])) {
    return static_cast<std::uint64_t>(*number);
  }
  return 0;
}

Dictionary dictionaryField(const LogLine& line, std::size_t index) {
  if (index >= line.fields.size()) return {};
  const auto* value = std::get_if<Value>(&line.fields[index]);
  const Dictionary* dictionary = value == nullptr ? nullptr : value->dictionary();
  return dictionary == nullptr ? Dictionary() : *dictionary;
}

}  // namespace spacekeep::sim::formats
