#include "support/logging/linux/log_level.h"

#include <gtest/gtest.h>
#include <sys/stat.h>

#include <csignal>

#include "tests/helpers/temporary_directory.h"

namespace spacekeep {
namespace {

using test::TemporaryDirectory;

std::string document(const std::string& content) {
  return "<plist version=\"1.0\">" + content + "</plist>";
}

std::string levelDocument(const std::string& value) {
  return document("<dict><key>LogLevel</key>" + value + "</dict>");
}

std::int32_t level(const std::string& path) {
  const auto answer = readLogLevel(path);
  const auto* number = std::get_if<std::int32_t>(&answer);
  return number == nullptr ? -1 : *number;
}

std::string problem(const std::string& path) {
  const auto answer = readLogLevel(path);
  const auto* found = std::get_if<LogLevelProblem>(&answer);
  return found == nullptr ? "none" : found->reason;
}

TEST(LogLevelFile, TheLevelOfTheFileCounts) {
  const TemporaryDirectory directory;
  EXPECT_EQ(level(directory.write("a", levelDocument("<integer>5</integer>"))), 5);
  EXPECT_EQ(level(directory.write("b", levelDocument("<integer>0</integer>"))), 0);
}

TEST(LogLevelFile, AMissingFileOrKeyGivesTheDefault) {
  const TemporaryDirectory directory;
  EXPECT_EQ(level(directory / "absent"), 4);
  EXPECT_EQ(level(directory.write("empty", document("<dict/>"))), 4);
}

TEST(LogLevelFile, ABadFileIsAProblem) {
  const TemporaryDirectory directory;
  for (const char* value : {"<integer>-1</integer>", "<integer>4294967296</integer>",
                            "<string>5</string>", "<true/>", "<array/>"}) {
    EXPECT_EQ(problem(directory.write("f", levelDocument(value))),
              "LogLevel is not a number from 0 upwards")
        << value;
  }
  EXPECT_EQ(problem(directory.write("f", document("<array/>"))),
            "its top level is not a dictionary");
  EXPECT_TRUE(problem(directory.write("f", "LogLevel=5\n")).starts_with("not a property list"));
  EXPECT_TRUE(problem(directory.write("f", "")).starts_with("not a property list"));
  EXPECT_EQ(problem(directory.write("f", std::string(kMaxLogLevelFileBytes + 1, ' '))),
            "it is too large");
  EXPECT_EQ(problem(directory.path()), "it is not a regular file");
  ASSERT_EQ(mkfifo((directory / "fifo").c_str(), 0600), 0);
  EXPECT_EQ(problem(directory / "fifo"), "it is not a regular file");
  EXPECT_TRUE(problem(directory / "fifo/below").starts_with("it cannot be opened: "));
}

/// Gives back what setting up logging has changed.
class LogSetUp : public testing::Test {
 protected:
  ~LogSetUp() override {
    setLogHandle(nullptr);
    gMOLogWrite.store(&writeLogLine);
    std::signal(SIGPIPE, SIG_DFL);
  }
};

TEST_F(LogSetUp, ABadFileIsAProblemLineAndTheDefaultLevel) {
  const TemporaryDirectory directory;
  const std::string path = directory.write("level", "junk");
  LogHandle handle;
  testing::internal::CaptureStderr();
  setUpLogging(handle, path);
  const std::string written = testing::internal::GetCapturedStderr();
  EXPECT_EQ(getLogHandle(), &handle);
  EXPECT_EQ(handle.level.load(), 4);
  EXPECT_EQ(written,
            "Spacekeep[3] setUpLogging " + path +
                " is not used, the log level is 4: not a property list: it is not well formed\n");
}

TEST_F(LogSetUp, TheHandleHasTheLevelOfTheFile) {
  const TemporaryDirectory directory;
  LogHandle handle;
  setUpLogging(handle, directory.write("level", levelDocument("<integer>5</integer>")));
  EXPECT_EQ(handle.level.load(), 5);
}

}  // namespace
}  // namespace spacekeep
