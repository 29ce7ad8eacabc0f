#include "services/command/rules/rule_files.h"

#include <algorithm>
#include <filesystem>
#include <map>
#include <optional>
#include <system_error>

#include "services/command/rules/rule_reader.h"

namespace spacekeep::command {
namespace {

namespace fs = std::filesystem;

/// A rule in the making: what all files of one name say together.
struct Layers {
  std::string file;  // the last one, for error texts
  Value document{Dictionary{}};
};

std::string nameOf(const std::string& file) { return fs::path(file).stem().string(); }

std::optional<RuleError> lay(const std::string& file, Layers& layers) {
  auto read = cachedir::readDocument(file);
  if (auto* error = std::get_if<RuleError>(&read)) return std::move(*error);
  Value& value = std::get<Value>(read);
  if (value.dictionary() == nullptr) {
    return RuleError{file + ": the top level is not a dictionary; begin with a dictionary"};
  }
  Dictionary merged = *layers.document.dictionary();
  for (const auto& entry : *value.dictionary()) merged.set(entry.key, entry.value);
  layers = {file, Value(std::move(merged))};
  return std::nullopt;
}

std::vector<std::string> plistsIn(const std::string& folder) {
  std::vector<std::string> files;
  std::error_code error;
  for (fs::directory_iterator each(folder, error), end; !error && each != end;
       each.increment(error)) {
    const std::string name = each->path().filename().string();
    if (name.ends_with(".plist") && !name.starts_with(".")) files.push_back(each->path().string());
  }
  std::ranges::sort(files);
  return files;
}

std::optional<RuleError> layFolders(const RulesWanted& wanted,
                                    std::map<std::string, Layers>& by_name) {
  for (const std::string& folder : wanted.folders) {
    for (const std::string& file : plistsIn(folder)) {
      const std::string name = nameOf(file);
      if (!wanted.only.empty() && std::ranges::find(wanted.only, name) == wanted.only.end()) {
        continue;
      }
      if (auto error = lay(file, by_name[name])) return error;
      if (by_name.size() > kMaxRules) {
        return RuleError{folder + ": more than 128 rules; serve them in two processes"};
      }
    }
  }
  for (const std::string& name : wanted.only) {
    if (!by_name.contains(name)) {
      return RuleError{name + ": no rule of this name; see the files in the rule directories"};
    }
  }
  return std::nullopt;
}

}  // namespace

std::variant<std::vector<Rule>, RuleError> readRules(const RulesWanted& wanted,
                                                     const UserFolders* folders) {
  std::map<std::string, Layers> by_name;
  if (auto error = layFolders(wanted, by_name)) return std::move(*error);
  std::vector<std::pair<std::string, Layers>> all(by_name.begin(), by_name.end());
  for (const std::string& file : wanted.files) {
    Layers single;
    if (auto error = lay(file, single)) return std::move(*error);
    all.emplace_back(nameOf(file), std::move(single));
  }
  std::vector<Rule> rules;
  for (const auto& [name, layers] : all) {
    auto rule = ruleOf(layers.document, layers.file, name, folders);
    if (auto* error = std::get_if<RuleError>(&rule)) return std::move(*error);
    rules.push_back(std::move(std::get<Rule>(rule)));
  }
  return rules;
}

}  // namespace spacekeep::command
