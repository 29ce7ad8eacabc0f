#include "support/files/linux/linux_directory_reader.h"

#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <unistd.h>

#include <algorithm>
#include <cstring>

#include "support/values/plist.h"
#include "tests/helpers/log_capture.h"
#include "tests/helpers/temporary_directory.h"

namespace spacekeep {
namespace {

using test::LogCapture;
using test::TemporaryDirectory;

std::vector<std::string> sorted(std::vector<std::string> entries) {
  std::sort(entries.begin(), entries.end());
  return entries;
}

std::string refusal(const std::string& path) {
  const auto answer = LinuxDirectoryReader().readWholeFile(path);
  const auto* error = std::get_if<FileError>(&answer);
  return error == nullptr ? "read" : error->reason;
}

TEST(DirectoryWalk, EverythingBelowIsListedAsRelativePaths) {
  const TemporaryDirectory directory;
  directory.write("a.plist", "1");
  directory.write("sub/b", "2");
  directory.write("sub/deeper/c", "3");
  directory.write(".hidden", "4");
  std::filesystem::create_directory(directory / "empty");
  LinuxDirectoryReader reader;
  EXPECT_EQ(sorted(reader.entriesBelow(directory.path())),
            (std::vector<std::string>{".hidden", "a.plist", "empty", "sub", "sub/b", "sub/deeper",
                                      "sub/deeper/c"}));
  EXPECT_EQ(reader.entriesBelow(directory.path() + "/").size(), 7u);
  EXPECT_EQ(reader.entriesBelow("/" + directory.path()).size(), 7u);
}

TEST(DirectoryWalk, ADirectoryComesRightBeforeWhatItHolds) {
  const TemporaryDirectory directory;
  for (const char* name : {"x/1", "x/2", "y/1", "y/z/1", "w"}) directory.write(name, "");
  const auto entries = LinuxDirectoryReader().entriesBelow(directory.path());
  for (std::size_t i = 0; i < entries.size(); ++i) {
    const std::size_t slash = entries[i].rfind('/');
    if (slash == std::string::npos) continue;
    const std::string parent = entries[i].substr(0, slash);
    const auto found = std::find(entries.begin(), entries.end(), parent);
    ASSERT_LT(found - entries.begin(), static_cast<std::ptrdiff_t>(i)) << entries[i];
    for (auto between = found + 1; between != entries.begin() + static_cast<std::ptrdiff_t>(i);
         ++between) {
      EXPECT_TRUE(between->starts_with(parent + "/")) << *between;
    }
  }
}

TEST(DirectoryWalk, AMissingDirectoryGivesNothingAndNoMessage) {
  LogCapture log;
  const TemporaryDirectory directory;
  EXPECT_TRUE(LinuxDirectoryReader().entriesBelow(directory / "absent").empty());
  EXPECT_TRUE(log.lines().empty());
}

TEST(DirectoryWalk, WhatIsNoDirectoryIsAProblemLine) {
  LogCapture log;
  const TemporaryDirectory directory;
  EXPECT_TRUE(LinuxDirectoryReader().entriesBelow(directory.write("file", "")).empty());
  EXPECT_TRUE(log.contains(kLogProblem, "file cannot be read: Not a directory"));
}

TEST(DirectoryWalk, LinksAreListedAndNotFollowed) {
  const TemporaryDirectory directory;
  directory.write("real/inside", "");
  std::filesystem::create_symlink(directory / "real", directory / "link");
  std::filesystem::create_symlink(".", directory / "real/loop");
  std::filesystem::create_symlink("/nowhere", directory / "dangling");
  EXPECT_EQ(sorted(LinuxDirectoryReader().entriesBelow(directory.path())),
            (std::vector<std::string>{"dangling", "link", "real", "real/inside", "real/loop"}));
}

TEST(DirectoryWalk, TooManyEntriesAreCutWithAProblemLine) {
  LogCapture log;
  const TemporaryDirectory directory;
  for (int i = 0; i < 20; ++i) directory.write("f" + std::to_string(i), "");
  EXPECT_EQ(LinuxDirectoryReader({.entries = 20, .depth = 4}).entriesBelow(directory.path()).size(),
            20u);
  EXPECT_TRUE(log.lines().empty());
  EXPECT_EQ(LinuxDirectoryReader({.entries = 19, .depth = 4}).entriesBelow(directory.path()).size(),
            19u);
  EXPECT_EQ(log.count(kLogProblem, "holds more than 19 entries, the others are left out"), 1u);
}

TEST(DirectoryWalk, TooDeepDirectoriesAreCutWithAProblemLine) {
  LogCapture log;
  const TemporaryDirectory directory;
  directory.write("1/2/3/4/file", "");
  directory.write("beside", "");
  EXPECT_EQ(
      LinuxDirectoryReader({.entries = 100, .depth = 4}).entriesBelow(directory.path()).size(), 6u);
  EXPECT_TRUE(log.lines().empty());
  const auto cut =
      sorted(LinuxDirectoryReader({.entries = 100, .depth = 2}).entriesBelow(directory.path()));
  EXPECT_EQ(cut, (std::vector<std::string>{"1", "1/2", "1/2/3", "beside"}));
  EXPECT_EQ(log.count(kLogProblem, "1/2/3 is nested deeper than 2 directories"), 1u);
}

TEST(DirectoryWalk, TheShippedDepthIsWalkedToItsEndAndNoFurther) {
  LogCapture log;
  const TemporaryDirectory directory;
  std::string path;
  for (int i = 0; i < 70; ++i) path += "d/";
  directory.write(path + "file", "");
  EXPECT_EQ(LinuxDirectoryReader().entriesBelow(directory.path()).size(), 65u);
  EXPECT_EQ(log.count(kLogProblem, "is nested deeper than 64 directories"), 1u);
}

TEST(WholeFile, AFileIsReadToItsEnd) {
  const TemporaryDirectory directory;
  const std::string content(300'000, 'x');
  const auto answer = LinuxDirectoryReader().readWholeFile(directory.write("f", content));
  const auto* bytes = std::get_if<std::vector<std::uint8_t>>(&answer);
  ASSERT_NE(bytes, nullptr);
  EXPECT_TRUE(std::equal(bytes->begin(), bytes->end(), content.begin(), content.end()));
  const auto empty = LinuxDirectoryReader().readWholeFile(directory.write("e", ""));
  EXPECT_TRUE(std::get<std::vector<std::uint8_t>>(empty).empty());
}

TEST(WholeFile, FilesOfTheKernelSayNoSizeAndAreReadAllTheSame) {
  const auto answer = LinuxDirectoryReader().readWholeFile("/proc/self/status");
  EXPECT_GT(std::get<std::vector<std::uint8_t>>(answer).size(), 100u);
}

TEST(WholeFile, ALinkToAFileIsReadable) {
  const TemporaryDirectory directory;
  directory.write("real", "content");
  std::filesystem::create_symlink("real", directory / "link");
  EXPECT_EQ(refusal(directory / "link"), "read");
}

TEST(WholeFile, TheLargestSizeIsReadAndOneMoreByteIsNot) {
  const TemporaryDirectory directory;
  EXPECT_EQ(refusal(directory.write("f", std::string(kMaxPlistBytes, 'x'))), "read");
  EXPECT_EQ(refusal(directory.write("f", std::string(kMaxPlistBytes + 1, 'x'))),
            "it is larger than 4194304 bytes");
}

TEST(WholeFile, WhatIsNoRegularFileIsRefusedWithoutWaiting) {
  const TemporaryDirectory directory;
  ASSERT_EQ(mkfifo((directory / "fifo").c_str(), 0600), 0);
  std::filesystem::create_symlink("fifo", directory / "link");
  std::filesystem::create_symlink("loop", directory / "loop");
  EXPECT_EQ(refusal(directory / "fifo"), "it is not a regular file");
  EXPECT_EQ(refusal(directory / "link"), "it is not a regular file");
  EXPECT_EQ(refusal("/dev/null"), "it is not a regular file");
  EXPECT_EQ(refusal(directory.path()), "it is a directory");
  EXPECT_EQ(refusal(directory / "absent"), "it cannot be opened: No such file or directory");
  EXPECT_EQ(refusal(directory / "loop"), "it cannot be opened: Too many levels of symbolic links");
  EXPECT_EQ(refusal(""), "it cannot be opened: No such file or directory");
}

}  // namespace
}  // namespace spacekeep
