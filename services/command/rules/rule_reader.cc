#include "services/command/rules/rule_reader.h"

#include <string_view>
#include <utility>

#include "services/command/rules/clean_reader.h"
#include "services/command/rules/field_reader.h"

namespace spacekeep::command {
namespace {

// What an engine for directories knows by itself.
constexpr std::string_view kServiceKeys[] = {"SPACEKEEP_ID", "SPACEKEEP_SERVICES",
                                             "SPACEKEEP_NOTIFICATIONS", "SPACEKEEP_DO_NOT_QUERY"};
constexpr std::string_view kKeys[] = {"SPACEKEEP_ID",
                                      "SPACEKEEP_SERVICES",
                                      "SPACEKEEP_NOTIFICATIONS",
                                      "SPACEKEEP_DO_NOT_QUERY",
                                      "ENABLED",
                                      "DESCRIPTION",
                                      "TAKES",
                                      "LOSES",
                                      "SOURCE",
                                      "NOT_WHILE",
                                      "IDLE_PROCESSES",
                                      "OWNERS_LOCKS",
                                      "DIRECTORIES",
                                      "MEASURE",
                                      "CLEAN"};

class Reader {
 public:
  Reader(const std::string& file, const UserFolders* folders) : fields_(file, folders) {}

  std::variant<Rule, RuleError> read(const Value& document, const std::string& name) {
    const Dictionary* top = document.dictionary();
    if (top == nullptr) {
      fields_.fail("", "the top level is not a dictionary", "begin with a dictionary");
    } else {
      fields_.onlyKnown(*top, kKeys, "");
      rule_.name = name;
      readWords(*top);
      readConditions(*top);
      readLocks(*top);
      readCache(*top);
    }
    if (!fields_.good()) return RuleError{fields_.error()};
    return std::move(rule_);
  }

 private:
  void readWords(const Dictionary& top);
  void readConditions(const Dictionary& top);
  void readLocks(const Dictionary& top);
  void readCache(const Dictionary& top);
  void readDirectories(const Dictionary& top, const Array& list);
  void readTool(const Dictionary& top);
  cachedir::Rules engineRules(const Dictionary& top, Array directories, std::string_view key);

  FieldReader fields_;
  Rule rule_;
};

void Reader::readWords(const Dictionary& top) {
  rule_.enabled = fields_.truth(top, "ENABLED", true, "");
  rule_.description = fields_.text(top, "DESCRIPTION", "");
  rule_.loses = fields_.text(top, "LOSES", "");
  rule_.source = fields_.text(top, "SOURCE", "");
  const Value* takes = top.find("TAKES");
  const Dictionary* by_urgency = takes == nullptr ? nullptr : fields_.dictionary(*takes, "TAKES");
  if (by_urgency == nullptr) return;
  constexpr std::string_view urgencies[] = {"1", "2", "3", "4"};
  fields_.onlyKnown(*by_urgency, urgencies, "TAKES");
  for (std::size_t i = 0; i < kUrgencies; ++i) {
    rule_.takes[i] = fields_.text(*by_urgency, urgencies[i], "TAKES ");
  }
}

/// The one key and its text in each dictionary of a list.
struct OneKey {
  std::string key;
  std::string text;
  std::string where;
};

std::vector<OneKey> oneKeyEach(FieldReader& fields, const Dictionary& top, std::string_view key,
                               std::span<const std::string_view> known) {
  std::vector<OneKey> found;
  const Value* value = top.find(key);
  if (value == nullptr) return found;
  const Array* list = value->array();
  if (list == nullptr || list->size() > kMaxConditions) {
    fields.fail(std::string(key), "not an array of at most 64 dictionaries", "give one");
    return found;
  }
  for (std::size_t i = 0; i < list->size(); ++i) {
    const std::string where = std::string(key) + "[" + std::to_string(i) + "]";
    const Dictionary* each = fields.dictionary((*list)[i], where);
    if (each == nullptr) return found;
    fields.onlyKnown(*each, known, where);
    if (each->size() != 1) {
      fields.fail(where, "not exactly one key", "make one dictionary of each");
      return found;
    }
    const std::string name = each->begin()->key;
    found.push_back({name, fields.text(*each, name, where + " "), where + " " + name});
  }
  return found;
}

/// Of a key that names a path.
Condition::Kind kindOf(const std::string& key) {
  if (key == "LOCKED") return Condition::Kind::kLocked;
  return key == "OPEN" ? Condition::Kind::kOpen : Condition::Kind::kPidFile;
}

void Reader::readConditions(const Dictionary& top) {
  constexpr std::string_view known[] = {"PROCESS", "LOCKED", "PID_FILE", "OPEN"};
  const auto idle = fields_.texts(top, "IDLE_PROCESSES", kMaxConditions, "");
  for (const OneKey& each : oneKeyEach(fields_, top, "NOT_WHILE", known)) {
    Condition condition;
    if (each.key == "PROCESS") {
      condition.subject = each.text;
      condition.idle = idle;
      if (each.text.find('/') != std::string::npos) {
        fields_.fail(each.where, "\"" + each.text + "\" holds a slash",
                     "give the executable's name without its directory");
      }
    } else {
      condition.kind = kindOf(each.key);
      condition.subject = fields_.path(each.text, each.where);
    }
    rule_.not_while.push_back(std::move(condition));
  }
}

void Reader::readLocks(const Dictionary& top) {
  constexpr std::string_view known[] = {"RECORD", "FLOCK"};
  for (const OneKey& each : oneKeyEach(fields_, top, "OWNERS_LOCKS", known)) {
    rule_.locks.push_back(
        {each.key == "FLOCK" ? OwnersLock::Kind::kFlock : OwnersLock::Kind::kRecord,
         fields_.path(each.text, each.where)});
  }
}

/// Has the engine for directories read `directories`, so that one text of rules holds for both.
cachedir::Rules Reader::engineRules(const Dictionary& top, Array directories,
                                    std::string_view key) {
  Dictionary document;
  for (const std::string_view each : kServiceKeys) {
    if (const Value* value = top.find(each)) document.set(each, *value);
  }
  document.set("DIRECTORIES", std::move(directories));
  auto read = cachedir::rulesOf(Value(std::move(document)), fields_.file());
  if (auto* rules = std::get_if<cachedir::Rules>(&read)) return std::move(*rules);
  std::string text = std::get<RuleError>(read).text;
  const std::string_view theirs = "DIRECTORIES";
  const std::size_t at = text.find(theirs, fields_.file().size());
  if (at != std::string::npos) text.replace(at, theirs.size(), key);
  fields_.failWith(text);
  return {};
}

void Reader::readCache(const Dictionary& top) {
  const Value* directories = top.find("DIRECTORIES");
  const bool by_tool = top.contains("CLEAN") || top.contains("MEASURE");
  if ((directories != nullptr) == by_tool) {
    fields_.fail("", "neither DIRECTORIES alone nor MEASURE with CLEAN",
                 "give DIRECTORIES for caches of files, or MEASURE and CLEAN for a tool");
    return;
  }
  if (by_tool) return readTool(top);
  const Array* list = directories->array();
  if (list == nullptr || list->empty()) {
    fields_.fail("DIRECTORIES", "not an array of dictionaries",
                 "describe each cache directory by a dictionary with a PATH");
    return;
  }
  readDirectories(top, *list);
}

void Reader::readDirectories(const Dictionary& top, const Array& list) {
  Array all;
  std::vector<bool> whole;
  for (std::size_t i = 0; i < list.size() && fields_.good(); ++i) {
    const std::string where = "DIRECTORIES[" + std::to_string(i) + "]";
    const Dictionary* from = fields_.dictionary(list[i], where);
    if (from == nullptr) return;
    Dictionary each = *from;
    whole.push_back(fields_.truth(each, "WHOLE_DIRECTORIES", false, where + " "));
    each.remove("WHOLE_DIRECTORIES");
    if (const std::string* path = stringAt(each, "PATH")) {
      each.set("PATH", fields_.path(*path, where + " PATH"));
    }
    all.emplace_back(std::move(each));
  }
  if (!fields_.good()) return;
  cachedir::Rules rules = engineRules(top, std::move(all), "DIRECTORIES");
  if (!fields_.good()) return;
  DirectoryCaches caches;
  for (std::size_t i = 0; i < rules.directories.size(); ++i) {
    (whole[i] ? caches.whole : caches.files).directories.push_back(rules.directories[i]);
  }
  rule_.service_id = rules.service_id;
  rule_.purges = rules.purges;
  rule_.periodic = rules.periodic;
  rule_.notifications = std::move(rules.notifications);
  rule_.cache = std::move(caches);
}

void Reader::readTool(const Dictionary& top) {
  ToolCache cache;
  if (!rule_.locks.empty()) {
    fields_.fail("OWNERS_LOCKS", "not with CLEAN, because the tool takes its locks itself",
                 "use NOT_WHILE with LOCKED");
  }
  Array measured;
  for (const std::string& path : fields_.texts(top, "MEASURE", cachedir::kMaxDirectories, "")) {
    measured.emplace_back(Dictionary{{"PATH", fields_.path(path, "MEASURE")}});
  }
  if (measured.empty()) {
    fields_.fail("MEASURE", "missing or empty",
                 "name the directories that shrink when the tool cleans");
  }
  if (fields_.good()) cache.measured = engineRules(top, std::move(measured), "MEASURE");
  readClean(top, fields_, cache.steps);
  rule_.service_id = cache.measured.service_id;
  rule_.purges = cache.measured.purges;
  rule_.periodic = cache.measured.periodic;
  rule_.notifications = cache.measured.notifications;
  rule_.cache = std::move(cache);
}

}  // namespace

std::variant<Rule, RuleError> ruleOf(const Value& document, const std::string& file,
                                     const std::string& name, const UserFolders* folders) {
  return Reader(file, folders).read(document, name);
}

}  // namespace spacekeep::command
