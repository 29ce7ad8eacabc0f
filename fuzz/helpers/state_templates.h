// Thread safety: make them on one thread; constant from then on.
//
// State files as the daemon and the library leave them, at rest and in the middle of a change: what
// inputs then damage.
#pragma once

#include <string>

namespace spacekeep::fuzz {

/// A database and what stands beside it; empty means that there is no such file.
struct StateFiles {
  std::string database;
  std::string journal;
  std::string log;  ///< written ahead of the database
};

struct StateTemplates {
  StateFiles at_rest;      ///< holds "fuzz.old"
  StateFiles interrupted;  ///< a change to "fuzz.old" has begun and is to be rolled back
  StateFiles logged;       ///< "fuzz.logged" is in the log only
};

inline constexpr const char* kStateName = "fuzz";

[[nodiscard]] StateTemplates makeStateTemplates();

}  // namespace spacekeep::fuzz
