// The rules of the house that a compiler does not check, as tests over the source tree.
#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>
#include <map>
#include <regex>
#include <set>
#include <sstream>
#include <string>
#include <vector>

namespace {

namespace fs = std::filesystem;

const std::vector<std::string> kDaemonRooms = {"daemon",     "registry", "client",
                                               "operations", "purge",    "purgeable"};
const std::vector<std::string> kProductionRooms = {"daemon", "registry",  "client",  "operations",
                                                   "purge",  "purgeable", "support", "sdk",
                                                   "ctl",    "services",  "sim"};

struct SourceFile {
  std::string path;  // relative to the source tree
  std::vector<std::string> lines;
};

std::vector<std::string> linesOf(const fs::path& path) {
  std::ifstream stream(path);
  std::vector<std::string> lines;
  for (std::string line; std::getline(stream, line);) lines.push_back(line);
  return lines;
}

std::vector<SourceFile> filesIn(const std::vector<std::string>& rooms,
                                const std::set<std::string>& extensions = {".h", ".cc"}) {
  std::vector<SourceFile> files;
  const fs::path root = SPACEKEEP_SOURCE_DIR;
  for (const std::string& room : rooms) {
    if (!fs::exists(root / room)) continue;
    for (const auto& entry : fs::recursive_directory_iterator(root / room)) {
      if (!entry.is_regular_file()) continue;
      if (!extensions.empty() && !extensions.contains(entry.path().extension().string())) continue;
      files.push_back({fs::relative(entry.path(), root).string(), linesOf(entry.path())});
    }
  }
  return files;
}

/// Every line of `files` that matches `pattern`, as "path:line: text". Lines marked as an allowed
/// exception carry the word `tidy-allow` and their reason.
std::string matches(const std::vector<SourceFile>& files, const std::string& pattern) {
  const std::regex regex(pattern);
  std::ostringstream found;
  for (const SourceFile& file : files) {
    for (std::size_t i = 0; i < file.lines.size(); ++i) {
      if (file.lines[i].find("tidy-allow") != std::string::npos) continue;
      if (std::regex_search(file.lines[i], regex)) {
        found << file.path << ':' << i + 1 << ": " << file.lines[i] << '\n';
      }
    }
  }
  return found.str();
}

std::vector<SourceFile> withoutPrefix(std::vector<SourceFile> files, const std::string& prefix) {
  std::erase_if(files, [&](const SourceFile& file) { return file.path.starts_with(prefix); });
  return files;
}

TEST(Tidy, TheTreeIsFound) { EXPECT_GT(filesIn(kProductionRooms).size(), 50U); }

TEST(Tidy, TheDaemonsRoomsIncludeOnlyTheStandardLibraryAndTheProject) {
  const std::set<std::string> standard = {
      "algorithm",   "array",     "atomic",      "bit",
      "cctype",      "cmath",     "compare",     "concepts",
      "cstddef",     "cstdint",   "cstdlib",     "cstring",
      "deque",       "exception", "functional",  "initializer_list",
      "iterator",    "limits",    "list",        "map",
      "memory",      "new",       "numeric",     "optional",
      "queue",       "ratio",     "set",         "span",
      "stdexcept",   "string",    "string_view", "tuple",
      "type_traits", "typeinfo",  "utility",     "variant",
      "vector"};
  const std::regex system_include("^\\s*#\\s*include\\s*<([^>]+)>");
  const std::regex own_include("^\\s*#\\s*include\\s*\"([^\"]+)\"");
  std::ostringstream found;
  for (const SourceFile& file : filesIn(kDaemonRooms)) {
    const bool is_main = file.path == "daemon/main.cc";  // the one place that picks the platform
    for (const std::string& line : file.lines) {
      std::smatch match;
      if (std::regex_search(line, match, system_include) && !standard.contains(match[1])) {
        found << file.path << ": " << line << " (not the standard library, or banned in it)\n";
      }
      if (std::regex_search(line, match, own_include)) {
        const std::string target = match[1];
        if (!fs::exists(fs::path(SPACEKEEP_SOURCE_DIR) / target)) {
          found << file.path << ": " << line << " (no such header of the project)\n";
        }
        if (target.find("/linux/") != std::string::npos && !is_main) {
          found << file.path << ": " << line << " (take it from Platform instead)\n";
        }
      }
    }
  }
  EXPECT_EQ(found.str(), "");
}

TEST(Tidy, ThreadsBlockingAndClocksAreKnownOnlyThroughTheRuntimeSeam) {
  const std::string banned =
      "#include "
      "<(thread|mutex|condition_variable|shared_mutex|future|semaphore|latch|barrier|random|"
      "pthread\\.h)>";
  EXPECT_EQ(matches(withoutPrefix(filesIn(kProductionRooms), "support/"), banned), "")
      << "use support/runtime/locks.h, support/runtime/runtime.h and support/queues/";
  const auto files = withoutPrefix(filesIn(kProductionRooms), "support/runtime/");
  EXPECT_EQ(matches(files, "(steady|system|high_resolution)_clock"), "")
      << "use rt::ticks, rt::wallClockNs";
  EXPECT_EQ(matches(files,
                    "\\b(usleep|nanosleep|clock_nanosleep|clock_gettime|gettimeofday|"
                    "sleep_for|sleep_until|pthread_\\w+)\\s*\\("),
            "")
      << "use rt::sleepNs, rt::ticks, rt::wallClockNs";
}

TEST(Tidy, OrderThatReachesBehaviourIsNeverTheOrderOfAHash) {
  auto rooms = kDaemonRooms;
  rooms.emplace_back("sim");
  EXPECT_EQ(matches(filesIn(rooms), "unordered_(map|set|multimap|multiset)"), "")
      << "use an ordered container: the same seed must give the same run";
}

TEST(Tidy, NoLambdaCapturesEverythingByCopy) {
  EXPECT_EQ(matches(filesIn(kProductionRooms), "\\[=[\\],]"), "") << "name what is captured";
}

TEST(Tidy, EveryHeaderBeginsWithItsThreadSafety) {
  std::ostringstream found;
  for (const SourceFile& file : filesIn(kProductionRooms, {".h"})) {
    if (file.lines.empty() || !file.lines.front().starts_with("// Thread safety: ")) {
      found << file.path << '\n';
    }
  }
  EXPECT_EQ(found.str(), "");
}

TEST(Tidy, NoFileIsLongerThanFiveHundredLines) {
  std::ostringstream found;
  for (const SourceFile& file :
       filesIn({"daemon", "support", "registry", "client", "operations", "purge", "purgeable",
                "sdk", "ctl", "services", "sim", "tests", "bench", "fuzz"})) {
    if (file.lines.size() > 500) found << file.path << ": " << file.lines.size() << " lines\n";
  }
  EXPECT_EQ(found.str(), "") << "split by idea";
}

TEST(Tidy, NothingIsLeftOpenInTheCode) {
  EXPECT_EQ(matches(filesIn(kProductionRooms), "\\b(TODO|FIXME|XXX|HACK)\\b"), "");
}

TEST(Tidy, EveryHeaderIsIncludedSomewhere) {
  auto rooms = kProductionRooms;
  rooms.insert(rooms.end(), {"tests", "bench", "fuzz"});
  std::set<std::string> included;
  const std::regex include("#\\s*include\\s*[\"<]([^\">]+)[\">]");
  for (const SourceFile& file : filesIn(rooms)) {
    for (const std::string& line : file.lines) {
      std::smatch match;
      if (std::regex_search(line, match, include)) included.insert(fs::path(match[1]).filename());
    }
  }
  std::ostringstream found;
  for (const SourceFile& file : filesIn(kProductionRooms, {".h"})) {
    if (!included.contains(fs::path(file.path).filename())) found << file.path << '\n';
  }
  EXPECT_EQ(found.str(), "");
}

TEST(Tidy, PropertyListFilesCarryNoDoctype) {
  const std::string doctype = std::string("<!DOC") + "TYPE plist";
  EXPECT_EQ(
      matches(filesIn({"packaging", "services", "tests", "demo", "docs", "fuzz"}, {}), doctype),
      "");
}

}  // namespace
