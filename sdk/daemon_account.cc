#include "sdk/daemon_account.h"

#include <pwd.h>

#include <cerrno>
#include <vector>

namespace spacekeep::sdk {

std::optional<uid_t> accountNumber(const std::string& name) {
  constexpr std::size_t kMostBytes = 1024 * 1024;
  std::vector<char> text(1024);
  for (;;) {
    passwd entry{};
    passwd* found = nullptr;
    const int error = ::getpwnam_r(name.c_str(), &entry, text.data(), text.size(), &found);
    if (error == ERANGE && text.size() < kMostBytes) {
      text.resize(text.size() * 2);
      continue;
    }
    return error == 0 && found != nullptr ? std::optional<uid_t>(found->pw_uid) : std::nullopt;
  }
}

}  // namespace spacekeep::sdk
