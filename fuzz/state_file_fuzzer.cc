// The state file: a suite is opened over any bytes, or over a sound file, with a journal or a log
// beside it or without, that was damaged here and there. Whatever becomes of it, nothing is thrown
// away, and what the suite then takes it keeps.
#include <cstddef>
#include <cstdint>
#include <filesystem>
#include <memory>
#include <string>
#include <string_view>

#include "fuzz/helpers/piece_reader.h"
#include "fuzz/helpers/promises.h"
#include "fuzz/helpers/state_templates.h"
#include "support/preferences/linux/sqlite_suite.h"
#include "tests/helpers/temporary_directory.h"

namespace spacekeep::fuzz {
namespace {

constexpr const char* kFile = "fuzz.sqlite";
// Small files are opened and written sooner; to what is in them the bound makes no difference.
const SqliteSuiteOptions kOptions{.max_pages = 20};
constexpr std::size_t kMostFileBytes = 256 * 1024;

const StateTemplates& templates() {
  static const StateTemplates all = makeStateTemplates();
  return all;
}

void put(std::string& file, std::size_t at, std::string_view piece) {
  if (at + piece.size() > kMostFileBytes) return;
  if (file.size() < at + piece.size()) file.resize(at + piece.size(), '\0');
  file.replace(at, piece.size(), piece);
}

/// One change: which file, what to do, where (256 pages of 4096 bytes), and with what.
void damage(StateFiles& files, PieceReader& input) {
  const std::uint8_t choice = input.byte();
  std::string& file = choice % 4 < 2 ? files.database : choice % 4 == 2 ? files.journal : files.log;
  const std::size_t at = input.byte() % 64 * std::size_t{4096} + input.number() % 4096;
  switch (choice / 4 % 4) {
    case 0:
    case 1:
      return put(file, at, input.shortPiece());
    case 2:
      if (at < file.size()) file.resize(at);
      return;
    default:
      return put(file, file.size(), input.piece());
  }
}

StateFiles filesOf(std::string_view text) {
  PieceReader input(text);
  StateFiles files;
  switch (input.byte() % 4) {
    case 0:
      files.database = std::string(input.rest());
      return files;
    case 1:
      files = templates().at_rest;
      break;
    case 2:
      files = templates().interrupted;
      break;
    default:
      files = templates().logged;
      break;
  }
  for (int changes = 0; changes < 32 && !input.usedUp(); ++changes) damage(files, input);
  return files;
}

/// The file that was set aside, empty when none was.
std::string setAside(const std::string& directory) {
  for (const auto& entry : std::filesystem::directory_iterator(directory)) {
    const std::string name = entry.path().filename().string();
    if (name.starts_with("fuzz.corrupt-") && !name.ends_with("-journal")) return entry.path();
  }
  return "";
}

bool takesAndKeeps(const std::string& directory, SqliteSuite& suite) {
  suite.set("fuzz.key", Value("fuzz value"));
  if (suite.synchronize()) return false;
  const auto again = SqliteSuite::open(directory, kStateName, kOptions);
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
  const StateFiles files = filesOf(input);
  const bool is_alone = files.journal.empty() && files.log.empty();
  const test::TemporaryDirectory directory;
  const std::string path = directory.write(kFile, files.database);
  if (!files.journal.empty()) directory.write("fuzz.sqlite-journal", files.journal);
  if (!files.log.empty()) directory.write("fuzz.sqlite-wal", files.log);
  const auto suite = SqliteSuite::open(directory.path(), kStateName, kOptions);
  const std::string aside = setAside(directory.path());
  if (!aside.empty()) {
    require(!is_alone || test::contentOf(aside) == files.database,
            "what is set aside is set aside as it was");
    require(suite != nullptr, "in the place of a damaged file a fresh one is begun");
  } else if (suite == nullptr && is_alone) {
    require(test::contentOf(path) == files.database, "a file that cannot be opened is left alone");
  }
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
