// Listening sockets at a path, and what may stand there before.
#include "support/ipc/linux/sockets.h"

#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <unistd.h>

#include <string>
#include <vector>

#include "tests/helpers/temporary_directory.h"
#include "tests/helpers/threads/other_process.h"

namespace spacekeep::ipc::test {
namespace {

TEST(BindListeningSocket, TakesThePlaceOfASocketThatNobodyServesAnyMore) {
  const spacekeep::test::TemporaryDirectory directory;
  std::string why;
  ASSERT_NE(bindListeningSocket(directory / "s", 0600, why), nullptr);  // and is closed at once
  EXPECT_NE(bindListeningSocket(directory / "s", 0600, why), nullptr) << why;
}

TEST(BindListeningSocket, LeavesASocketAloneThatAnotherServesHoweverBusyItIs) {
  const spacekeep::test::TemporaryDirectory directory;
  std::string why;
  const auto served = bindListeningSocket(directory / "s", 0600, why);
  ASSERT_NE(served, nullptr) << why;
  EXPECT_EQ(bindListeningSocket(directory / "s", 0600, why), nullptr);
  EXPECT_EQ(why, directory / "s" + " is served by another process already");
  ASSERT_EQ(::listen(served->fd(), 0), 0);
  std::vector<SharedDescriptor> waiting;
  while (auto socket = connectSocket(directory / "s", why)) waiting.push_back(std::move(socket));
  EXPECT_EQ(bindListeningSocket(directory / "s", 0600, why), nullptr);
  EXPECT_EQ(why, directory / "s" + " is served by another process already");
}

TEST(BindListeningSocket, TellsWhyASocketThatNobodyServesCannotBeReplaced) {
  const spacekeep::test::TemporaryDirectory directory;
  std::string why;
  ASSERT_NE(bindListeningSocket(directory / "s", 0666, why), nullptr);  // and is closed at once
  ASSERT_EQ(::chmod(directory.path().c_str(), 0755), 0);
  EXPECT_TRUE(spacekeep::test::holdsInAnotherProcess([&] {
    if (::setuid(4711) != 0 || bindListeningSocket(directory / "s", 0666, why)) return false;
    return why == "cannot replace " + directory / "s" + ": Permission denied";
  }));
}

TEST(BindListeningSocket, LeavesAFileAlone) {
  const spacekeep::test::TemporaryDirectory directory;
  const std::string file = directory.write("s", "content");
  std::string why;
  EXPECT_EQ(bindListeningSocket(file, 0600, why), nullptr);
  EXPECT_EQ(why, file + " exists and is not a socket; remove it");
}

TEST(BindListeningSocket, GivesTheSocketExactlyItsMode) {
  const spacekeep::test::TemporaryDirectory directory;
  std::string why;
  const auto listening = bindListeningSocket(directory / "s", 0666, why);
  struct stat status {};
  ASSERT_EQ(::stat((directory / "s").c_str(), &status), 0);
  EXPECT_EQ(status.st_mode & 07777U, 0666U);
}

TEST(BindListeningSocket, RefusesAPathThatIsTooLong) {
  std::string why;
  EXPECT_EQ(bindListeningSocket("/tmp/" + std::string(200, 'x'), 0600, why), nullptr);
  EXPECT_NE(why.find("1 to 107 bytes"), std::string::npos);
}

}  // namespace
}  // namespace spacekeep::ipc::test
