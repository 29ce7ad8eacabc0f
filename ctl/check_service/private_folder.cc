#include "ctl/check_service/private_folder.h"

#include <sys/stat.h>
#include <unistd.h>

#include <array>
#include <csignal>
#include <cstdlib>
#include <cstring>
#include <string_view>

namespace spacekeep::ctl {
namespace {

constexpr std::size_t kMostNameBytes = 128;
constexpr std::size_t kLongestParentBytes = 60;  // a socket's path has to fit into 107 bytes
constexpr std::array<std::string_view, 4> kContents{"/spacekeep.sock", "/service.sock", "/output",
                                                    ""};

/// What a signal handler can take away: names without any allocation.
std::array<std::array<char, kMostNameBytes>, kContents.size()> names{};

void removeEverything() {
  for (const auto& name : names) {
    if (name[0] != '\0' && unlink(name.data()) != 0) rmdir(name.data());
  }
}

void onSignal(int number) {
  removeEverything();
  std::signal(number, SIG_DFL);
  std::raise(number);
}

void remember(const std::string& folder) {
  for (std::size_t i = 0; i < kContents.size(); ++i) {
    const std::string name = folder + std::string(kContents[i]);
    std::memcpy(names[i].data(), name.c_str(), name.size() + 1);
  }
}

std::string parent() {
  const char* wanted = std::getenv("TMPDIR");
  const bool usable = wanted != nullptr && wanted[0] == '/' &&
                      std::strlen(wanted) <= kLongestParentBytes && access(wanted, W_OK) == 0;
  return usable ? wanted : "/tmp";
}

}  // namespace

PrivateFolder::PrivateFolder() {
  std::string name = parent() + "/spacekeep-check-XXXXXX";
  if (mkdtemp(name.data()) == nullptr) return;
  // A service under another user has to reach the sockets; it cannot list or change the folder.
  chmod(name.c_str(), 0711);
  path_ = name;
  remember(path_);
  for (const int number : {SIGINT, SIGTERM, SIGHUP}) std::signal(number, onSignal);
}

PrivateFolder::~PrivateFolder() {
  for (const int number : {SIGINT, SIGTERM, SIGHUP}) std::signal(number, SIG_DFL);
  removeEverything();
  names = {};
}

}  // namespace spacekeep::ctl
