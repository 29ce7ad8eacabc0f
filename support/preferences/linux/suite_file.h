// Thread safety: confined to one thread at a time.
//
// Getting from a name to an open, sound SQLite file, whatever stands in its place. Suites are such
// files, and what else the daemon keeps beside them.
#pragma once

#include <cstdint>
#include <string>
#include <variant>

#include "support/preferences/linux/sqlite.h"

namespace spacekeep {

/// In the file's header, so that the file of another program is not taken for a suite ("SKPF").
inline constexpr std::int64_t kSuiteApplicationId = 0x534b5046;
inline constexpr std::int64_t kSuiteVersion = 1;
inline constexpr const char* kSuiteTable = "preferences";
inline constexpr const char* kSuiteTableSql =
    "CREATE TABLE preferences (key TEXT PRIMARY KEY NOT NULL, value BLOB NOT NULL) WITHOUT ROWID";

/// What tells one kind of file from another.
struct SuiteFileKind {
  std::int64_t application_id = kSuiteApplicationId;
  std::int64_t version = kSuiteVersion;  ///< the newest that this program understands
  const char* what = "the suite";        ///< in log lines
  const char* table = kSuiteTable;
  /// The statement that makes its table, as the database keeps it; a file with another such table, or
  /// of this version without it, is damaged.
  const char* table_sql = kSuiteTableSql;
};

struct SuiteFileError {
  std::string reason;
};

/// Bytes, no slash, no leading dot, at most 200: goes into a file name as it is.
[[nodiscard]] bool isSafeSuiteName(const std::string& name);

/// As SqliteSuite::open describes. Setting aside is logged here.
[[nodiscard]] std::variant<Database, SuiteFileError> openSuiteFile(const std::string& directory,
                                                                   const std::string& name,
                                                                   const SuiteFileKind& kind = {});

}  // namespace spacekeep
