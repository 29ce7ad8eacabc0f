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

RuleError directoryError(int error) {
  RuleError reason = systemError(error);
  if (error == EACCES) reason.reason += "; let the daemon's user read it (chmod go+rx)";
  return reason;
}

/// Why somebody else could have written this, none when nobody could.
std::optional<RuleError> distrust(const struct stat& status, uid_t own_user) {
  if (status.st_uid != 0 && status.st_uid != own_user) {
    return RuleError{fmt::format("is owned by user {}, must be root's", status.st_uid)};
  }
  if ((status.st_mode & (S_IWGRP | S_IWOTH)) != 0) {
    return RuleError{"can be written by others than its owner; take that right away (chmod go-w)"};
  }
  return std::nullopt;
}

std::optional<RuleError> refuseFile(const struct stat& status, uid_t own_user) {
  if (!S_ISREG(status.st_mode)) return RuleError{"is no regular file"};
  if (static_cast<std::uint64_t>(status.st_size) > kMaxRuleFileBytes) {
    return RuleError{fmt::format("is larger than {} bytes", kMaxRuleFileBytes)};
  }
  return distrust(status, own_user);
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
OrReason<Bytes> readRuleFile(int directory, const std::string& name, uid_t own_user) {
  const int fd = ::openat(directory, name.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOCTTY);
  if (fd < 0) return systemError(errno);
  const ipc::Descriptor file(fd);
  struct stat status {};
  if (::fstat(fd, &status) < 0) return systemError(errno);
  if (auto refusal = refuseFile(status, own_user)) return *refusal;
  return readAll(fd);
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
  for (;;) {
    errno = 0;
    const dirent* entry = ::readdir(entries.get());
    if (entry == nullptr && errno != 0) return systemError(errno);
    if (entry == nullptr) return names;
    const std::string name = entry->d_name;
    if (!name.starts_with('.') && name.ends_with(".plist")) names.insert(name);
    if (names.size() > kMaxRuleFiles) {
      return RuleError{fmt::format("holds more than {} rule files", kMaxRuleFiles)};
    }
  }
}

/// A link to nothing is there: what it should lead to may deny something.
bool isMissing(const std::string& path) {
  struct stat status {};
  return ::lstat(path.c_str(), &status) < 0 && errno == ENOENT;
}

/// The walk over the two directories, with what it has found so far.
class Reading {
 public:
  Reading(const NameLookup& lookup, uid_t own_user) : lookup_(lookup), own_user_(own_user) {}

  void readDirectory(const std::string& path) {
    if (isMissing(path)) return;
    const int fd = ::open(path.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC);
    if (fd < 0) return unused(path, directoryError(errno));
    const ipc::Descriptor directory(fd);
    struct stat status {};
    // "." is found only with the right to search, which every file in there takes as well.
    if (::fstatat(fd, ".", &status, 0) < 0) return unused(path, directoryError(errno));
    if (const auto reason = distrust(status, own_user_)) return unused(path, *reason);
    const auto names = ruleFileNames(::fcntl(fd, F_DUPFD_CLOEXEC, 0));
    if (const auto* error = std::get_if<RuleError>(&names)) return unused(path, *error);
    for (const std::string& name : std::get<std::set<std::string>>(names)) {
      readFile(path, fd, name);
    }
  }

  ReadRules takeResult() {
    ReadRules result{.rules = {}, .findings = std::move(findings_)};
    if (!all_directories_used_) return result;
    for (auto& [name, rule] : rules_) result.rules.push_back(std::move(rule));
    return result;
  }

 private:
  using Kind = RuleFileFinding::Kind;

  void readFile(const std::string& directory_path, int directory, const std::string& name) {
    const std::string path = directory_path + "/" + name;
    const auto [earlier, first] = seen_.try_emplace(name, path);
    if (!first) findings_.push_back({Kind::kReplaces, path, earlier->second});
    auto parsed = readRule(directory, name);
    if (const auto* error = std::get_if<RuleError>(&parsed)) {
      findings_.push_back({Kind::kGrantsNothing, path, error->reason});
      rules_.erase(name);
      return;
    }
    auto& [rule, remarks] = std::get<ParsedRule>(parsed);
    for (std::string& remark : remarks) findings_.push_back({Kind::kRemark, path, remark});
    rules_.insert_or_assign(name, std::move(rule));
  }

  OrReason<ParsedRule> readRule(int directory, const std::string& name) const {
    const auto bytes = readRuleFile(directory, name, own_user_);
    if (const auto* error = std::get_if<RuleError>(&bytes)) return *error;
    const auto document = parsePlist(std::get<Bytes>(bytes));
    if (const auto* error = std::get_if<PlistError>(&document)) return RuleError{error->reason};
    return ruleFromDocument(name, std::get<Value>(document), lookup_);
  }

  void unused(const std::string& path, const RuleError& error) {
    all_directories_used_ = false;
    findings_.push_back({Kind::kDirectoryNotUsed, path, error.reason});
  }

  const NameLookup& lookup_;
  const uid_t own_user_;
  std::map<std::string, Rule> rules_;
  std::map<std::string, std::string> seen_;  // name, first path
  bool all_directories_used_ = true;
  std::vector<RuleFileFinding> findings_;
};

void logFinding(const RuleFileFinding& finding) {
  switch (finding.kind) {
    case RuleFileFinding::Kind::kDirectoryNotUsed:
      logProblem(
          "%s rule directory %s is not used: %s. What it denies is not known, so nobody is granted "
          "anything; mend it, then start the daemon anew",
          kOperation, finding.path, finding.text);
      break;
    case RuleFileFinding::Kind::kGrantsNothing:
      logProblem("%s rule file %s grants nothing: %s", kOperation, finding.path, finding.text);
      break;
    case RuleFileFinding::Kind::kRemark:
      logProblem("%s rule file %s: %s", kOperation, finding.path, finding.text);
      break;
    case RuleFileFinding::Kind::kReplaces:
      break;
  }
}

}  // namespace

ReadRules readRules(const std::string& vendor_directory, const std::string& administrator_directory,
                    const NameLookup& lookup, uid_t own_user) {
  Reading reading(lookup, own_user);
  reading.readDirectory(vendor_directory);
  reading.readDirectory(administrator_directory);
  return reading.takeResult();
}

std::vector<Rule> loadRules(const std::string& vendor_directory,
                            const std::string& administrator_directory, const NameLookup& lookup) {
  ReadRules read = readRules(vendor_directory, administrator_directory, lookup, ::geteuid());
  for (const auto& finding : read.findings) logFinding(finding);
  return std::move(read.rules);
}

}  // namespace spacekeep::access
