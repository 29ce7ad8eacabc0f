// Thread safety: everything here is constant once made and may be shared.
//
// The source tree as the tidy tests see it: files with their lines, and beside each line what is
// left of it when comments and the insides of literals are taken away.
#pragma once

#include <cstddef>
#include <string>
#include <vector>

namespace spacekeep::tidy {

struct SourceLine {
  std::string text;        ///< as it stands
  std::string code;        ///< without comments; literals are empty ("" and '')
  bool allowed = false;    ///< carries the word tidy-allow, behind which the reason stands
  bool commented = false;  ///< a comment stands on it
};

struct SourceFile {
  std::string path;  ///< relative to the source tree
  std::vector<SourceLine> lines;

  [[nodiscard]] bool isHeader() const { return path.ends_with(".h"); }
};

/// Splits what a file holds. `path` decides nothing but the name in findings.
[[nodiscard]] SourceFile parsed(std::string path, const std::string& content);

/// The six rooms that know the standard library and the project only.
[[nodiscard]] const std::vector<std::string>& daemonRooms();
/// What is shipped, and the simulation.
[[nodiscard]] const std::vector<std::string>& productionRooms();
/// Production, tests, benchmarks and fuzzers.
[[nodiscard]] const std::vector<std::string>& allRooms();

/// C++ files of those rooms, in order of their paths. The tidy tests' own files are left out: they
/// hold planted faults.
[[nodiscard]] std::vector<SourceFile> codeOf(const std::vector<std::string>& rooms);

/// Every text file that the project keeps, of whatever kind, the tidy tests' own left out.
[[nodiscard]] std::vector<SourceFile> allTexts();

/// "path:line: what" and a line end, as compilers write it.
[[nodiscard]] std::string finding(const SourceFile& file, std::size_t index,
                                  const std::string& what);

}  // namespace spacekeep::tidy
