#include "ctl/doctor/listening_sockets.h"

#include <fstream>
#include <iterator>
#include <sstream>

namespace spacekeep::ctl::doctor {
namespace {

/// __SO_ACCEPTCON of the kernel's flags.
constexpr const char* kListening = "00010000";

std::string lastTwo(const std::string& path) {
  const auto last = path.rfind('/');
  if (last == std::string::npos || last == 0) return path;
  const auto before = path.rfind('/', last - 1);
  return before == std::string::npos ? path : path.substr(before + 1);
}

}  // namespace

// Num: RefCount Protocol Flags Type St Inode Path
std::set<std::string> listeningPathsIn(std::string_view table) {
  std::set<std::string> paths;
  std::istringstream lines{std::string(table)};
  for (std::string line; std::getline(lines, line);) {
    std::istringstream columns(line);
    std::string number, references, protocol, flags, type, state, inode, path;
    columns >> number >> references >> protocol >> flags >> type >> state >> inode;
    std::getline(columns >> std::ws, path);
    if (flags == kListening && !path.empty()) paths.insert(path);
  }
  return paths;
}

ListeningSockets::ListeningSockets() {
  std::ifstream file("/proc/net/unix");
  if (!file) return;
  const std::string table{std::istreambuf_iterator<char>(file), std::istreambuf_iterator<char>()};
  known_ = true;
  for (const auto& path : listeningPathsIn(table)) names_.insert(lastTwo(path));
}

bool ListeningSockets::hasServiceSocket(const std::string& path) const {
  return names_.contains(lastTwo(path));
}

}  // namespace spacekeep::ctl::doctor
