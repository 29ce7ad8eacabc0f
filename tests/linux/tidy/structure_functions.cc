// The length of functions, from braces alone: a brace opens a function where it stands directly in
// a namespace or a type and follows a parameter list.
#include <algorithm>
#include <regex>

#include "tests/linux/tidy/structure.h"

namespace spacekeep::tidy {
namespace {

enum class Scope { kOuter, kFunction, kInner };

struct Open {
  Scope scope = Scope::kInner;
  std::size_t line = 0;
  std::string name;
};

class FunctionReader {
 public:
  FunctionReader(const SourceFile& file, std::size_t longest) : file_(file), longest_(longest) {}

  std::string run() {
    for (line_ = 0; line_ < file_.lines.size(); ++line_) {
      const std::string& code = file_.lines[line_].code;
      if (code.starts_with("#")) continue;
      for (const char c : code) step(c);
      before_ += ' ';
    }
    return found_;
  }

 private:
  void step(char c) {
    if (c == '{') {
      open_.push_back({scopeOf(before_), line_, nameIn(before_)});
      before_.clear();
    } else if (c == '}') {
      close();
      before_.clear();
    } else if (c == ';') {
      before_.clear();
    } else {
      before_ += c;
    }
  }

  void close() {
    if (open_.empty()) return;
    const Open closed = open_.back();
    open_.pop_back();
    const std::size_t lines = line_ - closed.line + 1;
    if (closed.scope == Scope::kFunction && lines > longest_) {
      found_ += finding(file_, closed.line, closed.name + ": " + std::to_string(lines) + " lines");
    }
  }

  [[nodiscard]] Scope scopeOf(const std::string& before) const {
    if (!open_.empty() && open_.back().scope != Scope::kOuter) return Scope::kInner;
    static const std::regex type("\\b(namespace|class|struct|union|enum|extern)\\b[^()=]*$");
    if (before.find('(') == std::string::npos || std::regex_search(before, type)) {
      return Scope::kOuter;
    }
    return Scope::kFunction;
  }

  static std::string nameIn(const std::string& before) {
    const std::size_t end = before.find('(');
    if (end == std::string::npos) return "";
    const std::size_t begin = before.find_last_of(" *&", end);
    std::string name = before.substr(begin == std::string::npos ? 0 : begin + 1);
    return name.substr(0, name.find(')'));
  }

  const SourceFile& file_;
  const std::size_t longest_;
  std::size_t line_ = 0;
  std::string before_;
  std::vector<Open> open_;
  std::string found_;
};

}  // namespace

std::string functionsLongerThan(std::size_t lines, const Files& files) {
  std::string found;
  for (const SourceFile& file : files) found += FunctionReader(file, lines).run();
  return found;
}

}  // namespace spacekeep::tidy
