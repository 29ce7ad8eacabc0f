// The rules about whole files and functions, over the tree.
#include <gtest/gtest.h>

#include <algorithm>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <regex>
#include <set>
#include <string>

#include "tests/linux/tidy/structure.h"

namespace spacekeep::tidy {
namespace {

Files production() { return codeOf(productionRooms()); }

Files linuxTests() {
  Files files = codeOf({"tests"});
  std::erase_if(files, [](const auto& file) { return !file.path.starts_with("tests/linux/"); });
  return files;
}

/// From the list that the build system writes of its compilations.
std::set<std::string> builtPaths() {
  std::ifstream stream(SPACEKEEP_BUILD_DIR "/compile_commands.json");
  const std::string text{std::istreambuf_iterator<char>(stream), {}};
  const std::string begin = "\"file\": \"" SPACEKEEP_SOURCE_DIR "/";
  std::set<std::string> paths;
  for (std::size_t at = text.find(begin); at != text.npos; at = text.find(begin, at + 1)) {
    const std::size_t from = at + begin.size();
    paths.insert(text.substr(from, text.find('"', from) - from));
  }
  return paths;
}

TEST(Tidy, TheTreeIsFound) {
  EXPECT_GT(production().size(), 300U);
  EXPECT_GT(codeOf({"tests"}).size(), 100U);
  EXPECT_GT(allTexts().size(), production().size() + 150);
  EXPECT_GT(builtPaths().size(), 300U);
}

TEST(Tidy, TheDaemonsRoomsIncludeOnlyTheStandardLibraryAndTheProject) {
  std::set<std::string> headers;
  for (const SourceFile& file : production()) headers.insert(file.path);
  EXPECT_EQ(foreignIncludes(codeOf(daemonRooms()), headers), "");
}

TEST(Tidy, EveryHeaderBeginsWithItsThreadSafety) {
  Files files = production();
  for (const SourceFile& file : codeOf({"bench", "fuzz"})) files.push_back(file);
  EXPECT_EQ(headersWithoutThreadSafety(files), "");
}

TEST(Tidy, EveryHeaderMayBeReadTwice) { EXPECT_EQ(headersWithoutGuard(codeOf(allRooms())), ""); }

TEST(Tidy, EveryHeaderIsIncludedSomewhere) {
  EXPECT_EQ(headersThatNothingIncludes(codeOf(allRooms()), codeOf(allRooms())), "");
}

/// ./dev names its commands in its usage, and carries them out in its last lines.
TEST(Tidy, EveryCommandThatDevOffersIsCarriedOut) {
  std::ifstream stream(SPACEKEEP_SOURCE_DIR "/dev");
  const std::string text{std::istreambuf_iterator<char>(stream), {}};
  const std::size_t begin = text.find("Usage: ./dev");
  ASSERT_NE(begin, text.npos);
  const std::string usage = text.substr(begin, text.find("\nTEXT\n") - begin);
  const std::string dispatch = text.substr(text.rfind("\ncase "));
  const std::regex command("\n  ([a-z]+) ");
  std::size_t commands = 0;
  for (std::sregex_iterator at(usage.begin(), usage.end(), command), end; at != end; ++at) {
    ++commands;
    const std::regex branch("\n  " + (*at)[1].str() + "( \\||\\))");
    EXPECT_TRUE(std::regex_search(dispatch, branch)) << (*at)[1];
  }
  EXPECT_GT(commands, 10U);
}

TEST(Tidy, EverySourceIsBuilt) {
  Files files = production();
  for (const SourceFile& file : codeOf({"tests"})) files.push_back(file);
  std::erase_if(files, [](const SourceFile& file) {
    return file.path.starts_with("services/cachedir/bench/");  // built with the benchmarks
  });
  EXPECT_EQ(sourcesThatNothingBuilds(files, builtPaths()), "")
      << "a folder's CMakeLists.txt does not take it in, or nothing needs it";
}

TEST(Tidy, NoFileIsLongerThanFiveHundredLines) {
  EXPECT_EQ(filesLongerThan(500, codeOf(allRooms())), "") << "split by idea";
}

TEST(Tidy, NoFunctionIsLongerThanSixtyLines) {
  EXPECT_EQ(functionsLongerThan(60, codeOf(allRooms())), "") << "give its steps names";
}

TEST(Tidy, NumbersNameTheirUnits) {
  EXPECT_EQ(namesWithoutUnit(codeOf(allRooms())), "") << "_ns, _seconds, _bytes, _blocks ... last";
}

TEST(Tidy, ProgramsThatAreStartedInheritNoDescriptors) {
  Files files = production();
  // There, one function opens everything and adds the flag itself.
  std::erase_if(files, [](const SourceFile& file) {
    return file.path.starts_with("services/cachedir/engine/") ||
           file.path.starts_with("services/command/engine/") ||
           file.path == "services/cachedir/index/root_index.cc";
  });
  EXPECT_EQ(inheritedDescriptors(files), "");
}

TEST(Tidy, EachLogTextIsWrittenInOnePlace) {
  Files files = production();
  std::erase_if(files, [](const SourceFile& file) {
    return file.path.starts_with("services/") || file.path.starts_with("sim/");
  });
  // Each of these belongs to several operations, whose names it begins with.
  const std::set<std::string> known = {
      "%s Connection is not entitled!", "%s connection invalidated: %@",
      "%s timed out waiting for: %@", "%s property list parse failed: %@"};
  EXPECT_EQ(logTextsAtTwoPlaces(files, known), "") << "one function that both call";
}

TEST(Tidy, TestsWaitForConditionsAndNotForTime) {
  EXPECT_EQ(sleepsWithoutReason(linuxTests()), "")
      << "wait in a loop for what shall happen, or say beside the sleep what must not";
}

}  // namespace
}  // namespace spacekeep::tidy
