// Thread safety: plain values and pure functions.
//
// What a rule file says: which directories are caches, how long a file in them must have been
// unused before it may go, and how the service presents itself to the daemon. docs/cachedir.md is
// the text for the people who write such files.
#pragma once

#include <array>
#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <variant>
#include <vector>

#include "support/values/value.h"

namespace spacekeep::cachedir {

inline constexpr int kUrgencies = 4;
inline constexpr std::size_t kMaxDirectories = 64;
inline constexpr std::size_t kMaxPatterns = 256;  // of one directory
inline constexpr std::size_t kMaxPatternBytes = 1024;
inline constexpr std::size_t kMaxNotifications = 64;
inline constexpr double kMaxUnusedDays = 36500;

/// Seconds a file must have been unused, for urgency 1 to 4. At 0 even a file dated in the future
/// may go.
using UnusedSeconds = std::array<std::int64_t, kUrgencies>;
inline constexpr std::int64_t kSecondsPerDay = 86400;
inline constexpr UnusedSeconds kDefaultUnusedSeconds = {30 * kSecondsPerDay, 7 * kSecondsPerDay,
                                                        1 * kSecondsPerDay, 0};

struct DirectoryRule {
  std::string path;  // absolute, without a slash at its end
  UnusedSeconds unused_seconds = kDefaultUnusedSeconds;
  /// The daily pass removes what has been unused for so long; nothing when absent.
  std::optional<std::int64_t> periodic_unused_seconds = {};
  std::vector<std::string> keep = {};  // patterns of fnmatch(3)
  bool remove_empty_directories = false;
  bool operator==(const DirectoryRule&) const = default;
};

struct Rules {
  std::string service_id;
  bool purges = true;
  bool periodic = false;
  std::vector<std::string> notifications;
  std::vector<DirectoryRule> directories;
  std::vector<std::string> problems = {};  // why directories are left out, in words
};

/// What is wrong, where, and what to do; one line per finding is not needed, the first is enough.
struct RuleError {
  std::string text;
};

/// `file` names the document in the error text.
[[nodiscard]] std::variant<Rules, RuleError> parseRules(std::span<const std::uint8_t> document,
                                                        std::string_view file);
/// The same of a document that is already a value.
[[nodiscard]] std::variant<Rules, RuleError> rulesOf(const Value& document, std::string_view file);
[[nodiscard]] std::variant<Rules, RuleError> readRules(const std::string& file);
/// The property list in `file`, whatever it says.
[[nodiscard]] std::variant<Value, RuleError> readDocument(const std::string& file);

/// Whether `path` (without a slash at its end) holds a whole system rather than a cache.
[[nodiscard]] bool isSystemDirectory(std::string_view path);
/// Whether one is the other or lies below it; both without a slash at the end.
[[nodiscard]] bool overlap(const std::string& one, const std::string& other);

/// Whether a file or directory at `path` (relative to the rule's directory) is never taken. A
/// pattern with a slash is compared with the whole path, one without with the last component.
[[nodiscard]] bool isKept(const DirectoryRule& rule, const std::string& path);

}  // namespace spacekeep::cachedir
