#include <grp.h>
#include <pwd.h>

#include <cerrno>
#include <cstdint>
#include <optional>
#include <string>
#include <system_error>
#include <vector>

#include "support/access/linux/load_rules.h"

namespace spacekeep::access {
namespace {

constexpr std::size_t kMaxEntryBytes = 1024 * 1024;  // a group with very many members

/// What getpwnam(3) lists for a name that is not there, besides 0.
bool meansNobody(int error) {
  return error == 0 || error == ENOENT || error == ESRCH || error == EBADF || error == EPERM;
}

/// Asks with a larger buffer as long as the entry does not fit.
template <class Entry, class Ask, class Id>
NameAnswer askDatabase(const std::string& name, Ask ask, Id Entry::*id) {
  int error = ERANGE;
  for (std::vector<char> buffer(1024); buffer.size() <= kMaxEntryBytes;
       buffer.resize(buffer.size() * 4)) {
    Entry entry{};
    Entry* found = nullptr;
    error = ask(name.c_str(), &entry, buffer.data(), buffer.size(), &found);
    if (error == ERANGE) continue;
    if (error == 0 && found != nullptr) return std::optional<std::uint32_t>(entry.*id);
    break;
  }
  NameAnswer none(std::nullopt);
  if (!meansNobody(error)) none.failure = std::generic_category().message(error);
  return none;
}

NameAnswer userNumber(const std::string& name) {
  return askDatabase<passwd>(name, &::getpwnam_r, &passwd::pw_uid);
}

NameAnswer groupNumber(const std::string& name) {
  return askDatabase<group>(name, &::getgrnam_r, &group::gr_gid);
}

}  // namespace

NameLookup systemNameLookup() { return {&userNumber, &groupNumber}; }

}  // namespace spacekeep::access
