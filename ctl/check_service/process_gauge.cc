#include "ctl/check_service/process_gauge.h"

#include <filesystem>
#include <fstream>
#include <iterator>
#include <string>
#include <system_error>

namespace spacekeep::ctl {

std::optional<ProcessUse> useOf(pid_t pid) {
  namespace fs = std::filesystem;
  const std::string folder = "/proc/" + std::to_string(pid);
  std::error_code error;
  const fs::directory_iterator descriptors(folder + "/fd", error);
  if (error) return std::nullopt;
  ProcessUse use;
  use.descriptors =
      static_cast<std::uint64_t>(std::distance(descriptors, fs::directory_iterator()));
  std::ifstream status(folder + "/status");
  for (std::string key; status >> key;) {
    if (key == "RssAnon:" && status >> use.memory_bytes) use.memory_bytes *= 1024;
    if (key == "Threads:") status >> use.threads;
  }
  return use;
}

}  // namespace spacekeep::ctl
