#include "ctl/state_value.h"

#include <fmt/core.h>

#include <optional>

#include "ctl/json_parse.h"
#include "ctl/number_text.h"
#include "ctl/size_text.h"
#include "support/values/text.h"

namespace spacekeep::ctl {
namespace {

using Parsed = std::variant<Value, ValueError>;

std::optional<Value> boolean(std::string_view text) {
  if (text == "true") return Value(true);
  if (text == "false") return Value(false);
  return std::nullopt;
}

std::optional<Value> size(std::string_view text) {
  const auto bytes = parseSize(text);
  const auto* number = std::get_if<std::uint64_t>(&bytes);
  return number == nullptr ? std::nullopt : std::optional<Value>(*number);
}

Value guessed(std::string_view text) {
  if (auto value = boolean(text)) return std::move(*value);
  if (auto value = plainNumber(text)) return std::move(*value);
  if (auto value = size(text)) return std::move(*value);
  return Value(text);
}

Parsed sizeOrError(std::string_view text) {
  const auto bytes = parseSize(text);
  if (const auto* error = std::get_if<SizeError>(&bytes)) return ValueError{error->text};
  return Value(std::get<std::uint64_t>(bytes));
}

Parsed jsonOrError(std::string_view text) {
  auto value = parseJson(text);
  if (const auto* error = std::get_if<JsonError>(&value)) {
    return ValueError{fmt::format("\"{}\" is no JSON: {}", lineOf(text), error->text)};
  }
  return std::get<Value>(std::move(value));
}

Parsed orError(std::optional<Value> value, std::string_view text, std::string_view wanted) {
  if (value) return std::move(*value);
  return ValueError{fmt::format("\"{}\" is {}", lineOf(text), wanted)};
}

}  // namespace

std::variant<Value, ValueError> parseStateValue(std::string_view text, ValueType type) {
  if (!isUtf8(text)) return ValueError{fmt::format("\"{}\" is no UTF-8", lineOf(text))};
  switch (type) {
    case ValueType::kGuessed:
      return guessed(text);
    case ValueType::kString:
      return Value(text);
    case ValueType::kNumber:
      return orError(plainNumber(text), text,
                     "no number. Numbers look like 12, -3 or 0.25, and integers have at most 64 "
                     "bits");
    case ValueType::kBool:
      return orError(boolean(text), text, "no boolean: write true or false");
    case ValueType::kSize:
      return sizeOrError(text);
    case ValueType::kJson:
      return jsonOrError(text);
  }
  return guessed(text);
}

std::string printStateValue(const Value& value) {
  if (const Data* data = value.data()) {
    const std::size_t count = data->bytes.size();
    return fmt::format("<{} byte{}>", count, count == 1 ? "" : "s");
  }
  return textOf(value);
}

std::string kindText(const Value& value) {
  if (value.string() != nullptr) return "a string";
  if (value.boolean() != nullptr) return "a boolean";
  if (value.data() != nullptr) return "data";
  if (value.date() != nullptr) return "a date";
  if (value.array() != nullptr) return "an array";
  if (value.dictionary() != nullptr) return "a dictionary";
  return "a number";
}

}  // namespace spacekeep::ctl
