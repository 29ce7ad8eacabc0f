// The state file: a suite is opened over any bytes. Whatever becomes of it, the bytes are still
// there afterwards, in their place or set aside, and what the suite then takes it keeps.
#include <cstddef>
#include <cstdint>
#include <filesystem>
#include <memory>
#include <string>
#include <system_error>

#include "fuzz/helpers/promises.h"
#include "support/preferences/linux/sqlite_suite.h"
#include "tests/helpers/temporary_directory.h"

namespace spacekeep::fuzz {
namespace {

constexpr const char* kName = "fuzz";
constexpr const char* kFile = "fuzz.sqlite";

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
  const auto again = SqliteSuite::open(directory, kName);
  require(again != nullptr, "a suite that was written can be opened");
  require(!again->refresh(), "a suite that was written can be read");
  const Value* kept = again->find("fuzz.key");
  require(kept != nullptr && *kept == Value("fuzz value"), "what was committed is kept");
  return true;
}

void examine(const std::string& content) {
  const test::TemporaryDirectory directory;
  const std::string path = directory.write(kFile, content);
  const auto suite = SqliteSuite::open(directory.path(), kName);
  const std::string aside = setAside(directory.path());
  if (!aside.empty()) {
    require(test::contentOf(aside) == content, "what is set aside is set aside as it was");
    require(suite != nullptr, "in the place of a damaged file a fresh one is begun");
  } else if (suite == nullptr) {
    require(test::contentOf(path) == content, "a file that cannot be opened is left alone");
  }
  if (suite == nullptr) return;
  require(!suite->refresh() || aside.empty(), "a fresh suite can be read");
  require(takesAndKeeps(directory.path(), *suite) || aside.empty(), "a fresh suite can be written");
}

}  // namespace
}  // namespace spacekeep::fuzz

extern "C" int LLVMFuzzerInitialize(int*, char***) {
  spacekeep::fuzz::checkLogLines();
  return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  spacekeep::fuzz::examine(spacekeep::fuzz::textOfInput(data, size));
  return 0;
}
