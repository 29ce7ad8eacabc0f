#include "ctl/json_parse.h"

#include <fmt/core.h>

#include <charconv>
#include <cmath>
#include <cstdint>
#include <optional>
#include <utility>

#include "ctl/number_text.h"
#include "support/values/text.h"

namespace spacekeep::ctl {
namespace {

constexpr std::string_view kSpace = " \t\n\r";

void appendUtf8(std::string& out, std::uint32_t point) {
  const auto tail = [](std::uint32_t bits) { return static_cast<char>(0x80 | (bits & 0x3F)); };
  if (point < 0x80) {
    out += static_cast<char>(point);
  } else if (point < 0x800) {
    out += {static_cast<char>(0xC0 | point >> 6), tail(point)};
  } else if (point < 0x10000) {
    out += {static_cast<char>(0xE0 | point >> 12), tail(point >> 6), tail(point)};
  } else {
    out +=
        {static_cast<char>(0xF0 | point >> 18), tail(point >> 12), tail(point >> 6), tail(point)};
  }
}

/// Recursive descent, as deep as kMaxValueDepth. What answers none or false has said why.
class Parser {
 public:
  explicit Parser(std::string_view text) : text_(text) {}

  std::variant<Value, JsonError> parse() {
    auto value = readValue(0);
    skipSpace();
    if (value && at_ != text_.size()) fail("there is more behind the value");
    if (!error_.empty() || !value) return JsonError{error_};
    return std::move(*value);
  }

 private:
  std::nullopt_t fail(std::string_view what) {
    if (error_.empty()) error_ = fmt::format("{} (byte {})", what, at_);
    return std::nullopt;
  }
  bool refuse(std::string_view what) {
    fail(what);
    return false;
  }
  void skipSpace() {
    while (at_ < text_.size() && kSpace.find(text_[at_]) != std::string_view::npos) ++at_;
  }
  [[nodiscard]] char peek() const { return at_ < text_.size() ? text_[at_] : '\0'; }
  bool take(char wanted) {
    if (peek() != wanted || at_ == text_.size()) return false;
    ++at_;
    return true;
  }
  bool takeAfterSpace(char wanted) {
    skipSpace();
    return take(wanted);
  }
  bool takeWord(std::string_view word) {
    if (!text_.substr(at_).starts_with(word)) return false;
    at_ += word.size();
    return true;
  }

  std::optional<Value> readValue(int depth) {
    skipSpace();
    if (at_ == text_.size()) return fail("a value is missing");
    if (peek() == '[' || peek() == '{') return readContainer(depth);
    if (peek() == '"') {
      auto text = readString();
      return text ? std::optional<Value>(std::move(*text)) : std::nullopt;
    }
    if (takeWord("true")) return Value(true);
    if (takeWord("false")) return Value(false);
    if (text_.substr(at_).starts_with("null")) {
      return fail("null is no value; \"state unset\" removes a key");
    }
    return readNumber();
  }

  std::optional<Value> readContainer(int depth) {
    if (depth == kMaxValueDepth) {
      return fail(fmt::format("it is nested deeper than {}", kMaxValueDepth));
    }
    return take('[') ? readArray(depth) : readDictionary(depth);
  }

  std::optional<Value> readArray(int depth) {
    Array array;
    if (takeAfterSpace(']')) return Value(std::move(array));
    do {
      auto element = readValue(depth + 1);
      if (!element) return std::nullopt;
      array.push_back(std::move(*element));
    } while (takeAfterSpace(','));
    if (!take(']')) return fail("\",\" or \"]\" is missing");
    return Value(std::move(array));
  }

  std::optional<Value> readDictionary(int depth) {
    Dictionary dictionary;
    take('{');
    if (takeAfterSpace('}')) return Value(std::move(dictionary));
    do {
      if (!readMember(dictionary, depth)) return std::nullopt;
    } while (takeAfterSpace(','));
    if (!take('}')) return fail("\",\" or \"}\" is missing");
    return Value(std::move(dictionary));
  }

  bool readMember(Dictionary& dictionary, int depth) {
    skipSpace();
    if (peek() != '"') return refuse("a name in double quotes is missing");
    const auto name = readString();
    if (!name) return false;
    if (!takeAfterSpace(':')) return refuse("\":\" is missing");
    auto value = readValue(depth + 1);
    if (!value) return false;
    dictionary.set(*name, std::move(*value));
    return true;
  }

  std::optional<std::string> readString() {
    std::string out;
    take('"');
    while (!take('"')) {
      if (at_ == text_.size()) return fail("the closing quote of a string is missing");
      if (!(take('\\') ? readEscape(out) : readCharacter(out))) return std::nullopt;
    }
    return out;
  }

  bool readCharacter(std::string& out) {
    if (static_cast<unsigned char>(peek()) < 0x20) {
      return refuse("a control character must be escaped");
    }
    const std::size_t length = utf8SequenceLength(text_.substr(at_));
    if (length == 0) return refuse("this is no UTF-8");
    out += text_.substr(at_, length);
    at_ += length;
    return true;
  }

  bool readEscape(std::string& out) {
    constexpr std::string_view kEscapes = "\"\\/bfnrt";
    constexpr std::string_view kMeanings = "\"\\/\b\f\n\r\t";
    if (take('u')) return readCodePoint(out);
    const std::size_t index = at_ < text_.size() ? kEscapes.find(peek()) : std::string_view::npos;
    if (index == std::string_view::npos) return refuse("this escape is not known");
    out += kMeanings[index];
    ++at_;
    return true;
  }

  /// What is beyond the 16 bits of an escape stands as a pair of surrogates.
  bool readCodePoint(std::string& out) {
    auto point = readHex();
    if (point && *point >= 0xD800 && *point < 0xDC00) {
      const auto low = takeWord("\\u") ? readHex() : std::nullopt;
      if (!low || *low < 0xDC00 || *low > 0xDFFF) return refuse("half a character");
      point = 0x10000 + ((*point - 0xD800) << 10) + (*low - 0xDC00);
    } else if (point && *point >= 0xDC00 && *point <= 0xDFFF) {
      return refuse("half a character");
    }
    if (!point) return refuse("\\u needs four hexadecimal digits");
    if (*point == 0) return refuse("a string cannot hold a zero character");
    appendUtf8(out, *point);
    return true;
  }

  std::optional<std::uint32_t> readHex() {
    constexpr std::size_t kDigits = 4;
    const std::string_view digits = text_.substr(at_, kDigits);
    std::uint32_t number = 0;
    const auto [end, error] =
        std::from_chars(digits.data(), digits.data() + digits.size(), number, 16);
    if (error != std::errc() || digits.size() < kDigits || end != digits.data() + kDigits) {
      return std::nullopt;
    }
    at_ += kDigits;
    return number;
  }

  std::optional<Value> readNumber() {
    const std::size_t end = text_.find_first_not_of("+-.0123456789eE", at_);
    const std::string_view digits = text_.substr(at_, end - at_);
    auto number = jsonNumber(digits);
    if (!number) return fail(digits.empty() ? "this is no JSON value" : "this is no number");
    at_ += digits.size();
    return number;
  }

  const std::string_view text_;
  std::size_t at_ = 0;
  std::string error_;
};

}  // namespace

std::variant<Value, JsonError> parseJson(std::string_view text) { return Parser(text).parse(); }

}  // namespace spacekeep::ctl
