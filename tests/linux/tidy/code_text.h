// Thread safety: functions without state.
//
// C++ text without comments and without the insides of literals, line for line: rules that look
// for a call do not find the word in a sentence.
#pragma once

#include <cstddef>
#include <set>
#include <string>

namespace spacekeep::tidy {

struct CodeText {
  std::string code;  ///< as many lines as the text
  std::set<std::size_t> commented_lines;
};

/// Knows both kinds of comments, strings, raw strings, characters and digit separators.
[[nodiscard]] CodeText codeTextOf(const std::string& text);

}  // namespace spacekeep::tidy
