// Rules about statements: names of numbers, flags of descriptors, texts of log lines, sleeps.
#include <algorithm>
#include <cctype>
#include <map>
#include <regex>
#include <sstream>

#include "tests/linux/tidy/structure.h"

namespace spacekeep::tidy {
namespace {

/// The last word of a name: "wait" of first_wait_, kFirstWait and firstWait.
std::string lastPart(std::string name) {
  while (!name.empty() && name.back() == '_') name.pop_back();
  std::size_t begin = name.rfind('_');
  begin = begin == std::string::npos ? 0 : begin + 1;
  for (std::size_t i = name.size(); i-- > begin + 1;) {
    if (std::isupper(static_cast<unsigned char>(name[i])) != 0) {
      begin = i;
      break;
    }
  }
  std::string part = name.substr(begin);
  for (char& c : part) c = static_cast<char>(std::tolower(static_cast<unsigned char>(c)));
  return part;
}

/// A deadline is not among them: it is an instant, and instants are ticks throughout.
bool isMeasure(const std::string& part) {
  static const std::set<std::string> words = {
      "timeout", "delay",   "age",  "interval", "duration", "elapsed", "period",
      "pause",   "latency", "wait", "backoff",  "lifetime", "capacity"};
  return words.contains(part);
}

/// Statements of a file as one line each, with the line on which they begin.
struct Statement {
  std::size_t line = 0;
  std::string code;
  bool allowed = false;
};

std::vector<Statement> statementsOf(const SourceFile& file) {
  std::vector<Statement> statements(1);
  for (std::size_t i = 0; i < file.lines.size(); ++i) {
    const SourceLine& line = file.lines[i];
    if (line.code.starts_with("#")) continue;
    for (const char c : line.code) {
      Statement& last = statements.back();
      if (last.code.empty()) last.line = i;
      if (line.allowed) last.allowed = true;
      if (c == ';' || c == '{' || c == '}') {
        statements.emplace_back();
      } else if (c != ' ' || !last.code.empty()) {
        last.code += c;
      }
    }
    if (!statements.back().code.empty()) statements.back().code += ' ';
  }
  return statements;
}

bool has(const std::string& code, const char* word) { return code.find(word) != code.npos; }

/// What the statement opens without the flag that keeps it from children, empty if nothing.
std::string opensInherited(const std::string& code) {
  struct Opening {
    const char* opens;
    const char* flag;
  };
  static const std::vector<Opening> openings = {{"O_RDONLY", "O_CLOEXEC"},
                                                {"O_WRONLY", "O_CLOEXEC"},
                                                {"O_RDWR", "O_CLOEXEC"},
                                                {"O_PATH", "O_CLOEXEC"},
                                                {"socket(AF", "SOCK_CLOEXEC"},
                                                {"socketpair(", "SOCK_CLOEXEC"},
                                                {"accept4(", "SOCK_CLOEXEC"},
                                                {"eventfd(", "EFD_CLOEXEC"},
                                                {"timerfd_create(", "TFD_CLOEXEC"},
                                                {"epoll_create1(", "EPOLL_CLOEXEC"},
                                                {"inotify_init1(", "IN_CLOEXEC"},
                                                {"memfd_create(", "MFD_CLOEXEC"},
                                                {"fanotify_init(", "FAN_CLOEXEC"},
                                                {"signalfd(", "SFD_CLOEXEC"},
                                                {"pipe2(", "O_CLOEXEC"}};
  for (const Opening& opening : openings) {
    if (has(code, opening.opens) && !has(code, opening.flag)) return opening.flag;
  }
  return "";
}

/// The texts of the log calls of a file, literals in a row as one, with their lines.
std::vector<std::pair<std::size_t, std::string>> logTextsOf(const SourceFile& file) {
  std::ostringstream whole;
  for (const SourceLine& line : file.lines) whole << line.text << '\n';
  const std::string text = whole.str();
  static const std::regex call("log(Problem|Trace)\\(\\s*((\"([^\"\\\\]|\\\\.)*\"\\s*)+)");
  std::vector<std::pair<std::size_t, std::string>> texts;
  for (std::sregex_iterator at(text.begin(), text.end(), call), end; at != end; ++at) {
    static const std::regex between("\"\\s*\"");
    const auto line = std::count(text.begin(), text.begin() + at->position(), '\n');
    std::string joined = std::regex_replace((*at)[2].str(), between, "");
    joined = joined.substr(1, joined.rfind('"') - 1);
    texts.emplace_back(static_cast<std::size_t>(line), joined);
  }
  return texts;
}

bool isLoop(const std::string& code) { return has(code, "while (") || has(code, "for ("); }

}  // namespace

std::string namesWithoutUnit(const Files& files) {
  static const std::regex number(
      "\\b(?:u?int(?:8|16|32|64)?(?:_t)?|unsigned|long|double|float|size_t)\\s+(\\w+)(?!\\w|\\((?!"
      "\\) const))");
  std::string found;
  for (const SourceFile& file : files) {
    for (std::size_t i = 0; i < file.lines.size(); ++i) {
      const std::string& code = file.lines[i].code;
      if (file.lines[i].allowed) continue;
      for (std::sregex_iterator at(code.begin(), code.end(), number), end; at != end; ++at) {
        const std::string name = (*at)[1];
        if (isMeasure(lastPart(name))) found += finding(file, i, name + ": in what?");
      }
    }
  }
  return found;
}

std::string inheritedDescriptors(const Files& files) {
  std::string found;
  for (const SourceFile& file : files) {
    for (const Statement& statement : statementsOf(file)) {
      const std::string missing = statement.allowed ? "" : opensInherited(statement.code);
      if (!missing.empty()) found += finding(file, statement.line, "without " + missing);
    }
  }
  return found;
}

std::string logTextsAtTwoPlaces(const Files& files, const std::set<std::string>& known) {
  std::map<std::string, std::string> first;  // where a text was seen first
  std::string found;
  for (const SourceFile& file : files) {
    for (const auto& [line, text] : logTextsOf(file)) {
      if (std::count(text.begin(), text.end(), ' ') < 3 || known.contains(text)) continue;
      const auto [entry, is_new] = first.emplace(text, finding(file, line, ""));
      if (!is_new) found += finding(file, line, '"' + text + "\" stands at " + entry->second);
    }
  }
  return found;
}

std::string sleepsWithoutReason(const Files& files) {
  static const std::regex sleep("\\b(usleep|nanosleep|sleepNs|sleep_for|sleep)\\(");
  std::string found;
  for (const SourceFile& file : files) {
    for (std::size_t i = 0; i < file.lines.size(); ++i) {
      const SourceLine& line = file.lines[i];
      if (!has(line.code, "sleep") || !std::regex_search(line.code, sleep)) continue;
      bool explained = line.commented || isLoop(line.code);
      for (std::size_t back = 1; back <= 4 && back <= i && !explained; ++back) {
        const SourceLine& before = file.lines[i - back];
        explained = (back == 1 && before.commented) || isLoop(before.code);
      }
      if (!explained) found += finding(file, i, line.text);
    }
  }
  return found;
}

}  // namespace spacekeep::tidy
