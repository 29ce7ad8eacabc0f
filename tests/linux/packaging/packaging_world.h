// Thread safety: one test at a time.
//
// What tests of packaging stand on: the files of the tree, and commands of the system.
#pragma once

#include <sys/wait.h>

#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <set>
#include <sstream>
#include <string>
#include <vector>

namespace spacekeep::packaging {

namespace fs = std::filesystem;

inline const fs::path kSource = SPACEKEEP_SOURCE_DIR;
inline const fs::path kBuild = SPACEKEEP_BUILD_DIR;

struct Finished {
  int exit_code = -1;
  std::string out;  ///< standard output and error together
};

inline Finished run(const std::string& command_line) {
  Finished finished;
  std::FILE* pipe = popen(("exec 2>&1; " + command_line).c_str(), "r");
  if (pipe == nullptr) return finished;
  char buffer[4096];
  while (const auto size = std::fread(buffer, 1, sizeof buffer, pipe)) {
    finished.out.append(buffer, size);
  }
  const int status = pclose(pipe);
  finished.exit_code = WIFEXITED(status) ? WEXITSTATUS(status) : -1;
  return finished;
}

inline std::string contentOf(const fs::path& path) {
  std::ostringstream text;
  text << std::ifstream(path).rdbuf();
  return text.str();
}

/// Lines that are neither empty nor comments.
inline std::vector<std::string> linesOf(const fs::path& path) {
  std::vector<std::string> lines;
  std::ifstream file(path);
  for (std::string line; std::getline(file, line);) {
    if (!line.empty() && line[0] != '#') lines.push_back(line);
  }
  return lines;
}

/// All regular files and links below `folder` whose names end so, sorted.
inline std::vector<fs::path> filesBelow(const fs::path& folder, const std::string& ending = "") {
  std::set<fs::path> found;
  for (const auto& entry : fs::recursive_directory_iterator(folder)) {
    if (entry.is_directory() && !entry.is_symlink()) continue;
    if (entry.path().string().ends_with(ending)) found.insert(entry.path());
  }
  return {found.begin(), found.end()};
}

/// A directory that ends with its owner.
class Workshop {
 public:
  Workshop() {
    std::string name = (fs::temp_directory_path() / "spacekeep-packaging-XXXXXX").string();
    if (mkdtemp(name.data()) != nullptr) path_ = name;
  }
  ~Workshop() {
    std::error_code ignored;
    if (!path_.empty()) fs::remove_all(path_, ignored);
  }
  Workshop(const Workshop&) = delete;
  Workshop& operator=(const Workshop&) = delete;
  [[nodiscard]] const fs::path& path() const { return path_; }

 private:
  fs::path path_;
};

}  // namespace spacekeep::packaging
