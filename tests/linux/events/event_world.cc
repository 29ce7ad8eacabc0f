#include "tests/linux/events/event_world.h"

#include <gtest/gtest.h>
#include <poll.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <array>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <fstream>

namespace spacekeep::test {

bool comesTrue(const std::function<bool()>& condition) {
  for (int i = 0; i < 4000; ++i) {
    if (condition()) return true;
    ::usleep(5000);
  }
  return false;
}

ScratchDirectory::ScratchDirectory()
    : path_((std::filesystem::temp_directory_path() / "events.XXXXXX").string()) {
  EXPECT_NE(::mkdtemp(path_.data()), nullptr);
}

ScratchDirectory::~ScratchDirectory() { std::filesystem::remove_all(path_); }

std::string ScratchDirectory::write(const std::string& name, const std::string& content) const {
  const std::filesystem::path path = std::filesystem::path(path_) / name;
  std::filesystem::create_directories(path.parent_path());
  std::ofstream(path) << content;
  return path.string();
}

NotifySocket::NotifySocket(const ScratchDirectory& directory)
    : fd_(::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0)) {
  const std::string path = directory.path() + "/notify";
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  std::memcpy(address.sun_path, path.c_str(), path.size() + 1);
  EXPECT_EQ(::bind(fd_, reinterpret_cast<const sockaddr*>(&address), sizeof(address)), 0);
  ::setenv("NOTIFY_SOCKET", path.c_str(), 1);
}

NotifySocket::~NotifySocket() {
  ::unsetenv("NOTIFY_SOCKET");
  ::close(fd_);
}

std::string NotifySocket::next(int wait_ms) const {
  pollfd readable{.fd = fd_, .events = POLLIN, .revents = 0};
  if (::poll(&readable, 1, wait_ms) <= 0) return "";
  std::array<char, 4096> buffer{};
  const ssize_t count = ::recv(fd_, buffer.data(), buffer.size(), 0);
  return count < 0 ? "" : std::string(buffer.data(), static_cast<std::size_t>(count));
}

}  // namespace spacekeep::test
