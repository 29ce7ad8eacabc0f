#include "tests/linux/tidy/source_tree.h"

#include <algorithm>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <utility>

#include "tests/linux/tidy/code_text.h"

namespace spacekeep::tidy {
namespace {

namespace fs = std::filesystem;

constexpr const char* kOwnFolder = "tests/linux/tidy/";
constexpr std::uintmax_t kLargestTextBytes = 1'000'000;

std::vector<std::string> linesOf(const std::string& text) {
  std::vector<std::string> lines;
  std::size_t at = 0;
  while (at < text.size()) {
    const std::size_t end = std::min(text.find('\n', at), text.size());
    lines.push_back(text.substr(at, end - at));
    at = end + 1;
  }
  return lines;
}

std::string contentOf(const fs::path& path) {
  std::ifstream stream(path, std::ios::binary);
  return {std::istreambuf_iterator<char>(stream), {}};
}

/// What was built, and what the version control keeps for itself, is not the project's text.
bool isOutside(const std::string& path) {
  return path.starts_with("build") || path.starts_with("out/") || path.starts_with(".git/") ||
         path.starts_with(".cache");
}

template <typename Wanted>
void readFolder(const fs::path& folder, const Wanted& wanted, std::vector<SourceFile>& files) {
  const fs::path root = SPACEKEEP_SOURCE_DIR;
  for (fs::recursive_directory_iterator entry(folder), end; entry != end; ++entry) {
    const std::string path = fs::relative(entry->path(), root).string();
    if (entry->is_directory() && isOutside(path + "/")) entry.disable_recursion_pending();
    if (!entry->is_regular_file() || path.starts_with(kOwnFolder) || !wanted(*entry)) continue;
    files.push_back(parsed(path, contentOf(entry->path())));
  }
}

void sortByPath(std::vector<SourceFile>& files) {
  std::sort(files.begin(), files.end(),
            [](const SourceFile& a, const SourceFile& b) { return a.path < b.path; });
}

}  // namespace

SourceFile parsed(std::string path, const std::string& content) {
  SourceFile file{std::move(path), {}};
  const CodeText code = codeTextOf(content);
  const std::vector<std::string> texts = linesOf(content);
  const std::vector<std::string> codes = linesOf(code.code);
  for (std::size_t i = 0; i < texts.size(); ++i) {
    file.lines.push_back({.text = texts[i],
                          .code = i < codes.size() ? codes[i] : "",
                          .allowed = texts[i].find("tidy-allow: ") != std::string::npos,
                          .commented = code.commented_lines.contains(i)});
  }
  return file;
}

const std::vector<std::string>& daemonRooms() {
  static const std::vector<std::string> rooms = {"daemon", "registry",  "client", "operations",
                                                 "purge",  "purgeable", "history"};
  return rooms;
}

const std::vector<std::string>& productionRooms() {
  static const std::vector<std::string> rooms = {"daemon", "registry",  "client",  "operations",
                                                 "purge",  "purgeable", "support", "sdk",
                                                 "ctl",    "services",  "sim",     "history"};
  return rooms;
}

const std::vector<std::string>& allRooms() {
  static const std::vector<std::string> rooms = [] {
    std::vector<std::string> all = productionRooms();
    all.insert(all.end(), {"tests", "bench", "fuzz"});
    return all;
  }();
  return rooms;
}

std::vector<SourceFile> codeOf(const std::vector<std::string>& rooms) {
  std::vector<SourceFile> files;
  const auto is_code = [](const fs::directory_entry& entry) {
    return entry.path().extension() == ".h" || entry.path().extension() == ".cc";
  };
  for (const std::string& room : rooms) {
    const fs::path folder = fs::path(SPACEKEEP_SOURCE_DIR) / room;
    if (fs::exists(folder)) readFolder(folder, is_code, files);
  }
  sortByPath(files);
  return files;
}

std::vector<SourceFile> allTexts() {
  std::vector<SourceFile> files;
  const auto is_small = [](const fs::directory_entry& entry) {
    return entry.file_size() <= kLargestTextBytes;
  };
  readFolder(SPACEKEEP_SOURCE_DIR, is_small, files);
  std::erase_if(files, [](const SourceFile& file) {
    return std::any_of(file.lines.begin(), file.lines.end(), [](const SourceLine& line) {
      return line.text.find('\0') != std::string::npos;
    });
  });
  sortByPath(files);
  return files;
}

std::string finding(const SourceFile& file, std::size_t index, const std::string& what) {
  return file.path + ":" + std::to_string(index + 1) + ": " + what + "\n";
}

}  // namespace spacekeep::tidy
