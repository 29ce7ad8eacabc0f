#include "services/command/base/user_folders.h"

#include <pwd.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <memory>
#include <utility>

#include "services/cachedir/engine/beneath.h"

namespace spacekeep::command {
namespace {

// A rule that names a folder which must not be used finds nothing there; the others go on.
constexpr const char* kNowhere = "/nonexistent";

struct Freed {
  void operator()(char* text) const { std::free(text); }
};

/// The real path, or what is given when there is nothing (yet).
std::string realPathOf(const std::string& path) {
  const std::unique_ptr<char, Freed> real(::realpath(path.c_str(), nullptr));
  if (real) return real.get();
  std::string cut = path;
  while (cut.size() > 1 && cut.back() == '/') cut.pop_back();
  return cut;
}

/// Whether it is a directory of that user. What does not exist is nobody else's.
bool isOwnOrMissing(const std::string& path, uid_t uid) {
  struct stat facts {};
  if (::stat(path.c_str(), &facts) != 0) return errno == ENOENT;
  return S_ISDIR(facts.st_mode) && facts.st_uid == uid;
}

bool holds(const std::string& folder, const std::string& other) {
  return (other + "/").starts_with(folder == "/" ? folder : folder + "/");
}

class Reader {
 public:
  Reader(UserFolders& folders, const Variable& variable) : folders_(folders), variable_(variable) {}

  /// What `name` names, or `otherwise` below the home directory.
  std::string folder(const char* name, const char* otherwise) {
    if (const auto named = believed(name)) return *named;
    const std::string usual = folders_.home + "/" + otherwise;
    const std::string why_not = objection(usual, "belongs to somebody else");
    if (why_not.empty()) return realPathOf(usual);
    folders_.problems.push_back(usual + ": " + why_not + "; nothing is done there");
    return kNowhere;
  }
  std::string runtime() { return believed("XDG_RUNTIME_DIR").value_or(""); }

 private:
  /// Rules take what they find below a folder for what its name says; below the home directory they
  /// would find everything.
  std::string objection(const std::string& path, const char* to_others) const {
    if (!isOwnOrMissing(path, folders_.uid)) return to_others;
    return holds(realPathOf(path), folders_.home) ? "holds the home directory" : "";
  }
  std::optional<std::string> believed(const char* name) {
    const auto value = variable_(name);
    // The convention itself says that a relative path is to be ignored.
    if (!value || value->empty() || value->front() != '/') return std::nullopt;
    const std::string why_not = objection(*value, "not a directory of this user");
    if (why_not.empty()) return realPathOf(*value);
    folders_.problems.push_back(std::string(name) + "=" + *value + ": " + why_not +
                                "; the usual one is taken");
    return std::nullopt;
  }

  UserFolders& folders_;
  const Variable& variable_;
};

/// What rules find in the cache folder goes, so it must not hold what is no cache.
void keepApart(UserFolders& folders) {
  for (const std::string& other : {folders.data, folders.config, folders.state}) {
    if (folders.cache == kNowhere || !holds(folders.cache, other)) continue;
    folders.problems.push_back(folders.cache + ": the cache folder holds " + other +
                               "; nothing is done there");
    folders.cache = kNowhere;
  }
}

struct Prefix {
  std::string_view text;
  std::string UserFolders::*folder;
};

constexpr Prefix kPrefixes[] = {{"~/", &UserFolders::home},
                                {"$XDG_CACHE_HOME/", &UserFolders::cache},
                                {"$XDG_DATA_HOME/", &UserFolders::data},
                                {"$XDG_CONFIG_HOME/", &UserFolders::config},
                                {"$XDG_STATE_HOME/", &UserFolders::state}};

}  // namespace

std::optional<std::string> environmentVariable(const char* name) {
  // With more rights than its starter a program must not be led by the starter's words.
  const char* value = ::secure_getenv(name);
  return value == nullptr ? std::nullopt : std::optional<std::string>(value);
}

std::variant<UserFolders, std::string> foldersBelow(uid_t uid, std::string name,
                                                    const std::string& home,
                                                    const Variable& variable) {
  struct stat facts {};
  if (home.empty() || home.front() != '/' || ::stat(home.c_str(), &facts) != 0 ||
      !S_ISDIR(facts.st_mode)) {
    return "the home directory \"" + home + "\" of " + name + " is not there; nothing can be done";
  }
  if (facts.st_uid != uid) {
    return "the home directory \"" + home + "\" does not belong to " + name +
           "; nothing is done there";
  }
  UserFolders folders;
  folders.uid = uid;
  folders.name = std::move(name);
  folders.home = realPathOf(home);
  Reader reader(folders, variable);
  folders.cache = reader.folder("XDG_CACHE_HOME", ".cache");
  folders.data = reader.folder("XDG_DATA_HOME", ".local/share");
  folders.config = reader.folder("XDG_CONFIG_HOME", ".config");
  folders.state = reader.folder("XDG_STATE_HOME", ".local/state");
  folders.runtime = reader.runtime();
  keepApart(folders);
  return folders;
}

std::variant<UserFolders, std::string> foldersOf(uid_t uid, const Variable& variable) {
  std::vector<char> room(64 * 1024);
  passwd entry{};
  passwd* found = nullptr;
  if (::getpwuid_r(uid, &entry, room.data(), room.size(), &found) != 0 || found == nullptr) {
    return "user number " + std::to_string(uid) + " has no entry in the user database";
  }
  return foldersBelow(uid, entry.pw_name, entry.pw_dir, variable);
}

std::optional<std::string> filledIn(std::string_view text, const UserFolders* folders) {
  for (const Prefix& prefix : kPrefixes) {
    if (!text.starts_with(prefix.text)) continue;
    if (folders == nullptr) return std::nullopt;
    return folders->*prefix.folder + "/" + std::string(text.substr(prefix.text.size()));
  }
  return std::string(text);
}

}  // namespace spacekeep::command
