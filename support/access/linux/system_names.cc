#include <grp.h>
#include <pwd.h>

#include <cerrno>

#include "support/access/linux/load_rules.h"

namespace spacekeep::access {
namespace {

constexpr std::size_t kMaxEntryBytes = 1024 * 1024;  // a group with very many members

/// Asks with a larger buffer as long as the entry does not fit.
template <class Entry, class Ask>
std::optional<Entry> askDatabase(const std::string& name, Ask ask) {
  for (std::vector<char> buffer(1024); buffer.size() <= kMaxEntryBytes;
       buffer.resize(buffer.size() * 4)) {
    Entry entry{};
    Entry* found = nullptr;
    const int error = ask(name.c_str(), &entry, buffer.data(), buffer.size(), &found);
    if (error == ERANGE) continue;
    if (error != 0 || found == nullptr) return std::nullopt;
    return entry;  // only its numbers are good beyond this point
  }
  return std::nullopt;
}

std::optional<std::uint32_t> userNumber(const std::string& name) {
  const auto entry = askDatabase<passwd>(name, &::getpwnam_r);
  return entry ? std::optional<std::uint32_t>(entry->pw_uid) : std::nullopt;
}

std::optional<std::uint32_t> groupNumber(const std::string& name) {
  const auto entry = askDatabase<group>(name, &::getgrnam_r);
  return entry ? std::optional<std::uint32_t>(entry->gr_gid) : std::nullopt;
}

}  // namespace

NameLookup systemNameLookup() { return {&userNumber, &groupNumber}; }

}  // namespace spacekeep::access
