// The bugs that the simulation has to find can still be planted: each is a patch to code that moves.
#include <gtest/gtest.h>

#include <cstdlib>
#include <filesystem>
#include <string>

namespace spacekeep::tidy {
namespace {

TEST(PlantedBugs, AllApplyToTheTreeAsItIs) {
  const std::string root = SPACEKEEP_SOURCE_DIR;
  int patches = 0;
  for (const auto& entry : std::filesystem::directory_iterator(root + "/sim/planted")) {
    if (entry.path().extension() != ".patch") continue;
    ++patches;
    const std::string command =
        "patch -d " + root + " -p1 --dry-run -s -f < " + entry.path().string();
    EXPECT_EQ(std::system(command.c_str()), 0) << entry.path().filename();
  }
  EXPECT_GE(patches, 30);
}

}  // namespace
}  // namespace spacekeep::tidy
