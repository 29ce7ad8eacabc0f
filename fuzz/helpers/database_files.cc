#include "fuzz/helpers/database_files.h"

#include <cstddef>
#include <cstdint>
#include <filesystem>
#include <fstream>

#include "fuzz/helpers/piece_reader.h"
#include "fuzz/helpers/promises.h"
#include "support/preferences/linux/sqlite.h"
#include "tests/helpers/temporary_directory.h"

namespace spacekeep::fuzz {
namespace {

constexpr std::size_t kMostFileBytes = 256 * 1024;

DatabaseFiles filesAt(const std::string& path) {
  return {.database = test::contentOf(path),
          .journal = test::contentOf(path + "-journal"),
          .log = test::contentOf(path + "-wal")};
}

DatabaseFiles atRest(const DatabaseChanges& changes) {
  const test::TemporaryDirectory directory;
  changes.make(directory.path());
  DatabaseFiles files = filesAt(directory / (changes.name + ".sqlite"));
  require(!files.database.empty(), "a database can be made");
  files.journal.clear();
  return files;
}

/// What `statements` leave while the program that ran them is still in the middle of it.
DatabaseFiles inTheMiddle(const DatabaseFiles& start, const char* statements) {
  const test::TemporaryDirectory directory;
  const std::string path = layOut(directory.path(), "middle", start);
  sqlite3* raw = nullptr;
  require(sqlite3_open(path.c_str(), &raw) == SQLITE_OK, "a database can be opened");
  const Database database(raw);
  require(execute(raw, statements) == SQLITE_OK, "a database can be changed");
  static_cast<void>(sqlite3_db_cacheflush(raw));
  return filesAt(path);
}

void put(std::string& file, std::size_t at, std::string_view piece) {
  if (at + piece.size() > kMostFileBytes) return;
  if (file.size() < at + piece.size()) file.resize(at + piece.size(), '\0');
  file.replace(at, piece.size(), piece);
}

/// One change: which file, what to do, where (64 pages of 4096 bytes), and with what.
void damage(DatabaseFiles& files, PieceReader& input) {
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

}  // namespace

DatabaseTemplates makeTemplates(const DatabaseChanges& changes) {
  DatabaseTemplates templates;
  templates.at_rest = atRest(changes);
  templates.interrupted = inTheMiddle(templates.at_rest, changes.interrupted);
  require(!templates.interrupted.journal.empty(), "an interrupted change leaves a journal");
  templates.logged = inTheMiddle(templates.at_rest, changes.logged);
  require(!templates.logged.log.empty(), "what is written ahead stands in the log");
  return templates;
}

DatabaseFiles filesOf(std::string_view text, const DatabaseTemplates& templates) {
  PieceReader input(text);
  DatabaseFiles files;
  switch (input.byte() % 4) {
    case 0:
      files.database = std::string(input.rest());
      return files;
    case 1:
      files = templates.at_rest;
      break;
    case 2:
      files = templates.interrupted;
      break;
    default:
      files = templates.logged;
      break;
  }
  for (int changes = 0; changes < 32 && !input.usedUp(); ++changes) damage(files, input);
  return files;
}

std::string layOut(const std::string& directory, const std::string& name,
                   const DatabaseFiles& files) {
  const std::string path = directory + "/" + name + ".sqlite";
  const auto write = [](const std::string& where, const std::string& content) {
    if (!content.empty()) std::ofstream(where, std::ios::binary) << content;
  };
  std::ofstream(path, std::ios::binary) << files.database;
  write(path + "-journal", files.journal);
  write(path + "-wal", files.log);
  return path;
}

std::string setAside(const std::string& directory, const std::string& name) {
  for (const auto& entry : std::filesystem::directory_iterator(directory)) {
    const std::string file = entry.path().filename().string();
    if (file.starts_with(name + ".corrupt-") && !file.ends_with("-journal")) return entry.path();
  }
  return "";
}

void requireNothingLost(const DatabaseFiles& files, const std::string& path,
                        const std::string& aside, bool is_open) {
  if (!aside.empty()) {
    require(!files.isAlone() || test::contentOf(aside) == files.database,
            "what is set aside is set aside as it was");
    require(is_open, "in the place of a damaged file a fresh one is begun");
  } else if (!is_open && files.isAlone()) {
    require(test::contentOf(path) == files.database, "a file that cannot be opened is left alone");
  }
}

}  // namespace spacekeep::fuzz
