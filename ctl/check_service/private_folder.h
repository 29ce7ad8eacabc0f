// Thread safety: one object at a time in a process, made by its main thread.
//
// A folder for the sockets and the output of the service, gone when the check is over, also when a
// person interrupts it.
#pragma once

#include <string>

namespace spacekeep::ctl {

class PrivateFolder {
 public:
  /// The name of the folder is empty when it could not be made.
  PrivateFolder();
  ~PrivateFolder();
  PrivateFolder(const PrivateFolder&) = delete;
  PrivateFolder& operator=(const PrivateFolder&) = delete;

  [[nodiscard]] const std::string& path() const { return path_; }

 private:
  std::string path_;
};

}  // namespace spacekeep::ctl
