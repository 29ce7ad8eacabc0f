#include "support/values/text.h"

#include <algorithm>
#include <charconv>
#include <chrono>

namespace spacekeep {
namespace {

constexpr std::string_view kEllipsis = "...";
constexpr char kHexDigits[] = "0123456789abcdef";

void appendHex(std::string& out, unsigned char byte) {
  out += kHexDigits[byte >> 4];
  out += kHexDigits[byte & 15];
}

void appendEscapedByte(std::string& out, unsigned char byte) {
  switch (byte) {
    case '\n':
      out += "\\n";
      return;
    case '\r':
      out += "\\r";
      return;
    case '\t':
      out += "\\t";
      return;
    default:
      out += "\\x";
      appendHex(out, byte);
  }
}

// C1 controls are two bytes in UTF-8; terminals obey them like their C0 twins.
bool isControl(std::string_view sequence) {
  const auto first = static_cast<unsigned char>(sequence[0]);
  if (sequence.size() == 1) return first < 0x20 || first == 0x7f;
  return first == 0xc2 && static_cast<unsigned char>(sequence[1]) < 0xa0;
}

// Collects text up to the limit. Whole pieces only, so that no sequence is cut in its middle.
class BoundedText {
 public:
  void add(std::string_view piece) {
    if (full_) return;
    if (text_.size() + piece.size() > kMaxTextBytes) {
      full_ = true;
      return;
    }
    text_ += piece;
  }
  [[nodiscard]] bool full() const { return full_; }

  std::string take() {
    if (!full_) return std::move(text_);
    std::size_t end = std::min(text_.size(), kMaxTextBytes - kEllipsis.size());
    while (end > 0 && end < text_.size() &&
           (static_cast<unsigned char>(text_[end]) & 0xc0) == 0x80) {
      --end;
    }
    text_.resize(end);
    text_ += kEllipsis;
    return std::move(text_);
  }

 private:
  std::string text_;
  bool full_ = false;
};

void addEscaped(BoundedText& out, std::string_view text, bool quoted) {
  while (!text.empty() && !out.full()) {
    const std::size_t length = std::max<std::size_t>(1, utf8SequenceLength(text));
    const std::string_view sequence = text.substr(0, length);
    text.remove_prefix(length);
    if (utf8SequenceLength(sequence) == 0 || isControl(sequence)) {
      std::string escaped;
      for (const char byte : sequence) appendEscapedByte(escaped, static_cast<unsigned char>(byte));
      out.add(escaped);
    } else if (quoted && (sequence == "\"" || sequence == "\\")) {
      out.add(std::string("\\").append(sequence));
    } else {
      out.add(sequence);
    }
  }
}

void addQuoted(BoundedText& out, std::string_view text) {
  out.add("\"");
  addEscaped(out, text, true);
  out.add("\"");
}

template <class Number>
void addNumber(BoundedText& out, Number number) {
  char digits[40];
  const auto end = std::to_chars(digits, digits + sizeof(digits), number).ptr;
  out.add(std::string_view(digits, static_cast<std::size_t>(end - digits)));
}

void addData(BoundedText& out, const Data& data) {
  std::string text = "<";
  const std::size_t shown = std::min(data.bytes.size(), kMaxDataBytesInText);
  for (std::size_t i = 0; i < shown; ++i) appendHex(text, data.bytes[i]);
  if (shown < data.bytes.size()) text += " ...";
  out.add(text + ">");
}

void appendPadded(std::string& out, std::int64_t number, std::size_t width) {
  const std::string digits = std::to_string(number);
  if (digits.size() < width) out.append(width - digits.size(), '0');
  out += digits;
}

std::string dateText(const Date& date) {
  using std::chrono::days;
  using std::chrono::nanoseconds;
  const std::chrono::sys_time<nanoseconds> point{nanoseconds{date.unix_ns}};
  const auto day = std::chrono::floor<days>(point);
  const std::chrono::year_month_day calendar{day};
  // Not by subtracting time points: the first day in range begins before the first nanosecond.
  const std::int64_t day_ns = 86'400'000'000'000;
  const std::int64_t rest_ns = (date.unix_ns % day_ns + day_ns) % day_ns;
  const std::int64_t seconds = rest_ns / 1'000'000'000;
  std::string text;
  appendPadded(text, int{calendar.year()}, 4);
  appendPadded(text += '-', unsigned{calendar.month()}, 2);
  appendPadded(text += '-', unsigned{calendar.day()}, 2);
  appendPadded(text += 'T', seconds / 3600, 2);
  appendPadded(text += ':', seconds / 60 % 60, 2);
  appendPadded(text += ':', seconds % 60, 2);
  if (rest_ns % 1'000'000'000 != 0) appendPadded(text += '.', rest_ns % 1'000'000'000, 9);
  return text + "Z";
}

struct Writer {
  BoundedText& out;
  int depth;  // containers around this value

  void operator()(const std::string& text) const {
    if (depth == 0) {
      addEscaped(out, text, false);
    } else {
      addQuoted(out, text);
    }
  }
  void operator()(bool truth) const { out.add(truth ? "true" : "false"); }
  void operator()(std::int64_t number) const { addNumber(out, number); }
  void operator()(std::uint64_t number) const { addNumber(out, number); }
  void operator()(double number) const { addNumber(out, number); }
  void operator()(const Data& data) const { addData(out, data); }
  void operator()(const Date& date) const { out.add(dateText(date)); }

  void operator()(const Array& array) const {
    if (depth >= kMaxValueDepth) return out.add(kEllipsis);
    const char* separator = "[";
    for (const Value& value : array) {
      if (out.full()) return;
      out.add(separator);
      separator = ", ";
      std::visit(Writer{out, depth + 1}, value.storage());
    }
    out.add(array.empty() ? "[]" : "]");
  }

  void operator()(const Dictionary& dictionary) const {
    if (depth >= kMaxValueDepth) return out.add(kEllipsis);
    const char* separator = "{";
    for (const auto& [key, value] : dictionary) {
      if (out.full()) return;
      out.add(separator);
      separator = ", ";
      addQuoted(out, key);
      out.add(": ");
      std::visit(Writer{out, depth + 1}, value.storage());
    }
    out.add(dictionary.empty() ? "{}" : "}");
  }
};

}  // namespace

std::string textOf(const Value& value) {
  BoundedText out;
  std::visit(Writer{out, 0}, value.storage());
  return out.take();
}

std::string textOf(const Dictionary& dictionary) {
  BoundedText out;
  Writer{out, 0}(dictionary);
  return out.take();
}

std::string textOf(const Value* value) { return value == nullptr ? "(none)" : textOf(*value); }

std::string lineOf(std::string_view text) {
  BoundedText out;
  addEscaped(out, text, false);
  return out.take();
}

std::size_t utf8SequenceLength(std::string_view text) {
  if (text.empty()) return 0;
  const auto byte = [text](std::size_t i) { return static_cast<unsigned char>(text[i]); };
  const unsigned char first = byte(0);
  if (first < 0x80) return 1;
  if (first < 0xc2 || first > 0xf4) return 0;
  const std::size_t length = first < 0xe0 ? 2 : first < 0xf0 ? 3 : 4;
  if (text.size() < length) return 0;
  for (std::size_t i = 1; i < length; ++i) {
    if ((byte(i) & 0xc0) != 0x80) return 0;
  }
  if (first == 0xe0 && byte(1) < 0xa0) return 0;   // overlong
  if (first == 0xed && byte(1) >= 0xa0) return 0;  // surrogates
  if (first == 0xf0 && byte(1) < 0x90) return 0;   // overlong
  if (first == 0xf4 && byte(1) >= 0x90) return 0;  // above U+10FFFF
  return length;
}

bool isUtf8(std::string_view text) {
  while (!text.empty()) {
    const std::size_t length = utf8SequenceLength(text);
    if (length == 0) return false;
    text.remove_prefix(length);
  }
  return true;
}

}  // namespace spacekeep
