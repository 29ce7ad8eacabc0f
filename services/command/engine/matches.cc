#include "services/command/engine/matches.h"

#include <algorithm>
#include <string_view>
#include <utility>

#include "services/command/base/path_patterns.h"

namespace spacekeep::command {
namespace {

using cachedir::DirectoryRule;
using cachedir::Rules;

struct Match {
  std::string path;
  const DirectoryRule* rule = nullptr;
  std::string why_not = {};  // why it is left out, in words
};

std::string folderOf(const std::string& path) {
  return path.substr(0, std::max<std::size_t>(path.rfind('/'), 1));
}
std::string nameOf(const std::string& path) { return path.substr(path.rfind('/') + 1); }

/// Any name at all, of those that do not begin with a dot.
bool matchesAnything(const std::string& component) {
  return component.find_first_not_of("*?") == std::string::npos;
}

std::string whyNever(const std::string& path, const std::string& pattern) {
  if (cachedir::isSystemDirectory(path)) return "is a system directory";
  if (matchesAnything(nameOf(pattern)) && cachedir::isSystemDirectory(folderOf(path))) {
    return "is taken with all that is in a system directory";
  }
  return "";
}

std::vector<Match> matchesIn(const Rules& rules) {
  std::vector<Match> found;
  for (const DirectoryRule& rule : rules.directories) {
    for (std::string& path : matchesOf(rule.path)) {
      std::string why_not = whyNever(path, rule.path);
      found.push_back({std::move(path), &rule, std::move(why_not)});
    }
  }
  return found;
}

void leaveOutOverlaps(std::vector<Match*> matches) {
  // With the slash, all that lies below a directory comes right after it.
  std::ranges::sort(matches, {}, [](const Match* match) { return match->path + "/"; });
  Match* above = nullptr;
  for (Match* match : matches) {
    if (above == nullptr || !cachedir::overlap(match->path, above->path)) {
      above = match;
      continue;
    }
    match->why_not = "overlaps " + above->path;
    if (above->why_not.empty()) above->why_not = "overlaps " + match->path;
  }
}

std::vector<Match*> goodOnes(std::vector<Match>& matches) {
  std::vector<Match*> good;
  for (Match& match : matches) {
    if (match.why_not.empty()) good.push_back(&match);
  }
  return good;
}

/// One line for each entry of the rule file, however much it matches.
std::vector<std::string> problemsOf(const std::vector<Match>& matches) {
  std::vector<std::string> problems;
  for (auto match = matches.begin(); match != matches.end();) {
    const auto next = std::find_if(match, matches.end(),
                                   [&](const Match& other) { return other.rule != match->rule; });
    const auto is_bad = [](const Match& other) { return !other.why_not.empty(); };
    const auto bad = std::find_if(match, next, is_bad);
    const auto others = std::count_if(match, next, is_bad) - 1;
    if (bad != next) {
      const std::string more = others > 0 ? ", and " + std::to_string(others) + " more" : "";
      problems.push_back(bad->path + ": left alone" + more + ": it " + bad->why_not +
                         "; write PATH so that \"" + bad->rule->path + "\" does not match it");
    }
    match = next;
  }
  return problems;
}

Rules rulesWith(const Rules& rules, const std::vector<Match>& matches) {
  Rules found = rules;
  found.directories.clear();
  for (const Match& match : matches) {
    if (!match.why_not.empty() || found.directories.size() >= kMaxMatches) continue;
    found.directories.push_back(*match.rule);
    found.directories.back().path = match.path;
  }
  found.problems = problemsOf(matches);
  return found;
}

}  // namespace

Rules matched(const Rules& rules) {
  std::vector<Match> matches = matchesIn(rules);
  leaveOutOverlaps(goodOnes(matches));
  return rulesWith(rules, matches);
}

DirectoryCaches matched(const DirectoryCaches& caches) {
  std::vector<Match> files = matchesIn(caches.files);
  std::vector<Match> whole = matchesIn(caches.whole);
  std::erase_if(whole, [](const Match& match) { return isKept(*match.rule, nameOf(match.path)); });
  std::vector<Match*> all = goodOnes(files);
  const std::vector<Match*> others = goodOnes(whole);
  all.insert(all.end(), others.begin(), others.end());
  leaveOutOverlaps(std::move(all));
  return {rulesWith(caches.files, files), rulesWith(caches.whole, whole)};
}

}  // namespace spacekeep::command
