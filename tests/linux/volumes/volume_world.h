// Thread safety: none; one test at a time.
//
// Real file systems for tests: loop devices and memory, in a mount namespace of the test process's
// own. Needs root; what is left mounted goes with the process.
#pragma once

#include <cstdint>
#include <filesystem>
#include <string>
#include <vector>

namespace spacekeep::test {

class VolumeWorld {
 public:
  VolumeWorld();
  ~VolumeWorld();
  VolumeWorld(const VolumeWorld&) = delete;
  VolumeWorld& operator=(const VolumeWorld&) = delete;

  /// A directory, made when missing. The path is the one that the mount table shows.
  std::string directory(const std::string& name);
  /// A fresh file system of `size_mib` on a loop device (or tmpfs), mounted at directory(name).
  std::string mountFresh(const std::string& type, const std::string& name, std::uint64_t size_mib);
  void bind(const std::string& from, const std::string& to);
  void unmount(const std::string& path);

  /// Runs a command line, which must succeed.
  static void run(const std::string& command);
  /// A file of that many bytes, all of them written and on the device.
  static void fill(const std::filesystem::path& file, std::uint64_t bytes);

 private:
  std::filesystem::path root_;
  std::vector<std::string> mounted_;
};

}  // namespace spacekeep::test
