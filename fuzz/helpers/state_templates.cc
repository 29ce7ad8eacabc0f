#include "fuzz/helpers/state_templates.h"

#include <filesystem>

#include "fuzz/helpers/promises.h"
#include "support/preferences/linux/sqlite_suite.h"
#include "tests/helpers/temporary_directory.h"

namespace spacekeep::fuzz {
namespace {

StateFiles filesAt(const std::string& path) {
  return {.database = test::contentOf(path),
          .journal = test::contentOf(path + "-journal"),
          .log = test::contentOf(path + "-wal")};
}

void writeFiles(const std::string& path, const StateFiles& files) {
  std::ofstream(path, std::ios::binary) << files.database;
}

StateFiles atRest() {
  const test::TemporaryDirectory directory;
  const auto suite = SqliteSuite::open(directory.path(), kStateName, {.max_pages = 20});
  require(suite != nullptr, "a suite can be made");
  suite->set("fuzz.old", Value("old value"));
  require(!suite->synchronize(), "a suite can be written");
  StateFiles files = filesAt(directory / "fuzz.sqlite");
  files.journal.clear();
  return files;
}

/// What `statements` leave while the program that ran them is still in the middle of it.
StateFiles inTheMiddle(const StateFiles& start, const char* statements) {
  const test::TemporaryDirectory directory;
  const std::string path = directory / "fuzz.sqlite";
  writeFiles(path, start);
  sqlite3* raw = nullptr;
  require(sqlite3_open(path.c_str(), &raw) == SQLITE_OK, "a database can be opened");
  const Database database(raw);
  require(execute(raw, statements) == SQLITE_OK, "a database can be changed");
  static_cast<void>(sqlite3_db_cacheflush(raw));
  return filesAt(path);
}

}  // namespace

StateTemplates makeStateTemplates() {
  StateTemplates templates;
  templates.at_rest = atRest();
  templates.interrupted =
      inTheMiddle(templates.at_rest,
                  "PRAGMA journal_mode = PERSIST; BEGIN; UPDATE preferences SET value = x'00';"
                  "CREATE TABLE other (a)");
  require(!templates.interrupted.journal.empty(), "an interrupted change leaves a journal");
  templates.logged = inTheMiddle(templates.at_rest,
                                 "PRAGMA journal_mode = WAL; INSERT INTO preferences"
                                 " SELECT 'fuzz.logged', value FROM preferences");
  require(!templates.logged.log.empty(), "what is written ahead stands in the log");
  return templates;
}

}  // namespace spacekeep::fuzz
