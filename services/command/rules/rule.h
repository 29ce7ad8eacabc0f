// Thread safety: plain values.
//
// What a rule file says. docs/command.md is the text for the people who write such files.
#pragma once

#include <array>
#include <cstdint>
#include <optional>
#include <string>
#include <variant>
#include <vector>

#include "services/cachedir/engine/rules.h"
#include "services/command/tool/tool.h"

namespace spacekeep::command {

using cachedir::kUrgencies;

inline constexpr std::size_t kMaxConditions = 64;
inline constexpr std::size_t kMaxWords = 64;
inline constexpr std::size_t kMaxWordBytes = 4096;
inline constexpr std::uint64_t kMaxToolSeconds = 600;

/// While it holds, the cache is in use and nothing of it is taken.
struct Condition {
  enum class Kind {
    kProcess,  // a process with that executable runs: of this user, or of anybody for root
    kLocked,   // somebody has a lock (of either kind) on that file
    kPidFile,  // the process runs whose number that file holds
    kOpen,     // somebody has a file open below that directory (a pattern)
  };
  Kind kind = Kind::kProcess;
  std::string subject;
  std::vector<std::string> idle;  // processes that go by one of these names do not count
};

/// A lock that the cache's owner takes to work on it, taken the same way while something goes.
struct OwnersLock {
  enum class Kind { kRecord, kFlock };  // fcntl(2), flock(2)
  Kind kind = Kind::kRecord;
  std::string path;
};

/// Directories given up file by file, or each as a whole.
struct DirectoryCaches {
  cachedir::Rules files;  // paths may be patterns
  cachedir::Rules whole;
};

/// Where a tool's output holds an amount.
struct AmountInOutput {
  enum class Kind {
    kAfter,   // a size after this text, added up over all lines that hold it
    kColumn,  // a size in this column of each line, counted from 1
    kPaths,   // each line, without `after` in front, is a path of which everything would go
  };
  Kind kind = Kind::kPaths;
  std::string after;
  std::size_t column = 0;
  std::uint64_t base = 1024;  // of K, M, G without "i"
};

/// What a clean would take, without doing it.
struct FilesThatGo {
  std::vector<std::string> patterns;  // of the last path component; none: all files
  std::vector<std::string> keep;
  std::int64_t older_seconds = 0;
  enum class Age { kModified, kJournalName, kTrashRecord } age = Age::kModified;
};
struct ToldByTool {
  Words command;
  std::uint64_t limit_ns = 0;
  AmountInOutput amount;
};
/// Nobody can tell.
struct Unknown {};
using Preview = std::variant<Unknown, FilesThatGo, ToldByTool>;

struct CleanStep {
  Words command;  // {AMOUNT} and {KEEP} stand for bytes
  std::uint64_t limit_ns = 0;
  Preview preview;
};

/// A cache that its owner's tool cleans.
struct ToolCache {
  cachedir::Rules measured;  // what shrinks; paths may be patterns
  std::array<std::optional<CleanStep>, kUrgencies> steps;
};

struct Rule {
  std::string name;  // of the file, without its ending
  bool enabled = true;
  std::string description;
  std::array<std::string, kUrgencies> takes;  // in words
  std::string loses;                          // what the user misses afterwards
  std::string source;                         // who says that this may go
  std::string service_id;
  bool purges = true;
  bool periodic = false;
  std::vector<std::string> notifications;
  std::vector<Condition> not_while;
  std::vector<OwnersLock> locks;
  std::variant<DirectoryCaches, ToolCache> cache;
};

}  // namespace spacekeep::command
