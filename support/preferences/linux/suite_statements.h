// Thread safety: confined to one thread at a time.
//
// The statements that a suite runs on its file, each prepared once and kept: parsing them anew costs
// more than the rest of a small commit that needs no disk.
#pragma once

#include <cstdint>
#include <optional>
#include <span>
#include <string>

#include "support/preferences/linux/sqlite.h"

namespace spacekeep {

/// Every member answers SQLITE_OK or the error, unless it says otherwise.
class SuiteStatements {
 public:
  explicit SuiteStatements(sqlite3* database) : database_(database) {}

  /// Takes the right to write, and with it the latest content.
  int begin() { return run(begin_, "BEGIN IMMEDIATE"); }
  int commit() { return run(commit_, "COMMIT"); }
  /// Some errors have rolled back already, so there may be nothing to do.
  void rollback() { static_cast<void>(execute(database_, "ROLLBACK")); }
  int makeTable();
  int store(const std::string& key, std::span<const std::uint8_t> bytes);
  int remove(const std::string& key);
  /// A number that moves when another connection commits, not when this one does.
  int dataVersion(std::int64_t& version);

  /// The number in the file's header that every commit moves by one, read without taking a lock (a
  /// lock costs some fifteen system calls). None when it does not tell: the file cannot be read, or
  /// is kept in a write-ahead log. Equal numbers mean that nothing was committed in between.
  [[nodiscard]] std::optional<std::uint32_t> changeCounter() const;
  /// How many pages this connection has written to the file so far.
  [[nodiscard]] int pagesWritten() const;

 private:
  bool have(Statement& statement, const char* sql);
  int run(Statement& statement, const char* sql);
  [[nodiscard]] int preparationError() const;

  sqlite3* database_;
  Statement begin_;
  Statement commit_;
  Statement store_;
  Statement remove_;
  Statement data_version_;
};

}  // namespace spacekeep
