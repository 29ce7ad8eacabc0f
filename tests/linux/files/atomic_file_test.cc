#include "support/files/linux/atomic_file.h"

#include <gtest/gtest.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <csignal>
#include <vector>

#include "tests/helpers/temporary_directory.h"

namespace spacekeep {
namespace {

using test::contentOf;
using test::TemporaryDirectory;

std::optional<std::string> replace(const std::string& path, const std::string& content,
                                   Durability durability = Durability::kDurable,
                                   mode_t mode = 0644) {
  const std::vector<std::uint8_t> bytes(content.begin(), content.end());
  return replaceFile(path, bytes, durability, mode);
}

mode_t modeOf(const std::string& path) {
  struct stat status {};
  return stat(path.c_str(), &status) == 0 ? status.st_mode & 07777 : 0;
}

std::size_t filesIn(const TemporaryDirectory& directory) {
  std::size_t count = 0;
  for ([[maybe_unused]] const auto& entry : std::filesystem::directory_iterator(directory.path()))
    ++count;
  return count;
}

TEST(ReplaceFile, MakesAndReplacesWithNothingLeftBeside) {
  const TemporaryDirectory directory;
  for (const Durability durability : {Durability::kDurable, Durability::kVolatile}) {
    for (const char* content : {"first", "second and longer", ""}) {
      EXPECT_EQ(replace(directory / "f", content, durability), std::nullopt);
      EXPECT_EQ(contentOf(directory / "f"), content);
      EXPECT_EQ(filesIn(directory), 1u);
    }
  }
}

TEST(ReplaceFile, TheModeIsExactWhateverTheUmask) {
  const TemporaryDirectory directory;
  const mode_t before = umask(0077);
  EXPECT_EQ(replace(directory / "f", "x", Durability::kVolatile, 0644), std::nullopt);
  umask(0);
  EXPECT_EQ(replace(directory / "g", "x", Durability::kVolatile, 0600), std::nullopt);
  umask(before);
  EXPECT_EQ(modeOf(directory / "f"), 0644u);
  EXPECT_EQ(modeOf(directory / "g"), 0600u);
}

TEST(ReplaceFile, ALeftoverOrALinkUnderTheTemporaryNameIsNotWrittenThrough) {
  const TemporaryDirectory directory;
  directory.write("victim", "untouched");
  std::filesystem::create_symlink("victim", directory / "f.new");
  EXPECT_EQ(replace(directory / "f", "new"), std::nullopt);
  EXPECT_EQ(contentOf(directory / "victim"), "untouched");
  directory.write("f.new", "left by a killed process");
  EXPECT_EQ(replace(directory / "f", "newer"), std::nullopt);
  EXPECT_EQ(contentOf(directory / "f"), "newer");
  EXPECT_FALSE(std::filesystem::exists(directory / "f.new"));
}

TEST(ReplaceFile, AReaderWithTheOldFileOpenKeepsTheOldContent) {
  const TemporaryDirectory directory;
  ASSERT_EQ(replace(directory / "f", "old"), std::nullopt);
  std::ifstream reader(directory / "f");
  ASSERT_EQ(replace(directory / "f", "new"), std::nullopt);
  EXPECT_EQ(std::string(std::istreambuf_iterator<char>(reader), {}), "old");
}

TEST(ReplaceFile, AFailureSaysWhatAndLeavesTheOldFile) {
  const TemporaryDirectory directory;
  const auto missing = replace(directory / "absent/f", "x");
  EXPECT_EQ(missing, directory / "absent/f.new cannot be created: No such file or directory");
  std::filesystem::create_directories(directory / "taken/inside");
  const auto taken = replace(directory / "taken", "x");
  EXPECT_EQ(taken, directory / "taken cannot be replaced: Is a directory");
  EXPECT_FALSE(std::filesystem::exists(directory / "taken.new"));
}

// In a child, since the limit on file sizes is the process's.
TEST(ReplaceFile, AWriteThatFailsHalfwayLeavesTheOldFileAndNoTemporaryOne) {
  const TemporaryDirectory directory;
  ASSERT_EQ(replace(directory / "f", "old"), std::nullopt);
  const pid_t child = fork();
  if (child == 0) {
    signal(SIGXFSZ, SIG_IGN);
    const rlimit limit{1000, 1000};
    setrlimit(RLIMIT_FSIZE, &limit);
    const auto problem = replace(directory / "f", std::string(5000, 'x'));
    const bool as_expected =
        problem && problem->find("f.new cannot be written: File too large") != std::string::npos;
    _exit(as_expected ? 0 : 1);
  }
  int status = -1;
  ASSERT_EQ(waitpid(child, &status, 0), child);
  EXPECT_EQ(status, 0);
  EXPECT_EQ(contentOf(directory / "f"), "old");
  EXPECT_EQ(filesIn(directory), 1u);
}

TEST(DirectoryOf, EveryFormOfPath) {
  EXPECT_EQ(directoryOf("/a/b"), "/a");
  EXPECT_EQ(directoryOf("/a"), "/");
  EXPECT_EQ(directoryOf("a"), ".");
  EXPECT_EQ(directoryOf("a/b/c"), "a/b");
}

TEST(SyncDirectory, AMissingDirectoryIsAProblem) {
  const TemporaryDirectory directory;
  EXPECT_EQ(syncDirectory(directory.path()), std::nullopt);
  EXPECT_EQ(syncDirectory(directory / "absent"),
            directory / "absent cannot be opened: No such file or directory");
}

}  // namespace
}  // namespace spacekeep
