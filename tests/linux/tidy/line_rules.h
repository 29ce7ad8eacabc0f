// Thread safety: functions without state; a rule is constant.
//
// Rules that one line is enough to judge: words and calls that are banned somewhere, each with what
// to use instead, the places where it is right all the same, and lines that show the rule at work.
#pragma once

#include <string>
#include <vector>

#include "tests/linux/tidy/source_tree.h"

namespace spacekeep::tidy {

enum class Look {
  kCalls,  ///< `words` as called functions: not members, not declarations, not other namespaces
  kWords,  ///< `words` anywhere in code
  kCode,   ///< `pattern`, an ECMAScript regular expression, in code without comments and literals
  kText,   ///< `pattern` in the line as it stands
};

enum class Where { kDaemonRooms, kProduction, kOutsideSupport, kTests, kAllCode, kAllTexts };

struct Exception {
  std::string path_prefix;
  std::string reason;
};

struct LineRule {
  std::string name;  ///< of the test
  Where where = Where::kProduction;
  Look look = Look::kCalls;
  std::vector<std::string> words;  ///< kCalls, kWords: any; else only lines with one are looked at
  std::string pattern;             ///< kCode, kText
  std::string instead;
  std::vector<Exception> exceptions;
  std::vector<std::string> planted;   ///< each of them is found
  std::vector<std::string> harmless;  ///< none of them is found
};

/// All rules, in the order of the files that hold them.
[[nodiscard]] const std::vector<LineRule>& lineRules();
[[nodiscard]] std::vector<LineRule> bannedCalls();
[[nodiscard]] std::vector<LineRule> bannedTexts();
[[nodiscard]] std::vector<LineRule> testRules();

/// The files of the place that the rule speaks of, and those without its exceptions.
[[nodiscard]] const std::vector<SourceFile>& placeOf(const LineRule& rule);
[[nodiscard]] std::vector<const SourceFile*> filesOf(const LineRule& rule);

/// One finding per line that breaks the rule and is not marked with tidy-allow and a reason.
[[nodiscard]] std::string brokenBy(const LineRule& rule, const SourceFile& file);

}  // namespace spacekeep::tidy
