#include "ctl/number_text.h"

#include <charconv>
#include <cmath>
#include <cstdint>

namespace spacekeep::ctl {
namespace {

template <class Number>
std::optional<Number> wholeTextAs(std::string_view text) {
  Number number{};
  const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number);
  if (error != std::errc() || end != text.data() + text.size()) return std::nullopt;
  return number;
}

struct Form {
  bool integer = false;
  bool exponent = false;
};

std::size_t takeDigits(std::string_view& rest) {
  std::size_t count = 0;
  while (count < rest.size() && rest[count] >= '0' && rest[count] <= '9') ++count;
  rest.remove_prefix(count);
  return count;
}

/// The grammar of JSON's numbers, none when `text` does not follow it.
std::optional<Form> formOf(std::string_view text) {
  Form form{.integer = true, .exponent = false};
  if (text.starts_with('-')) text.remove_prefix(1);
  const bool leading_zero = text.starts_with('0');
  const std::size_t whole = takeDigits(text);
  if (whole == 0 || (leading_zero && whole > 1)) return std::nullopt;
  if (text.starts_with('.')) {
    form.integer = false;
    text.remove_prefix(1);
    if (takeDigits(text) == 0) return std::nullopt;
  }
  if (text.starts_with('e') || text.starts_with('E')) {
    form = {.integer = false, .exponent = true};
    text.remove_prefix(1);
    if (text.starts_with('+') || text.starts_with('-')) text.remove_prefix(1);
    if (takeDigits(text) == 0) return std::nullopt;
  }
  return text.empty() ? std::optional(form) : std::nullopt;
}

std::optional<Value> integerIn(std::string_view text) {
  if (const auto number = wholeTextAs<std::int64_t>(text)) return Value(*number);
  if (const auto number = wholeTextAs<std::uint64_t>(text)) return Value(*number);
  return std::nullopt;
}

std::optional<Value> floatingIn(std::string_view text) {
  const auto number = wholeTextAs<double>(text);
  return number && std::isfinite(*number) ? std::optional<Value>(*number) : std::nullopt;
}

}  // namespace

std::optional<Value> plainNumber(std::string_view text) {
  const auto form = formOf(text);
  if (!form || form->exponent) return std::nullopt;
  return form->integer ? integerIn(text) : floatingIn(text);
}

std::optional<Value> jsonNumber(std::string_view text) {
  const auto form = formOf(text);
  if (!form) return std::nullopt;
  if (form->integer) {
    if (auto number = integerIn(text)) return number;
  }
  return floatingIn(text);
}

}  // namespace spacekeep::ctl
