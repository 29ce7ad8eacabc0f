// Thread safety: pure functions over the file system.
//
// Which directories the patterns of a rule stand for now. What the text of a path is refused for when
// a rule file is read, a match of a pattern is left out for: that it is a system directory, or that a
// file would stand under two directories, whose terms may differ.
#pragma once

#include "services/command/rules/rule.h"

namespace spacekeep::command {

/// `rules` with its patterns replaced by what they match; at most kMaxMatches in all. Its problems
/// tell what is left out.
[[nodiscard]] cachedir::Rules matched(const cachedir::Rules& rules);

/// The same of both kinds together, without the whole directories that KEEP names.
[[nodiscard]] DirectoryCaches matched(const DirectoryCaches& caches);

}  // namespace spacekeep::command
