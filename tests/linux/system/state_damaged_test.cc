// The real daemon finds something in the place of its state that it cannot use.
#include <gtest/gtest.h>
#include <sqlite3.h>

#include <csignal>
#include <filesystem>
#include <string>
#include <vector>

#include "tests/helpers/temporary_directory.h"
#include "tests/linux/system/sandbox.h"
#include "tests/linux/system/state_client.h"

namespace spacekeep::system_test {
namespace {

namespace fs = std::filesystem;

constexpr const char* kFile = "/var/lib/spacekeep/com.quorvel.spacekeep.sqlite";

class StateInTheWay : public testing::Test {
 protected:
  void SetUp() override { sandbox_.start(); }
  /// What is in the state directory under a name of something set aside.
  [[nodiscard]] std::vector<std::string> contentsSetAside() const {
    std::vector<std::string> contents;
    for (const auto& entry : fs::directory_iterator(sandbox_.outside("/var/lib/spacekeep"))) {
      const std::string name = entry.path().filename();
      if (name.find(".corrupt-") != std::string::npos && !name.ends_with("-journal")) {
        contents.push_back(test::contentOf(entry.path()));
      }
    }
    return contents;
  }
  void expectItStartsAndWorks() {
    Process daemon = sandbox_.startDaemon();
    const auto client = connectToStarting(sandbox_);
    ASSERT_NE(client, nullptr);
    EXPECT_EQ(client->state("KEY").value, std::nullopt);
    EXPECT_TRUE(client->setState("KEY", Value(1)).ok());
    EXPECT_EQ(client->state("KEY").value, Value(1));
    daemon.signal(SIGKILL);
    daemon.wait();
  }

  Sandbox sandbox_;
};

TEST_F(StateInTheWay, ThatIsDamagedIsSetAsideByteForByteAndSaidClearly) {
  const std::string junk = "not a database" + std::string(20'000, '\x5a');
  sandbox_.write(kFile, junk);
  expectItStartsAndWorks();
  EXPECT_EQ(contentsSetAside(), std::vector<std::string>{junk});
  const std::string log = sandbox_.daemonLog();
  EXPECT_NE(log.find(std::string(kFile) + " cannot be used (file is not a database"),
            std::string::npos)
      << log;
  EXPECT_NE(log.find("It was set aside as /var/lib/spacekeep/com.quorvel.spacekeep.corrupt-"),
            std::string::npos);
  EXPECT_NE(log.find("and the suite starts empty."), std::string::npos);
}

TEST_F(StateInTheWay, ThatIsTheDatabaseOfAnotherProgramIsSetAsideByteForByte) {
  const test::TemporaryDirectory elsewhere;
  sqlite3* database = nullptr;
  ASSERT_EQ(sqlite3_open((elsewhere / "theirs").c_str(), &database), SQLITE_OK);
  ASSERT_EQ(sqlite3_exec(database, "CREATE TABLE theirs (a)", nullptr, nullptr, nullptr),
            SQLITE_OK);
  ASSERT_EQ(sqlite3_close(database), SQLITE_OK);
  const std::string theirs = test::contentOf(elsewhere / "theirs");
  ASSERT_GT(theirs.size(), 4096U);
  sandbox_.write(kFile, theirs);
  expectItStartsAndWorks();
  EXPECT_EQ(contentsSetAside(), std::vector<std::string>{theirs});
  EXPECT_NE(sandbox_.daemonLog().find("it is the database of another program"), std::string::npos);
}

TEST_F(StateInTheWay, ThatIsNoFileAtAllIsLeftAloneAndTheDaemonStartsWithoutState) {
  fs::create_directories(sandbox_.outside(kFile));
  const Process daemon = sandbox_.startDaemon();
  const auto client = connectToStarting(sandbox_);
  ASSERT_NE(client, nullptr);
  EXPECT_NE(sandbox_.daemonLog().find("Unable to initialize user defaults!"), std::string::npos);
  EXPECT_FALSE(client->setState("KEY", Value(1)).ok());
  EXPECT_EQ(client->state("SPACEKEEP_CACHE_ENABLED").value, Value(true));
  EXPECT_TRUE(fs::is_directory(sandbox_.outside(kFile)));
}

}  // namespace
}  // namespace spacekeep::system_test
