#include "tests/linux/volumes/volume_world.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sched.h>
#include <sys/mount.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <stdexcept>

namespace spacekeep::test {
namespace {

[[noreturn]] void fail(const std::string& what) {
  throw std::runtime_error(what + ": " + std::strerror(errno));
}

/// Once for the process: its mounts are its own from then on.
void enterOwnNamespace() {
  static const bool entered = [] {
    if (::geteuid() != 0) throw std::runtime_error("tests of real volumes mount, and need root");
    if (::unshare(CLONE_NEWNS) < 0) fail("unshare");
    if (::mount("none", "/", nullptr, MS_REC | MS_PRIVATE, nullptr) < 0) fail("mount private");
    return true;
  }();
  (void)entered;
}

}  // namespace

VolumeWorld::VolumeWorld() {
  enterOwnNamespace();
  std::string path = (std::filesystem::temp_directory_path() / "volumes.XXXXXX").string();
  if (::mkdtemp(path.data()) == nullptr) fail("mkdtemp");
  root_ = std::filesystem::canonical(path);
}

VolumeWorld::~VolumeWorld() {
  while (!mounted_.empty()) {
    ::umount2(mounted_.back().c_str(), MNT_DETACH);
    mounted_.pop_back();
  }
  std::error_code ignored;
  std::filesystem::remove_all(root_, ignored);
}

std::string VolumeWorld::directory(const std::string& name) {
  std::filesystem::create_directories(root_ / name);
  return (root_ / name).string();
}

std::string VolumeWorld::mountFresh(const std::string& type, const std::string& name,
                                    std::uint64_t size_mib) {
  const std::string place = directory(name);
  const std::string size = std::to_string(size_mib) + "M";
  if (type == "tmpfs") {
    run("mount -t tmpfs -o size=" + size + " none " + place);
  } else {
    const std::string image = (root_ / (name + ".img")).string();
    run("truncate -s " + size + " " + image);
    run("mkfs." + type + " -q " + image + " >/dev/null");
    run("mount -o loop " + image + " " + place);
  }
  mounted_.push_back(place);
  return place;
}

void VolumeWorld::bind(const std::string& from, const std::string& to) {
  if (::mount(from.c_str(), to.c_str(), nullptr, MS_BIND, nullptr) < 0) fail("bind " + to);
  mounted_.push_back(to);
}

void VolumeWorld::unmount(const std::string& path) {
  // Whoever measures the volume at this moment holds it for some microseconds.
  for (int tries = 0; ::umount2(path.c_str(), 0) < 0; ++tries) {
    if (errno != EBUSY || tries == 2000) fail("umount " + path);
    ::usleep(1000);
  }
  std::erase(mounted_, path);
}

void VolumeWorld::run(const std::string& command) {
  if (std::system(command.c_str()) != 0) throw std::runtime_error("failed: " + command);
}

void VolumeWorld::fill(const std::filesystem::path& file, std::uint64_t bytes) {
  const int fd = ::open(file.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0600);
  if (fd < 0) fail("open");
  // Bytes that no file system squeezes together.
  std::vector<std::uint32_t> block(64 * 1024);
  std::uint32_t state = 1;
  for (std::uint32_t& word : block) word = state = state * 1664525U + 1013904223U;
  const std::uint64_t block_bytes = block.size() * sizeof(block[0]);
  for (std::uint64_t written = 0; written < bytes; written += block_bytes) {
    const auto count = static_cast<std::size_t>(std::min(block_bytes, bytes - written));
    if (::write(fd, block.data(), count) != static_cast<ssize_t>(count)) fail("write");
  }
  if (::fsync(fd) < 0 || ::close(fd) < 0) fail("fsync");
}

}  // namespace spacekeep::test
