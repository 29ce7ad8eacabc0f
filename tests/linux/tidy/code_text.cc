#include "tests/linux/tidy/code_text.h"

#include <algorithm>
#include <cctype>
#include <utility>

namespace spacekeep::tidy {
namespace {

bool isWord(char c) { return std::isalnum(static_cast<unsigned char>(c)) != 0 || c == '_'; }

class Stripper {
 public:
  explicit Stripper(const std::string& text) : text_(text) {}

  CodeText run() {
    while (at_ < text_.size()) step();
    return std::move(result_);
  }

 private:
  void step() {
    if (text_.compare(at_, 2, "//") == 0) {
      drop(std::min(text_.find('\n', at_), text_.size()), true);
    } else if (text_.compare(at_, 2, "/*") == 0) {
      drop(endAfter("*/", at_ + 2), true);
    } else if (text_.compare(at_, 2, "R\"") == 0 && !insideWord()) {
      rawString();
    } else if (text_[at_] == '"') {
      literal('"');
    } else if (text_[at_] == '\'' && !insideNumber()) {
      literal('\'');
    } else {
      result_.code += text_[at_];
      countLine(text_[at_++]);
    }
  }

  void rawString() {
    const std::size_t open = text_.find('(', at_);
    if (open == std::string::npos) return drop(text_.size(), false);
    const std::string close = ")" + text_.substr(at_ + 2, open - at_ - 2) + "\"";
    result_.code += "\"\"";
    drop(endAfter(close, open), false);
  }

  /// A literal ends at its line's end at the latest: a lone quote must not swallow the file.
  void literal(char quote) {
    std::size_t end = at_ + 1;
    while (end < text_.size() && text_[end] != quote && text_[end] != '\n') {
      end += text_[end] == '\\' ? 2U : 1U;
    }
    end = std::min(end, text_.size());
    result_.code += std::string(2, quote);
    drop(end < text_.size() && text_[end] == quote ? end + 1 : end, false);
  }

  void drop(std::size_t end, bool is_comment) {
    for (; at_ < end; ++at_) {
      if (is_comment) result_.commented_lines.insert(line_);
      if (text_[at_] == '\n') result_.code += '\n';
      countLine(text_[at_]);
    }
  }

  [[nodiscard]] std::size_t endAfter(const std::string& closing, std::size_t from) const {
    const std::size_t found = text_.find(closing, from);
    return found == std::string::npos ? text_.size() : found + closing.size();
  }

  void countLine(char c) { line_ += c == '\n' ? 1U : 0U; }

  [[nodiscard]] bool insideWord() const { return at_ > 0 && isWord(text_[at_ - 1]); }

  /// The separator of 1'000'000, not the start of a character.
  [[nodiscard]] bool insideNumber() const {
    std::size_t begin = at_;
    while (begin > 0 && (isWord(text_[begin - 1]) || text_[begin - 1] == '\'')) --begin;
    return begin < at_ && std::isdigit(static_cast<unsigned char>(text_[begin])) != 0;
  }

  const std::string& text_;
  std::size_t at_ = 0;
  std::size_t line_ = 0;
  CodeText result_;
};

}  // namespace

CodeText codeTextOf(const std::string& text) { return Stripper(text).run(); }

}  // namespace spacekeep::tidy
