#include "tests/linux/tidy/line_rules.h"

#include <algorithm>
#include <array>
#include <cctype>
#include <iterator>
#include <map>
#include <optional>
#include <regex>
#include <string_view>

namespace spacekeep::tidy {
namespace {

bool isWord(char c) { return std::isalnum(static_cast<unsigned char>(c)) != 0 || c == '_'; }

std::string_view withoutTrailingSpace(std::string_view text) {
  while (!text.empty() && text.back() == ' ') text.remove_suffix(1);
  return text;
}

std::string_view lastWord(std::string_view text) {
  std::size_t begin = text.size();
  while (begin > 0 && isWord(text[begin - 1])) --begin;
  return text.substr(begin);
}

/// What stands before a name decides whether it is the C or std function that is called.
bool readsAsCall(std::string_view before) {
  if (before.ends_with("::")) {
    before.remove_suffix(2);
    const std::string_view scope = lastWord(before);
    if (!scope.empty() && scope != "std") {
      constexpr std::array kKeywords = {"return", "else", "case", "do", "throw"};
      return std::find(kKeywords.begin(), kKeywords.end(), scope) != kKeywords.end();
    }
    before.remove_suffix(scope.size());
  }
  if (before.ends_with(".") || before.ends_with("->")) return false;
  const bool touches = !before.empty() && isWord(before.back());
  if (touches) return false;
  const std::string_view previous = lastWord(withoutTrailingSpace(before));
  constexpr std::array kBeforeExpressions = {"return", "else", "case", "do", "throw", "co_return"};
  return previous.empty() || std::find(kBeforeExpressions.begin(), kBeforeExpressions.end(),
                                       previous) != kBeforeExpressions.end();
}

bool hasWord(std::string_view code, std::string_view word, bool as_call) {
  for (std::size_t at = code.find(word); at != code.npos; at = code.find(word, at + 1)) {
    if (at > 0 && isWord(code[at - 1]) && isWord(word.front())) continue;
    std::string_view after = code.substr(at + word.size());
    if (!after.empty() && isWord(after.front()) && isWord(word.back())) continue;
    if (!as_call) return true;
    after.remove_prefix(std::min(after.find_first_not_of(' '), after.size()));
    if (after.starts_with("(") && readsAsCall(code.substr(0, at))) return true;
  }
  return false;
}

bool anyWord(const LineRule& rule, std::string_view code, bool as_call) {
  return std::any_of(rule.words.begin(), rule.words.end(),
                     [&](const std::string& word) { return hasWord(code, word, as_call); });
}

/// Regular expressions are slow: only lines with one of the words are worth one.
bool worthALook(const LineRule& rule, const std::string& text) {
  return rule.words.empty() ||
         std::any_of(rule.words.begin(), rule.words.end(),
                     [&](const std::string& word) { return text.find(word) != text.npos; });
}

bool breaks(const LineRule& rule, const std::optional<std::regex>& regex, const SourceLine& line) {
  switch (rule.look) {
    case Look::kCalls:
      return anyWord(rule, line.code, true);
    case Look::kWords:
      return anyWord(rule, line.code, false);
    case Look::kCode:
      return worthALook(rule, line.code) && std::regex_search(line.code, *regex);
    case Look::kText:
      return worthALook(rule, line.text) && std::regex_search(line.text, *regex);
  }
  return false;
}

const std::vector<std::string>& roomsOf(Where where) {
  static const std::vector<std::string> tests = {"tests"};
  switch (where) {
    case Where::kDaemonRooms:
      return daemonRooms();
    case Where::kProduction:
    case Where::kOutsideSupport:
      return productionRooms();
    case Where::kTests:
      return tests;
    case Where::kAllCode:
    case Where::kAllTexts:
      return allRooms();
  }
  return allRooms();
}

/// Read once for the whole program, and only when asked for: many rules look at the same files.
const std::vector<SourceFile>& filesIn(Where where) {
  static std::map<Where, std::vector<SourceFile>> known;
  const auto [entry, is_new] = known.try_emplace(where);
  if (is_new) entry->second = where == Where::kAllTexts ? allTexts() : codeOf(roomsOf(where));
  return entry->second;
}

}  // namespace

const std::vector<LineRule>& lineRules() {
  static const std::vector<LineRule> rules = [] {
    std::vector<LineRule> all = bannedCalls();
    for (auto more : {bannedTexts(), testRules()}) {
      all.insert(all.end(), std::make_move_iterator(more.begin()),
                 std::make_move_iterator(more.end()));
    }
    return all;
  }();
  return rules;
}

const std::vector<SourceFile>& placeOf(const LineRule& rule) { return filesIn(rule.where); }

std::vector<const SourceFile*> filesOf(const LineRule& rule) {
  std::vector<const SourceFile*> files;
  for (const SourceFile& file : placeOf(rule)) {
    const bool excepted =
        std::any_of(rule.exceptions.begin(), rule.exceptions.end(),
                    [&](const Exception& e) { return file.path.starts_with(e.path_prefix); });
    const bool in_support = file.path.starts_with("support/");
    if (!excepted && !(rule.where == Where::kOutsideSupport && in_support)) files.push_back(&file);
  }
  return files;
}

std::string brokenBy(const LineRule& rule, const SourceFile& file) {
  std::optional<std::regex> regex;
  if (!rule.pattern.empty()) regex.emplace(rule.pattern);
  std::string found;
  for (std::size_t i = 0; i < file.lines.size(); ++i) {
    const SourceLine& line = file.lines[i];
    if (!line.allowed && breaks(rule, regex, line)) found += finding(file, i, line.text);
  }
  return found;
}

}  // namespace spacekeep::tidy
