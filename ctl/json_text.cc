#include "ctl/json_text.h"

#include <fmt/format.h>

#include <cmath>
#include <cstddef>
#include <iterator>
#include <string_view>
#include <variant>

namespace spacekeep::ctl {
namespace {

/// Length of the well-formed UTF-8 sequence (RFC 3629) at the beginning of `text`, 0 when there is
/// none.
std::size_t sequenceLength(std::string_view text) {
  const auto byte = [text](std::size_t i) { return static_cast<unsigned char>(text[i]); };
  const unsigned char lead = byte(0);
  if (lead < 0x80) return 1;
  const std::size_t length = lead >= 0xF0 ? 4 : lead >= 0xE0 ? 3 : 2;
  if (lead < 0xC2 || lead > 0xF4 || text.size() < length) return 0;
  for (std::size_t i = 1; i < length; ++i) {
    if ((byte(i) & 0xC0) != 0x80) return 0;
  }
  const bool overlong = (lead == 0xE0 && byte(1) < 0xA0) || (lead == 0xF0 && byte(1) < 0x90);
  const bool surrogate = lead == 0xED && byte(1) > 0x9F;
  const bool out_of_range = lead == 0xF4 && byte(1) > 0x8F;
  return overlong || surrogate || out_of_range ? 0 : length;
}

class Writer {
 public:
  void operator()(const std::string& text) {
    out_ += '"';
    std::string_view rest = text;
    while (!rest.empty()) {
      const std::size_t length = sequenceLength(rest);
      if (length == 0) {
        out_ += "\xEF\xBF\xBD";
      } else {
        character(rest.substr(0, length));
      }
      rest.remove_prefix(length == 0 ? 1 : length);
    }
    out_ += '"';
  }
  void operator()(bool truth) { out_ += truth ? "true" : "false"; }
  void operator()(std::int64_t number) { fmt::format_to(std::back_inserter(out_), "{}", number); }
  void operator()(std::uint64_t number) { fmt::format_to(std::back_inserter(out_), "{}", number); }
  void operator()(double number) {
    if (!std::isfinite(number)) {
      out_ += "null";
    } else {
      fmt::format_to(std::back_inserter(out_), "{}", number);
    }
  }
  void operator()(const Data& data) {
    fmt::format_to(std::back_inserter(out_), "[{}]", fmt::join(data.bytes, ","));
  }
  void operator()(const Date& date) { (*this)(static_cast<double>(date.unix_ns) / 1e9); }
  void operator()(const Array& array) {
    out_ += '[';
    for (const auto& element : array) {
      separate('[');
      std::visit(*this, element.storage());
    }
    out_ += ']';
  }
  void operator()(const Dictionary& dictionary) {
    out_ += '{';
    for (const auto& [key, value] : dictionary) {
      separate('{');
      (*this)(key);
      out_ += ':';
      std::visit(*this, value.storage());
    }
    out_ += '}';
  }

  [[nodiscard]] std::string take() { return std::move(out_); }

 private:
  void separate(char opening) {
    if (out_.back() != opening) out_ += ',';
  }

  void character(std::string_view sequence) {
    const auto first = static_cast<unsigned char>(sequence.front());
    if (first == '"' || first == '\\') {
      out_ += '\\';
      out_ += sequence;
    } else if (first < 0x20 || first == 0x7F) {
      fmt::format_to(std::back_inserter(out_), "\\u{:04x}", first);
    } else {
      out_ += sequence;
    }
  }

  std::string out_;
};

}  // namespace

std::string jsonOf(const Value& value) {
  Writer writer;
  std::visit(writer, value.storage());
  return writer.take();
}

}  // namespace spacekeep::ctl
