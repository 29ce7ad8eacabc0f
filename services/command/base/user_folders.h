// Thread safety: plain values; the functions read the process's environment and the user database.
//
// Where a user's files are: the home directory of the passwd entry and the base directories of the
// XDG convention. A variable only counts when what it names belongs to the user, because whoever
// set the environment may have been somebody else (sudo, su), and when that is no more than what its
// name says: a cache folder that holds the home directory or another of the folders is none.
#pragma once

#include <sys/types.h>

#include <functional>
#include <optional>
#include <string>
#include <string_view>
#include <variant>
#include <vector>

namespace spacekeep::command {

struct UserFolders {
  uid_t uid = 0;
  std::string name;  // login name
  // Absolute, without symbolic links, without a slash at the end.
  std::string home;
  std::string cache;
  std::string data;
  std::string config;
  std::string state;
  std::string runtime;                // empty when there is none
  std::vector<std::string> problems;  // variables that were not believed, in words
};

/// Reads a variable of the environment; none when it is not set.
using Variable = std::function<std::optional<std::string>(const char* name)>;
[[nodiscard]] std::optional<std::string> environmentVariable(const char* name);

/// The folders of `uid`, or why there are none.
[[nodiscard]] std::variant<UserFolders, std::string> foldersOf(
    uid_t uid, const Variable& variable = environmentVariable);

/// The same for a home directory that is known already.
[[nodiscard]] std::variant<UserFolders, std::string> foldersBelow(uid_t uid, std::string name,
                                                                  const std::string& home,
                                                                  const Variable& variable);

/// `text` with "~/", "$XDG_CACHE_HOME/", "$XDG_DATA_HOME/", "$XDG_CONFIG_HOME/" or
/// "$XDG_STATE_HOME/" at its beginning filled in. None when it begins so and `folders` is null.
[[nodiscard]] std::optional<std::string> filledIn(std::string_view text,
                                                  const UserFolders* folders);

}  // namespace spacekeep::command
