// The state file: a suite is opened over any bytes, or over a sound file, with a journal or a log
// beside it or without, that was damaged here and there. Whatever becomes of it, nothing is thrown
// away, and what the suite then takes it keeps.
#include <cstddef>
#include <cstdint>
#include <memory>
#include <string>
#include <string_view>

#include "fuzz/helpers/database_files.h"
#include "fuzz/helpers/piece_reader.h"
#include "fuzz/helpers/promises.h"
#include "support/preferences/linux/sqlite_suite.h"
#include "tests/helpers/temporary_directory.h"

namespace spacekeep::fuzz {
namespace {

constexpr const char* kName = "fuzz";
// Small files are opened and written sooner; to what is in them the bound makes no difference.
const SqliteSuiteOptions kOptions{.max_pages = 20};

/// At rest "fuzz.old" is there, being changed in the middle of a change; "fuzz.logged" is in the log.
const DatabaseTemplates& templates() {
  static const DatabaseTemplates all = makeTemplates(
      {.name = kName,
       .make =
           [](const std::string& directory) {
             const auto suite = SqliteSuite::open(directory, kName, kOptions);
             require(suite != nullptr, "a suite can be made");
             suite->set("fuzz.old", Value("old value"));
             require(!suite->synchronize(), "a suite can be written");
           },
       .interrupted = "PRAGMA journal_mode = PERSIST; BEGIN; UPDATE preferences SET value = x'00';"
                      "CREATE TABLE other (a)",
       .logged = "PRAGMA journal_mode = WAL; INSERT INTO preferences"
                 " SELECT 'fuzz.logged', value FROM preferences"});
  return all;
}

bool takesAndKeeps(const std::string& directory, SqliteSuite& suite) {
  suite.set("fuzz.key", Value("fuzz value"));
  if (suite.synchronize()) return false;
  const auto again = SqliteSuite::open(directory, kName, kOptions);
  require(again != nullptr, "a suite that was written can be opened");
  require(!again->refresh(), "a suite that was written can be read");
  const Value* kept = again->find("fuzz.key");
  require(kept != nullptr && *kept == Value("fuzz value"), "what was committed is kept");
  return true;
}

void requireUndamaged(const SqliteSuite* suite, std::string_view input) {
  const std::uint8_t start = input.size() == 1 ? PieceReader(input).byte() % 4 : 0;
  if (start == 0) return;
  require(suite != nullptr, "a sound file can be opened");
  const Value old("old value");
  const Value* found = suite->find("fuzz.old");
  require(found != nullptr && *found == old, "a change that was interrupted is taken back");
  const Value* logged = suite->find("fuzz.logged");
  require((logged != nullptr && *logged == old) == (start == 3), "what was written ahead is there");
}

void examine(std::string_view input) {
  const DatabaseFiles files = filesOf(input, templates());
  const test::TemporaryDirectory directory;
  const std::string path = layOut(directory.path(), kName, files);
  const auto suite = SqliteSuite::open(directory.path(), kName, kOptions);
  const std::string aside = setAside(directory.path(), kName);
  requireNothingLost(files, path, aside, suite != nullptr);
  requireUndamaged(suite.get(), input);
  if (suite == nullptr) return;
  require(!suite->refresh() || aside.empty(), "a fresh suite can be read");
  require(takesAndKeeps(directory.path(), *suite) || aside.empty(), "a fresh suite can be written");
}

}  // namespace
}  // namespace spacekeep::fuzz

extern "C" int LLVMFuzzerInitialize(int*, char***) {
  spacekeep::fuzz::checkLogLines();
  spacekeep::fuzz::learnFromLogLines();
  return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  spacekeep::fuzz::examine(spacekeep::fuzz::textOfInput(data, size));
  return 0;
}
