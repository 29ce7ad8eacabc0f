// Thread safety: functions without state.
//
// Rules that one line is not enough to judge. Each takes the files it shall look at and answers its
// findings, one per line, none when all is well: so each is tested on planted files too.
#pragma once

#include <cstddef>
#include <set>
#include <string>
#include <vector>

#include "tests/linux/tidy/source_tree.h"

namespace spacekeep::tidy {

using Files = std::vector<SourceFile>;

/// Headers whose first line does not say what may be done from which thread.
[[nodiscard]] std::string headersWithoutThreadSafety(const Files& files);
/// Headers that may be read twice.
[[nodiscard]] std::string headersWithoutGuard(const Files& files);
/// Headers of `files` that no file of `users` includes; own tests of a header do count.
[[nodiscard]] std::string headersThatNothingIncludes(const Files& files, const Files& users);
/// Sources of `files` that are not among the paths that the build compiles.
[[nodiscard]] std::string sourcesThatNothingBuilds(const Files& files,
                                                   const std::set<std::string>& built);
/// Includes of the daemon's rooms beyond the standard library and the project's portable headers.
[[nodiscard]] std::string foreignIncludes(const Files& files,
                                          const std::set<std::string>& headers_of_the_project);

[[nodiscard]] std::string filesLongerThan(std::size_t lines, const Files& files);
/// Functions with more lines than that from the opening brace's to the closing one's.
[[nodiscard]] std::string functionsLongerThan(std::size_t lines, const Files& files);

/// Numbers whose names speak of time or size without saying in what.
[[nodiscard]] std::string namesWithoutUnit(const Files& files);
/// Descriptors that would be inherited by programs that are started: without the CLOEXEC flag.
[[nodiscard]] std::string inheritedDescriptors(const Files& files);
/// Log texts of four words or more that stand at more than one place, without those in `known`.
[[nodiscard]] std::string logTextsAtTwoPlaces(const Files& files,
                                              const std::set<std::string>& known);
/// Sleeps that are no step of a loop and have no comment that says what they wait for.
[[nodiscard]] std::string sleepsWithoutReason(const Files& files);

}  // namespace spacekeep::tidy
