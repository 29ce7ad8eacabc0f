// Thread safety: confined to one thread at a time, as HistoryStore says.
//
// The history in SQLite, in a file of its own beside the suites, so that damage to it never touches
// the state. The file is bounded: the oldest entries go before it gets larger.
#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "support/history/history_store.h"
#include "support/preferences/linux/sqlite.h"

namespace spacekeep {

struct SqliteHistoryOptions {
  std::int64_t max_entries = 10'000;
  std::int64_t max_pages = 2 * 1024;  ///< of 4 KiB
  /// How long a commit waits for another process that holds the file.
  int busy_timeout_ms = 2000;
};

class SqliteHistory final : public HistoryStore {
 private:
  struct Key {};

 public:
  /// Opens `<directory>/history.sqlite` as SqliteSuite::open opens its file: made when it is
  /// missing, set aside byte for byte when it is damaged or of another program. Null, with a problem
  /// line, when that cannot be done or the file is of a newer version.
  [[nodiscard]] static std::unique_ptr<SqliteHistory> open(const std::string& directory,
                                                           SqliteHistoryOptions options = {});

  SqliteHistory(Key, std::string directory, SqliteHistoryOptions options)
      : directory_(std::move(directory)), options_(options) {}

  [[nodiscard]] std::optional<std::string> append(const std::vector<Dictionary>& entries) override;
  /// A file that turns out to be damaged is set aside; the next call sees what is left.
  [[nodiscard]] std::optional<std::string> visit(const HistoryRange& range,
                                                 const Visitor& visitor) override;

 private:
  using Bytes = std::vector<std::uint8_t>;
  struct Row {
    const std::string* volume = nullptr;
    Bytes entry;
  };

  [[nodiscard]] std::optional<std::string> openFile();
  [[nodiscard]] int setUp();
  [[nodiscard]] int makeTable();
  int transact(const std::vector<Row>& rows);
  int write(const std::vector<Row>& rows);
  int makeRoom(const std::vector<Row>& rows);
  int insert(const std::vector<Row>& rows);
  int dropOldest();
  int show(const HistoryRange& range, const Visitor& visitor);
  [[nodiscard]] std::string problemOf(int code) const;

  const std::string directory_;
  const SqliteHistoryOptions options_;
  Database database_;
};

}  // namespace spacekeep
