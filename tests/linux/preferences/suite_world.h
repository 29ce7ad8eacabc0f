// Thread safety: plain helpers.
//
// What the tests of the suite in SQLite share.
#pragma once

#include <gtest/gtest.h>
#include <sys/stat.h>

#include <filesystem>
#include <memory>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "support/preferences/linux/sqlite_suite.h"
#include "tests/helpers/log_capture.h"
#include "tests/helpers/temporary_directory.h"

namespace spacekeep::test {

inline constexpr const char* kName = "com.quorvel.spacekeep";

inline std::string fileOf(const TemporaryDirectory& directory) {
  return directory / std::string(kName) + ".sqlite";
}

inline std::unique_ptr<SqliteSuite> open(const TemporaryDirectory& directory,
                                         SqliteSuiteOptions options = {}) {
  return SqliteSuite::open(directory.path(), kName, std::move(options));
}

// Another program at the file, as an administrator would be.
inline Database outside(const std::string& path) {
  sqlite3* raw = nullptr;
  EXPECT_EQ(sqlite3_open(path.c_str(), &raw), SQLITE_OK);
  return Database(raw);
}

inline void store(const TemporaryDirectory& directory, const char* key, const Value& value) {
  auto suite = open(directory);
  ASSERT_NE(suite, nullptr);
  suite->set(key, value);
  ASSERT_EQ(suite->synchronize(), std::nullopt);
}

inline std::optional<Value> fetch(const TemporaryDirectory& directory, const char* key) {
  auto suite = open(directory);
  return suite == nullptr ? std::nullopt : suite->get(key);
}

inline mode_t modeOf(const std::string& path) {
  struct stat status {};
  return stat(path.c_str(), &status) == 0 ? status.st_mode & 07777 : 0;
}

inline std::vector<std::string> setAsideFiles(const TemporaryDirectory& directory) {
  std::vector<std::string> found;
  for (const auto& entry : std::filesystem::directory_iterator(directory.path())) {
    const std::string name = entry.path().filename();
    if (name.starts_with(std::string(kName) + ".corrupt-")) found.push_back(entry.path());
  }
  return found;
}

}  // namespace spacekeep::test
