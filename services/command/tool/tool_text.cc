#include <algorithm>

#include "services/command/tool/tool.h"

namespace spacekeep::command {
namespace {

constexpr std::size_t kMostShown = 200;

/// The last line that says something, without control characters.
std::string lastLineOf(const std::string& text) {
  std::size_t end = text.find_last_not_of(" \r\n\t");
  if (end == std::string::npos) return "";
  const std::size_t before = text.rfind('\n', end);
  const std::size_t begin = before == std::string::npos ? 0 : before + 1;
  std::string line = text.substr(begin, std::min(end + 1 - begin, kMostShown));
  std::ranges::replace_if(
      line, [](char c) { return static_cast<unsigned char>(c) < 0x20 || c == 0x7f; }, ' ');
  return line;
}

}  // namespace

std::string textOf(const Words& words) {
  std::string text;
  for (const std::string& word : words) {
    const bool plain = !word.empty() && word.find_first_of(" \t\n\"'\\") == std::string::npos;
    text += (text.empty() ? "" : " ") + (plain ? word : '"' + word + '"');
  }
  return text;
}

std::string problemOf(const Words& words, const ToolRun& run) {
  const std::string said = lastLineOf(run.complaint);
  const std::string more = said.empty() ? "" : ": " + said;
  switch (run.end) {
    case ToolEnd::kExited:
      return textOf(words) + " ended with status " + std::to_string(run.status) + more;
    case ToolEnd::kAbsent:
      return words.front() + " is not installed";
    case ToolEnd::kNotStarted:
      return textOf(words) + " could not be started" + more;
    case ToolEnd::kTimedOut:
      return textOf(words) + " took too long and was ended; give it more TIMEOUT_SECONDS" + more;
    case ToolEnd::kCancelled:
      return textOf(words) + " was ended because it is not wanted any more";
  }
  return "";
}

}  // namespace spacekeep::command
