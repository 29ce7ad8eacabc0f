// What people write on the command line of the tool: sizes, values of the state, JSON.
#include <array>
#include <cstddef>
#include <cstdint>
#include <string>
#include <variant>

#include "ctl/json_parse.h"
#include "ctl/json_text.h"
#include "ctl/number_text.h"
#include "ctl/size_text.h"
#include "ctl/state_value.h"
#include "fuzz/helpers/promises.h"
#include "support/values/text.h"

namespace spacekeep::fuzz {
namespace {

void asSize(const std::string& text) {
  const auto parsed = ctl::parseSize(text);
  const auto* bytes = std::get_if<std::uint64_t>(&parsed);
  if (bytes == nullptr) {
    require(isOneLine(std::get<ctl::SizeError>(parsed).text), "a refusal is one line");
    return;
  }
  const auto shown = ctl::parseSize(ctl::printSize(*bytes));
  const auto* read = std::get_if<std::uint64_t>(&shown);
  const bool beyond_units = *bytes >= std::uint64_t{1} << 60;
  require(read != nullptr || beyond_units, "a size that is shown can be typed in");
  require(read == nullptr || *read <= *bytes, "a size is never shown as more than it is");
}

void asJson(const std::string& text) {
  const auto parsed = ctl::parseJson(text);
  const auto* value = std::get_if<Value>(&parsed);
  if (value == nullptr) {
    require(!std::get<ctl::JsonError>(parsed).text.empty(), "a refusal says why");
    return;
  }
  const std::string written = ctl::jsonOf(*value);
  require(written.find('\n') == std::string::npos, "JSON is written as one line");
  const auto again = ctl::parseJson(written);
  const auto* read = std::get_if<Value>(&again);
  require(read != nullptr, "JSON that was written can be read");
  require(*read == *value, "JSON keeps its value");
}

void asStateValue(const std::string& text) {
  using enum ctl::ValueType;
  for (const ctl::ValueType type : {kGuessed, kString, kNumber, kBool, kSize, kJson}) {
    const auto parsed = ctl::parseStateValue(text, type);
    const auto* value = std::get_if<Value>(&parsed);
    require(type != kString || value != nullptr || !isUtf8(text), "every UTF-8 text is a string");
    if (value == nullptr) {
      require(isOneLine(std::get<ctl::ValueError>(parsed).text), "a refusal is one line");
      continue;
    }
    require(type != kNumber || value->isNumber(), "a number is a number");
    require(type != kBool || value->boolean() != nullptr, "a boolean is a boolean");
    require(isOneLine(ctl::printStateValue(*value)), "a value is shown as one line");
    require(!ctl::kindText(*value).empty(), "a value has a kind");
  }
}

void asNumber(const std::string& text) {
  for (const auto& number : {ctl::plainNumber(text), ctl::jsonNumber(text)}) {
    if (!number) continue;
    require(number->isNumber(), "a number is a number");
    const double real = number->asDouble().value_or(0);
    require(real - real == 0, "a number is finite");
  }
}

}  // namespace
}  // namespace spacekeep::fuzz

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  const std::string text = spacekeep::fuzz::textOfInput(data, size);
  spacekeep::fuzz::asSize(text);
  spacekeep::fuzz::asJson(text);
  spacekeep::fuzz::asStateValue(text);
  spacekeep::fuzz::asNumber(text);
  return 0;
}
