// Thread safety: one test at a time.
//
// Rules, tools and users for the tests of caches by rules.
#pragma once

#include <string>
#include <vector>

#include "services/command/engine/cache.h"
#include "services/command/rules/rule_files.h"
#include "tests/linux/cachedir/cache_world.h"
#include "tests/linux/cachedir/program_world.h"

namespace spacekeep::command {

using cachedir::exists;
using cachedir::kMiB;
using cachedir::setAge;
using cachedir::temporaryDirectory;
using cachedir::Volume;
using cachedir::writeFile;

inline const std::string kProgram = SPACEKEEP_BUILD_DIR "/services/spacekeep-command";
inline const std::string kShipped = SPACEKEEP_SOURCE_DIR "/services/rules";

/// Writes a program for /bin/sh; answers its path. Stands for a cache owner's own tool.
[[nodiscard]] std::string shellTool(const std::string& body);

/// A rule from the content of its dictionary; the test fails when it is bad. SPACEKEEP_ID is added.
[[nodiscard]] Rule ruleFrom(const std::string& content, const UserFolders* folders = nullptr);
/// The error text of such content, with "FILE" for the file's path; empty when it is good.
[[nodiscard]] std::string errorOf(const std::string& content, const UserFolders* folders = nullptr);

/// "<array>..</array>" of strings.
[[nodiscard]] std::string arrayOf(const std::vector<std::string>& texts);

/// A home directory that this process owns, with the usual folders below it.
[[nodiscard]] UserFolders homeAt(const std::string& home);

struct Went {
  Result result;
  std::vector<std::string> what;
  std::uint64_t sum = 0;  // of what the visitor was told
};
[[nodiscard]] Went freeFrom(const Cache& cache, const Request& request);
/// A dry run, then the same for real: both must tell the same. Answers the real one.
[[nodiscard]] Went freeAsForetold(const Cache& cache, Request request);

}  // namespace spacekeep::command
