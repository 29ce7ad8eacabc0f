// Rules about files as a whole.
#include <algorithm>
#include <regex>

#include "tests/linux/tidy/structure.h"

namespace spacekeep::tidy {
namespace {

const std::set<std::string>& standardHeaders() {
  static const std::set<std::string> names = {
      "algorithm",   "array",     "atomic",      "bit",
      "cctype",      "cmath",     "compare",     "concepts",
      "cstddef",     "cstdint",   "cstdlib",     "cstring",
      "deque",       "exception", "functional",  "initializer_list",
      "iterator",    "limits",    "list",        "map",
      "memory",      "new",       "numeric",     "optional",
      "queue",       "ratio",     "set",         "span",
      "stdexcept",   "string",    "string_view", "tuple",
      "type_traits", "typeinfo",  "utility",     "variant",
      "vector"};
  return names;
}

struct Include {
  std::size_t line = 0;
  std::string target;
  bool in_brackets = false;
};

std::vector<Include> includesOf(const SourceFile& file) {
  static const std::regex pattern("^\\s*#\\s*include\\s*([<\"])([^\">]+)[\">]");
  std::vector<Include> includes;
  for (std::size_t i = 0; i < file.lines.size(); ++i) {
    std::smatch match;
    if (file.lines[i].text.find("include") == std::string::npos) continue;
    if (std::regex_search(file.lines[i].text, match, pattern)) {
      includes.push_back({i, match[2], match[1] == "<"});
    }
  }
  return includes;
}

std::string whyForeign(const SourceFile& file, const Include& include,
                       const std::set<std::string>& headers) {
  if (include.in_brackets) {
    return standardHeaders().contains(include.target) ? "" : "not the standard library, or banned";
  }
  if (!headers.contains(include.target)) return "no such header of the project";
  const bool needs_linux = include.target.find("/linux/") != std::string::npos;
  // One place has to pick the platform.
  return needs_linux && file.path != "daemon/main.cc" ? "take it from Platform instead" : "";
}

}  // namespace

std::string headersWithoutThreadSafety(const Files& files) {
  std::string found;
  for (const SourceFile& file : files) {
    constexpr const char* kBegin = "// Thread safety: ";
    const bool says = !file.lines.empty() && file.lines.front().text.starts_with(kBegin) &&
                      file.lines.front().text.size() > std::string(kBegin).size();
    if (file.isHeader() && !says) found += finding(file, 0, "does not begin with thread safety");
  }
  return found;
}

std::string headersWithoutGuard(const Files& files) {
  std::string found;
  for (const SourceFile& file : files) {
    const bool guarded = std::any_of(file.lines.begin(), file.lines.end(),
                                     [](const auto& line) { return line.code == "#pragma once"; });
    if (file.isHeader() && !guarded) found += finding(file, 0, "has no #pragma once");
  }
  return found;
}

std::string headersThatNothingIncludes(const Files& files, const Files& users) {
  std::set<std::string> included;
  for (const SourceFile& user : users) {
    for (const Include& include : includesOf(user)) {
      if (include.target != user.path) included.insert(include.target);
    }
  }
  std::string found;
  for (const SourceFile& file : files) {
    // The library's headers are named as its users name them.
    constexpr const char* kPublicFolder = "sdk/include/";
    std::string name = file.path;
    if (name.starts_with(kPublicFolder)) name.erase(0, std::string(kPublicFolder).size());
    if (file.isHeader() && !included.contains(name)) {
      found += finding(file, 0, "nothing includes it");
    }
  }
  return found;
}

std::string sourcesThatNothingBuilds(const Files& files, const std::set<std::string>& built) {
  std::string found;
  for (const SourceFile& file : files) {
    if (!file.isHeader() && !built.contains(file.path)) {
      found += finding(file, 0, "nothing builds it");
    }
  }
  return found;
}

std::string foreignIncludes(const Files& files, const std::set<std::string>& headers) {
  std::string found;
  for (const SourceFile& file : files) {
    for (const Include& include : includesOf(file)) {
      const std::string why = whyForeign(file, include, headers);
      if (!why.empty()) found += finding(file, include.line, include.target + ": " + why);
    }
  }
  return found;
}

std::string filesLongerThan(std::size_t lines, const Files& files) {
  std::string found;
  for (const SourceFile& file : files) {
    if (file.lines.size() > lines) {
      found += finding(file, lines, "goes on to line " + std::to_string(file.lines.size()));
    }
  }
  return found;
}

}  // namespace spacekeep::tidy
