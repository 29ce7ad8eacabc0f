// Services that a descriptor file declares: their sockets, whom to trust, and one shared
// connection.
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include "tests/helpers/log_capture.h"
#include "tests/linux/ipc/ipc_world.h"

namespace spacekeep::ipc::test {
namespace {

TEST(DeclaredSocketName, IsMadeOfSafeServiceIdsOnly) {
  EXPECT_EQ(declaredSocketName("com.quorvel.cache-1_a"), "com.quorvel.cache-1_a.sock");
  EXPECT_EQ(declaredSocketName("azAZ09"), "azAZ09.sock");
  EXPECT_EQ(declaredSocketName(std::string(64, 'a')), std::string(64, 'a') + ".sock");
  for (const std::string& unsafe :
       {std::string(), std::string("."), std::string(".."), std::string(".hidden"),
        std::string("a/b"), std::string("../x"), std::string("a b"), std::string("\xC3\xA4"),
        std::string("a\0b", 3), std::string(65, 'a')}) {
    EXPECT_EQ(declaredSocketName(unsafe), "") << unsafe;
  }
}

class Declared : public ::testing::Test {
 protected:
  std::shared_ptr<Connection> connectTo(const std::string& id) {
    return connector.connectionToDeclared(id, testInterface());
  }
  /// Lets the server also listen as the declared service `id`.
  void declare(const std::string& id) {
    std::string why;
    server.server().serveListening(bindListeningSocket(directory / (id + ".sock"), 0600, why));
    ASSERT_EQ(why, "");
  }

  spacekeep::test::TemporaryDirectory directory;
  TestServer server;
  LinuxConnector connector{server.loop, server.global, directory.path()};
};

TEST_F(Declared, AServiceIsReachedAtItsSocket) {
  declare("svc");
  const auto connection = connectTo("svc");
  ASSERT_NE(connection, nullptr);
  EXPECT_TRUE(callAndWait(connection, "number", {std::int32_t{1}}).reply);
}

TEST_F(Declared, CallersShareOneConnection) {
  declare("svc");
  declare("other");
  EXPECT_EQ(connectTo("svc"), connectTo("svc"));
  EXPECT_NE(connectTo("svc"), connectTo("other"));
}

TEST_F(Declared, AnEndedConnectionIsReplacedByANewOne) {
  declare("svc");
  const auto first = connectTo("svc");
  ASSERT_TRUE(callAndWait(first, "number", {std::int32_t{1}}).reply);
  first->invalidate();
  EXPECT_TRUE(eventually([&] { return connectTo("svc") != first; }));
  EXPECT_TRUE(callAndWait(connectTo("svc"), "number", {std::int32_t{2}}).reply);
}

// A service that ends when it is idle is started again by the next connection. One worker runs the
// handlers here, so a failed call is told before the end of its connection is, and who then calls
// anew has to get another connection all the same.
TEST_F(Declared, AConnectionThatTheServiceEndedIsReplacedAtOnce) {
  TestServer next;
  declare("svc");
  ConcurrentQueue one_worker({.parallelism = 1});
  {
    LinuxConnector caller(server.loop, one_worker, directory.path());
    const auto first = caller.connectionToDeclared("svc", testInterface());
    std::shared_ptr<Connection> second;
    // Shared, because who signals may still be inside when the wait has ended.
    const auto failed = std::make_shared<CountingSemaphore>(0U);
    const auto proxy = first->remoteProxy([&, failed](const Error&) {
      second = caller.connectionToDeclared("svc", testInterface());
      failed->signal();
    });
    proxy->call("hold", {}, nullptr);
    ASSERT_TRUE(eventually([&] { return server.held() == 1; }));
    ASSERT_EQ(::unlink((directory / "svc.sock").c_str()), 0);
    std::string why;
    next.server().serveListening(bindListeningSocket(directory / "svc.sock", 0600, why));
    ASSERT_EQ(why, "");
    server.stop();
    ASSERT_EQ(failed->waitForNs(kLongNs), WaitResult::kSignalled);
    ASSERT_NE(second, nullptr);
    ASSERT_NE(second, first);
    EXPECT_TRUE(callAndWait(second, "number", {std::int32_t{1}}).reply);
  }
  server.loop.runAndWait([] {});  // the connections are gone before their queue is
}

TEST_F(Declared, NobodyListeningIsNoConnection) { EXPECT_EQ(connectTo("svc"), nullptr); }

TEST_F(Declared, AnUnsafeIdIsNoConnectionAndIsLogged) {
  spacekeep::test::LogCapture log;
  EXPECT_EQ(connectTo("../daemon"), nullptr);
  EXPECT_EQ(log.count(kLogProblem, "is no safe file name"), 1U);
}

TEST_F(Declared, ADirectoryThatOthersMayWriteToIsNotTrusted) {
  spacekeep::test::LogCapture log;
  declare("svc");
  for (const mode_t mode : {0777U, 0770U, 0707U}) {
    ASSERT_EQ(::chmod(directory.path().c_str(), mode), 0);
    EXPECT_EQ(connectTo("svc"), nullptr);
  }
  EXPECT_EQ(log.count(kLogProblem, "others may write to it"), 3U);
  ASSERT_EQ(::chmod(directory.path().c_str(), 0755), 0);
  EXPECT_NE(connectTo("svc"), nullptr);
}

TEST_F(Declared, ADirectoryOfAnotherUserIsNotTrusted) {
  if (::geteuid() != 0) GTEST_SKIP() << "needs root to give a directory away";
  spacekeep::test::LogCapture log;
  declare("svc");
  ASSERT_EQ(::chown(directory.path().c_str(), 12345, 12345), 0);
  EXPECT_EQ(connectTo("svc"), nullptr);
  EXPECT_EQ(log.count(kLogProblem, "it belongs to another user"), 1U);
}

TEST_F(Declared, ADirectoryBehindASymbolicLinkIsNotTrusted) {
  declare("svc");
  const std::string link = server.directory / "link";
  ASSERT_EQ(::symlink(directory.path().c_str(), link.c_str()), 0);
  LinuxConnector through_link(server.loop, server.global, link);
  EXPECT_EQ(through_link.connectionToDeclared("svc", testInterface()), nullptr);
}

}  // namespace
}  // namespace spacekeep::ipc::test
