// Thread safety: confined to one thread at a time; templates are constant once they are made.
//
// Database files for fuzzers: sound ones, at rest and in the middle of a change, and what becomes of
// them when an input says where they are damaged.
#pragma once

#include <functional>
#include <string>
#include <string_view>

namespace spacekeep::fuzz {

/// A database and what stands beside it; empty means that there is no such file.
struct DatabaseFiles {
  std::string database;
  std::string journal;
  std::string log;  ///< written ahead of the database

  [[nodiscard]] bool isAlone() const { return journal.empty() && log.empty(); }
};

/// What inputs damage.
struct DatabaseTemplates {
  DatabaseFiles at_rest;
  DatabaseFiles interrupted;  ///< a change has begun and is to be rolled back
  DatabaseFiles logged;       ///< a change that was made is in the log only
};

/// How templates are made.
struct DatabaseChanges {
  std::string name;                                        ///< of the file, without ".sqlite"
  std::function<void(const std::string& directory)> make;  ///< the file at rest
  const char* interrupted;                                 ///< SQL that begins a change
  const char* logged;                                      ///< SQL that makes one
};
[[nodiscard]] DatabaseTemplates makeTemplates(const DatabaseChanges& changes);

/// The first byte says what is damaged: 0 (of 4) the rest of the input stands as the database, else
/// the templates in their order, changed as the rest says.
[[nodiscard]] DatabaseFiles filesOf(std::string_view input, const DatabaseTemplates& templates);

/// `files` into `directory` under `name`; answers the path of the database.
std::string layOut(const std::string& directory, const std::string& name,
                   const DatabaseFiles& files);

/// The path of the database that was set aside in `directory`; empty when none was.
[[nodiscard]] std::string setAside(const std::string& directory, const std::string& name);

/// What was set aside holds what `files` held, and what could not be opened was not changed.
void requireNothingLost(const DatabaseFiles& files, const std::string& path,
                        const std::string& aside, bool is_open);

}  // namespace spacekeep::fuzz
