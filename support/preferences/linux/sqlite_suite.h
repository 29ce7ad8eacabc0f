// Thread safety: confined to one thread at a time, as PreferencesSuite says.
//
// A preferences suite in SQLite: one file, one table of keys and binary property lists.
#pragma once

#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <string_view>

#include "support/preferences/linux/sqlite.h"
#include "support/preferences/linux/suite_headroom.h"
#include "support/preferences/linux/suite_statements.h"
#include "support/preferences/preferences_suite.h"

namespace spacekeep {

struct SqliteSuiteOptions {
  /// Called when a commit finds no room; true when it made some, and the commit is tried once more.
  std::function<bool()> make_room = [] { return false; };
  /// Most pages of 4 KiB in the file, so that no client can fill the volume through its state.
  std::int64_t max_pages = 16 * 1024;
  /// How long a commit waits for another process that holds the file.
  int busy_timeout_ms = 2000;
};

class SqliteSuite : public PreferencesSuite {
 public:
  /// Opens `<directory>/<name>.sqlite`, making the directory (mode 0700, and those above it that
  /// are missing) and the file (mode 0600). A file that is damaged or of another program is renamed
  /// to
  /// `<name>.corrupt-<time>` with a problem line, and the suite starts empty. Null, with a problem
  /// line, when that cannot be done, the file is of a newer version, or the name is no safe file
  /// name.
  [[nodiscard]] static std::unique_ptr<SqliteSuite> open(const std::string& directory,
                                                         const std::string& name,
                                                         SqliteSuiteOptions options = {});

  /// A failed commit keeps what was set for the next call. A value that no property list can hold
  /// (see binaryPlist) is given up, and the answer names its key.
  [[nodiscard]] std::optional<std::string> synchronize() override;
  /// Costs one small read while nobody else has changed the file.
  [[nodiscard]] std::optional<std::string> refresh() override;
  [[nodiscard]] const Value* find(std::string_view key) const override;
  void set(std::string_view key, std::optional<Value> value) override;
  void discard(std::string_view key) override;

 private:
  using Pending = std::map<std::string, std::optional<Value>, std::less<>>;

  SqliteSuite(Database database, std::string path, SqliteSuiteOptions options)
      : database_(std::move(database)),
        path_(std::move(path)),
        options_(std::move(options)),
        statements_(database_.get()),
        headroom_(database_.get(), path_, options_.max_pages) {}

  struct Failure {
    int code = SQLITE_OK;
    std::string reason;
    bool no_room = false;
  };

  [[nodiscard]] Failure failure(int code) const;
  void prepareFile();
  Failure refreshLocked(std::optional<std::uint32_t> counter);
  Failure commitPending(std::set<std::string>& given_up);
  Failure writeAndCommit(std::set<std::string>& given_up);
  int writePending(std::set<std::string>& given_up);
  void keepCommitted(const std::set<std::string>& given_up);
  Failure loadIfChanged();
  Failure load();
  void loadRow(sqlite3_stmt* row, std::map<std::string, Value, std::less<>>& loaded);

  const Database database_;
  const std::string path_;
  const SqliteSuiteOptions options_;
  SuiteStatements statements_;
  SuiteHeadroom headroom_;
  std::map<std::string, Value, std::less<>> stored_;  // what is in the file
  Pending pending_;                                   // set and not yet committed
  bool has_table_ = false;                            // the file has, when stored_ was read
  // Of the file when stored_ was read, in two measures; see SuiteStatements.
  std::optional<std::int64_t> data_version_;
  std::optional<std::uint32_t> change_counter_;
};

}  // namespace spacekeep
