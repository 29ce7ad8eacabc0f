#include "support/access/linux/load_rules.h"

#include <dirent.h>
#include <fcntl.h>
#include <fmt/format.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <map>
#include <memory>
#include <set>
#include <system_error>
#include <utility>

#include "support/ipc/arguments.h"
#include "support/logging/log.h"
#include "support/values/plist.h"

namespace spacekeep::access {
namespace {

constexpr const char* kOperation = "loadRules";

using Bytes = std::vector<std::uint8_t>;
template <class T>
using OrReason = std::variant<T, RuleError>;

RuleError systemError(int error) { return {std::generic_category().message(error)}; }

/// Why somebody else could have written this, none when nobody could.
std::optional<RuleError> distrust(const struct stat& status) {
  if (status.st_uid != 0 && status.st_uid != ::geteuid()) {
    return RuleError{fmt::format("is owned by user {}, must be root's", status.st_uid)};
  }
  if ((status.st_mode & (S_IWGRP | S_IWOTH)) != 0) {
    return RuleError{"can be written by others than its owner; take that right away (chmod go-w)"};
  }
  return std::nullopt;
}

std::optional<RuleError> refuseFile(const struct stat& status) {
  if (!S_ISREG(status.st_mode)) return RuleError{"is no regular file"};
  if (static_cast<std::uint64_t>(status.st_size) > kMaxRuleFileBytes) {
    return RuleError{fmt::format("is larger than {} bytes", kMaxRuleFileBytes)};
  }
  return distrust(status);
}

OrReason<Bytes> readAll(int fd) {
  Bytes bytes(kMaxRuleFileBytes + 1);  // a file that grew meanwhile is noticed by the one more
  std::size_t used = 0;
  while (used < bytes.size()) {
    const ssize_t count = ::read(fd, bytes.data() + used, bytes.size() - used);
    if (count < 0 && errno == EINTR) continue;
    if (count < 0) return systemError(errno);
    if (count == 0) break;
    used += static_cast<std::size_t>(count);
  }
  if (used == bytes.size()) return RuleError{"has grown while it was read"};
  bytes.resize(used);
  return bytes;
}

/// The checks look at the file that is open, so nobody can swap it after them.
OrReason<Bytes> readRuleFile(int directory, const std::string& name) {
  const int fd = ::openat(directory, name.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOCTTY);
  if (fd < 0) return systemError(errno);
  const ipc::Descriptor file(fd);
  struct stat status {};
  if (::fstat(fd, &status) < 0) return systemError(errno);
  if (auto refusal = refuseFile(status)) return *refusal;
  return readAll(fd);
}

OrReason<ParsedRule> readRule(int directory, const std::string& name, const NameLookup& lookup) {
  const auto bytes = readRuleFile(directory, name);
  if (const auto* error = std::get_if<RuleError>(&bytes)) return *error;
  const auto document = parsePlist(std::get<Bytes>(bytes));
  if (const auto* error = std::get_if<PlistError>(&document)) return RuleError{error->reason};
  return ruleFromDocument(name, std::get<Value>(document), lookup);
}

/// The names of the rule files in an open directory, sorted. Takes over `fd`.
OrReason<std::set<std::string>> ruleFileNames(int fd) {
  const std::unique_ptr<DIR, int (*)(DIR*)> entries(::fdopendir(fd), &::closedir);
  if (entries == nullptr) {
    const int error = errno;
    ::close(fd);
    return systemError(error);
  }
  std::set<std::string> names;
  while (const dirent* entry = ::readdir(entries.get())) {
    const std::string name = entry->d_name;
    if (!name.starts_with('.') && name.ends_with(".plist")) names.insert(name);
    if (names.size() > kMaxRuleFiles) {
      return RuleError{fmt::format("holds more than {} rule files", kMaxRuleFiles)};
    }
  }
  return names;
}

void readInto(std::map<std::string, Rule>& rules, const std::string& path, int directory,
              const std::string& name, const NameLookup& lookup) {
  auto parsed = readRule(directory, name, lookup);
  if (const auto* error = std::get_if<RuleError>(&parsed)) {
    logProblem("%s rule file %s/%s grants nothing: %s", kOperation, path, name, error->reason);
    rules.erase(name);
    return;
  }
  auto& [rule, remarks] = std::get<ParsedRule>(parsed);
  for (const std::string& remark : remarks) {
    logProblem("%s rule file %s/%s: %s", kOperation, path, name, remark);
  }
  rules.insert_or_assign(name, std::move(rule));
}

void readDirectory(std::map<std::string, Rule>& rules, const std::string& path,
                   const NameLookup& lookup) {
  const int fd = ::open(path.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC);
  if (fd < 0 && errno == ENOENT) return;
  const auto complain = [&path](const RuleError& error) {
    logProblem("%s rule directory %s is not used: %s", kOperation, path, error.reason);
  };
  if (fd < 0) return complain(systemError(errno));
  const ipc::Descriptor directory(fd);
  struct stat status {};
  if (::fstat(fd, &status) < 0) return complain(systemError(errno));
  if (const auto reason = distrust(status)) return complain(*reason);
  const auto names = ruleFileNames(::fcntl(fd, F_DUPFD_CLOEXEC, 0));
  if (const auto* error = std::get_if<RuleError>(&names)) return complain(*error);
  for (const std::string& name : std::get<std::set<std::string>>(names)) {
    readInto(rules, path, fd, name, lookup);
  }
}

}  // namespace

std::vector<Rule> loadRules(const std::string& vendor_directory,
                            const std::string& administrator_directory, const NameLookup& lookup) {
  std::map<std::string, Rule> by_name;
  readDirectory(by_name, vendor_directory, lookup);
  readDirectory(by_name, administrator_directory, lookup);
  std::vector<Rule> rules;
  for (auto& [name, rule] : by_name) rules.push_back(std::move(rule));
  return rules;
}

}  // namespace spacekeep::access
