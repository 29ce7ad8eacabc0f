#include "services/cachedir/engine/rules.h"

#include <fcntl.h>
#include <fnmatch.h>
#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <cmath>

#include "services/cachedir/engine/beneath.h"
#include "support/values/plist.h"
#include "support/values/text.h"

namespace spacekeep::cachedir {
namespace {

constexpr std::string_view kTopKeys[] = {"SPACEKEEP_ID", "SPACEKEEP_SERVICES",
                                         "SPACEKEEP_NOTIFICATIONS", "SPACEKEEP_DO_NOT_QUERY",
                                         "DIRECTORIES"};
constexpr std::string_view kDirectoryKeys[] = {"PATH", "UNUSED_DAYS", "PERIODIC_UNUSED_DAYS",
                                               "KEEP", "REMOVE_EMPTY_DIRECTORIES"};
// Naming one of these is a slip, and a costly one.
constexpr std::string_view kNeverCaches[] = {
    "/",     "/bin", "/boot", "/dev", "/etc", "/home", "/lib", "/lib64",   "/opt",   "/proc",
    "/root", "/run", "/sbin", "/sys", "/tmp", "/usr",  "/var", "/var/lib", "/System"};

/// Reads one document; the first thing that is wrong stays in `error`.
class Reader {
 public:
  explicit Reader(std::string_view file) : file_(file) {}

  std::variant<Rules, RuleError> read(const Value& document);

 private:
  bool fail(const std::string& where, const std::string& what, const std::string& advice) {
    if (error_.text.empty()) {
      // What the file says goes into it, whatever that is.
      error_.text =
          lineOf(file_ + ": " + (where.empty() ? "" : where + ": ") + what + "; " + advice);
    }
    return false;
  }
  bool onlyKnownKeys(const Dictionary& from, std::span<const std::string_view> known,
                     const std::string& where);
  bool readTexts(const Dictionary& from, std::string_view key, const std::string& where,
                 std::size_t most, std::vector<std::string>& into);
  bool readId(const Dictionary& top);
  bool readServices(const Dictionary& top);
  bool readDirectories(const Dictionary& top);
  bool readDirectory(const Value& value, const std::string& where);
  bool readPath(const Dictionary& from, const std::string& where, DirectoryRule& rule);
  bool readDays(const Value& value, const std::string& where, std::int64_t& seconds);
  bool readUnused(const Dictionary& from, const std::string& where, DirectoryRule& rule);
  bool readKeep(const Dictionary& from, const std::string& where, DirectoryRule& rule);
  bool readEmpty(const Dictionary& from, const std::string& where, DirectoryRule& rule);
  bool apartFromOthers(const std::string& where, const DirectoryRule& rule);

  std::string file_;
  Rules rules_;
  RuleError error_;
};

std::string listOf(std::span<const std::string_view> words) {
  std::string list;
  for (const std::string_view word : words) list += (list.empty() ? "" : ", ") + std::string(word);
  return list;
}

bool Reader::onlyKnownKeys(const Dictionary& from, std::span<const std::string_view> known,
                           const std::string& where) {
  for (const auto& entry : from) {
    if (std::ranges::find(known, entry.key) == known.end()) {
      return fail(where, "unknown key \"" + entry.key + "\"", "the keys are " + listOf(known));
    }
  }
  return true;
}

bool Reader::readTexts(const Dictionary& from, std::string_view key, const std::string& where,
                       std::size_t most, std::vector<std::string>& into) {
  const Value* value = from.find(key);
  if (value == nullptr) return true;
  const std::string place = (where.empty() ? "" : where + " ") + std::string(key);
  if (value->array() == nullptr) return fail(place, "not an array", "give an array of strings");
  if (value->array()->size() > most) {
    return fail(place, "too many entries", "give at most " + std::to_string(most));
  }
  for (const Value& text : *value->array()) {
    if (text.string() == nullptr || text.string()->empty()) {
      return fail(place, "an entry is not a string, or empty", "give an array of strings");
    }
    into.push_back(*text.string());
  }
  return true;
}

bool Reader::readId(const Dictionary& top) {
  const std::string* id = stringAt(top, "SPACEKEEP_ID");
  if (id == nullptr || id->empty()) {
    return fail("SPACEKEEP_ID", "missing, or not a string",
                "name the service, as com.example.cache");
  }
  rules_.service_id = *id;
  return true;
}

bool Reader::readServices(const Dictionary& top) {
  if (!top.contains("SPACEKEEP_SERVICES")) return true;
  std::vector<std::string> roles;
  if (!readTexts(top, "SPACEKEEP_SERVICES", "", 2, roles)) return false;
  rules_.purges = rules_.periodic = false;
  for (const std::string& role : roles) {
    if (role != "PURGE" && role != "PERIODIC") {
      return fail("SPACEKEEP_SERVICES", "unknown role \"" + role + "\"", "use PURGE and PERIODIC");
    }
    (role == "PURGE" ? rules_.purges : rules_.periodic) = true;
  }
  return true;
}

bool Reader::readPath(const Dictionary& from, const std::string& where, DirectoryRule& rule) {
  const std::string* path = stringAt(from, "PATH");
  const std::string place = where + " PATH";
  if (path == nullptr) return fail(place, "missing, or not a string", "give an absolute path");
  if (path->empty() || path->front() != '/' || path->size() >= 4096 ||
      path->find('\0') != std::string::npos) {
    return fail(place, "\"" + *path + "\" is not an absolute path", "begin it with a slash");
  }
  rule.path = *path;
  while (rule.path.size() > 1 && rule.path.back() == '/') rule.path.pop_back();
  const std::string framed = rule.path + "/";
  if (framed != "//" &&
      (framed.find("//") != std::string::npos || framed.find("/./") != std::string::npos ||
       framed.find("/../") != std::string::npos)) {
    return fail(place, "\"" + *path + "\" holds an empty, \".\" or \"..\" component",
                "write the path without them");
  }
  if (isSystemDirectory(rule.path)) {
    return fail(place, "\"" + *path + "\" is a system directory", "name the cache below it");
  }
  return true;
}

bool Reader::readDays(const Value& value, const std::string& where, std::int64_t& seconds) {
  const std::optional<double> days = value.asDouble();
  if (!days || !(*days >= 0) || *days > kMaxUnusedDays) {
    return fail(where, "not a number of days from 0 to 36500", "give days, as 7 or 0.5");
  }
  seconds = static_cast<std::int64_t>(std::llround(*days * static_cast<double>(kSecondsPerDay)));
  return true;
}

bool Reader::readUnused(const Dictionary& from, const std::string& where, DirectoryRule& rule) {
  const Value* periodic = from.find("PERIODIC_UNUSED_DAYS");
  if (periodic != nullptr && !readDays(*periodic, where + " PERIODIC_UNUSED_DAYS",
                                       rule.periodic_unused_seconds.emplace(0))) {
    return false;
  }
  const Value* value = from.find("UNUSED_DAYS");
  if (value == nullptr) return true;
  const std::string place = where + " UNUSED_DAYS";
  if (value->dictionary() == nullptr) {
    return fail(place, "not a dictionary", "give days under the keys 1 to 4, the urgencies");
  }
  for (const auto& entry : *value->dictionary()) {
    if (entry.key.size() != 1 || entry.key[0] < '1' || entry.key[0] > '4') {
      return fail(place, "unknown urgency \"" + entry.key + "\"", "the urgencies are 1 to 4");
    }
    const auto index = static_cast<std::size_t>(entry.key[0] - '1');
    if (!readDays(entry.value, place + " " + entry.key, rule.unused_seconds[index])) return false;
  }
  if (!std::ranges::is_sorted(rule.unused_seconds, std::ranges::greater())) {
    return fail(place, "a higher urgency spares younger files than a lower one",
                "let the days fall from 1 to 4 (without a key: 30, 7, 1 and 0)");
  }
  return true;
}

bool Reader::readKeep(const Dictionary& from, const std::string& where, DirectoryRule& rule) {
  if (!readTexts(from, "KEEP", where, kMaxPatterns, rule.keep)) return false;
  for (const std::string& pattern : rule.keep) {
    // A pattern that can match nothing would silently give up files that were meant to stay.
    if (pattern.size() > kMaxPatternBytes || pattern.front() == '/') {
      return fail(where + " KEEP", "\"" + pattern.substr(0, 80) + "\" cannot match",
                  "give at most 1024 bytes, relative to PATH and without a slash in front");
    }
  }
  return true;
}

bool Reader::readEmpty(const Dictionary& from, const std::string& where, DirectoryRule& rule) {
  const Value* value = from.find("REMOVE_EMPTY_DIRECTORIES");
  if (value == nullptr) return true;
  if (value->boolean() == nullptr) {
    return fail(where + " REMOVE_EMPTY_DIRECTORIES", "not a boolean", "give true or false");
  }
  rule.remove_empty_directories = *value->boolean();
  return true;
}

bool Reader::apartFromOthers(const std::string& where, const DirectoryRule& rule) {
  for (const DirectoryRule& other : rules_.directories) {
    if (overlap(rule.path, other.path)) {
      return fail(where + " PATH", "\"" + rule.path + "\" overlaps \"" + other.path + "\"",
                  "let each file stand under one directory only");
    }
  }
  return true;
}

bool Reader::readDirectory(const Value& value, const std::string& where) {
  const Dictionary* from = value.dictionary();
  if (from == nullptr) return fail(where, "not a dictionary", "give a dictionary with a PATH");
  DirectoryRule rule;
  if (!onlyKnownKeys(*from, kDirectoryKeys, where) || !readPath(*from, where, rule) ||
      !readUnused(*from, where, rule) || !readKeep(*from, where, rule) ||
      !readEmpty(*from, where, rule) || !apartFromOthers(where, rule)) {
    return false;
  }
  rules_.directories.push_back(std::move(rule));
  return true;
}

bool Reader::readDirectories(const Dictionary& top) {
  const Value* value = top.find("DIRECTORIES");
  const Array* list = value == nullptr ? nullptr : value->array();
  if (list == nullptr || list->empty() || list->size() > kMaxDirectories) {
    return fail("DIRECTORIES", "not an array of 1 to 64 dictionaries",
                "describe each cache directory by a dictionary with a PATH");
  }
  for (std::size_t i = 0; i < list->size(); ++i) {
    if (!readDirectory((*list)[i], "DIRECTORIES[" + std::to_string(i) + "]")) return false;
  }
  return true;
}

std::variant<Rules, RuleError> Reader::read(const Value& document) {
  const Dictionary* top = document.dictionary();
  if (top == nullptr) {
    fail("", "the top level is not a dictionary", "begin with a dictionary");
    return error_;
  }
  const bool good =
      onlyKnownKeys(*top, kTopKeys, "") && readId(*top) && readServices(*top) &&
      readTexts(*top, "SPACEKEEP_NOTIFICATIONS", "", kMaxNotifications, rules_.notifications) &&
      readDirectories(*top);
  if (!good) return error_;
  return std::move(rules_);
}

}  // namespace

std::variant<Rules, RuleError> rulesOf(const Value& document, std::string_view file) {
  return Reader(file).read(document);
}

namespace {

std::variant<Value, RuleError> parseDocument(std::span<const std::uint8_t> document,
                                             std::string_view file) {
  std::variant<Value, PlistError> parsed = parsePlist(document);
  if (const auto* error = std::get_if<PlistError>(&parsed)) {
    return RuleError{std::string(file) + ": not a property list: " + error->reason +
                     "; write it as an XML or binary property list"};
  }
  return std::move(std::get<Value>(parsed));
}

std::variant<Rules, RuleError> rulesOrError(const std::variant<Value, RuleError>& document,
                                            std::string_view file) {
  if (const auto* error = std::get_if<RuleError>(&document)) return *error;
  return rulesOf(std::get<Value>(document), file);
}

}  // namespace

std::variant<Rules, RuleError> parseRules(std::span<const std::uint8_t> document,
                                          std::string_view file) {
  return rulesOrError(parseDocument(document, file), file);
}

std::variant<Rules, RuleError> readRules(const std::string& file) {
  return rulesOrError(readDocument(file), file);
}

std::variant<Value, RuleError> readDocument(const std::string& file) {
  const UniqueFd fd(::open(file.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK));
  struct stat facts {};
  if (!fd || ::fstat(fd.get(), &facts) != 0) {
    return RuleError{file + ": cannot be opened: " + errnoText(errno) +
                     "; check the path and its rights"};
  }
  if (!S_ISREG(facts.st_mode)) return RuleError{file + ": not a file; name the rule file itself"};
  std::vector<std::uint8_t> bytes(kMaxPlistBytes + 1);
  std::size_t used = 0;
  while (used < bytes.size()) {
    const ssize_t got = ::read(fd.get(), bytes.data() + used, bytes.size() - used);
    if (got < 0 && errno == EINTR) continue;
    if (got < 0) return RuleError{file + ": cannot be read: " + errnoText(errno) + "; try again"};
    if (got == 0) break;
    used += static_cast<std::size_t>(got);
  }
  if (used > kMaxPlistBytes) return RuleError{file + ": larger than 4 MiB; make it smaller"};
  bytes.resize(used);
  return parseDocument(bytes, file);
}

bool isSystemDirectory(std::string_view path) {
  return std::ranges::find(kNeverCaches, path) != std::end(kNeverCaches);
}

bool overlap(const std::string& one, const std::string& other) {
  return (one + "/").starts_with(other + "/") || (other + "/").starts_with(one + "/");
}

bool isKept(const DirectoryRule& rule, const std::string& path) {
  const char* last =
      path.c_str() + (path.rfind('/') == std::string::npos ? 0 : path.rfind('/') + 1);
  for (const std::string& pattern : rule.keep) {
    const bool whole = pattern.find('/') != std::string::npos;
    if (::fnmatch(pattern.c_str(), whole ? path.c_str() : last, FNM_PATHNAME) == 0) return true;
  }
  return false;
}

}  // namespace spacekeep::cachedir
