#include "support/logging/linux/journal.h"

#include <gtest/gtest.h>
#include <sched.h>
#include <sys/mount.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <unistd.h>

#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <optional>
#include <stdexcept>
#include <vector>

#include "tests/helpers/temporary_directory.h"

namespace spacekeep {
namespace {

using test::TemporaryDirectory;

// A socket in the place of the journal's.
class FakeJournal {
 public:
  explicit FakeJournal(const std::string& path)
      : socket_(socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0)) {
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    std::memcpy(address.sun_path, path.data(), path.size());
    EXPECT_EQ(bind(socket_, reinterpret_cast<const sockaddr*>(&address), sizeof(address)), 0);
  }
  ~FakeJournal() { close(socket_); }
  FakeJournal(const FakeJournal&) = delete;
  FakeJournal& operator=(const FakeJournal&) = delete;

  std::string receive() const {
    std::vector<char> buffer(256 * 1024);
    const ssize_t got = recv(socket_, buffer.data(), buffer.size(), MSG_DONTWAIT);
    return got < 0 ? "nothing" : std::string(buffer.data(), static_cast<std::size_t>(got));
  }

 private:
  int socket_;
};

std::string datagram(std::int32_t level, const char* format,
                     const std::vector<LogArgument>& arguments, std::uint64_t dropped = 0) {
  return journalDatagram(level, "Spacekeep", format, arguments, dropped);
}

bool hasLine(const std::string& text, const std::string& line) {
  return text.starts_with(line + "\n") || text.find("\n" + line + "\n") != std::string::npos;
}

TEST(JournalDatagram, CarriesLevelCategoryAndOperationAsFields) {
  const std::string text =
      datagram(3, "%s volume %@ is full", {std::string_view("purge"), std::string_view("/data")});
  EXPECT_TRUE(hasLine(text, "MESSAGE=purge volume /data is full")) << text;
  EXPECT_TRUE(hasLine(text, "PRIORITY=3"));
  EXPECT_TRUE(hasLine(text, "SPACEKEEP_LEVEL=3"));
  EXPECT_TRUE(hasLine(text, "SPACEKEEP_CATEGORY=Spacekeep"));
  EXPECT_TRUE(hasLine(text, "SPACEKEEP_OPERATION=purge"));
  EXPECT_EQ(text.find("SPACEKEEP_DROPPED"), std::string::npos);
  EXPECT_EQ(text.back(), '\n');
}

TEST(JournalDatagram, TracingIsDebugging) {
  EXPECT_TRUE(hasLine(datagram(5, "%s ENTRY", {std::string_view("op")}), "PRIORITY=7"));
  EXPECT_TRUE(hasLine(datagram(4, "%s", {std::string_view("op")}), "PRIORITY=6"));
}

TEST(JournalDatagram, DroppedLinesAreCounted) {
  EXPECT_TRUE(hasLine(datagram(5, "%s", {std::string_view("op")}, 17), "SPACEKEEP_DROPPED=17"));
}

TEST(JournalDatagram, WithoutAnOperationTheFieldIsLeftOut) {
  EXPECT_EQ(datagram(5, "plain", {}).find("SPACEKEEP_OPERATION"), std::string::npos);
  EXPECT_EQ(datagram(5, "%d", {std::int64_t{1}}).find("SPACEKEEP_OPERATION"), std::string::npos);
}

TEST(JournalDatagram, NoArgumentCanAddAField) {
  const std::string text = datagram(
      3, "%s %@", {std::string_view("op\nPRIORITY=0"), std::string_view("x\nSPACEKEEP_LEVEL=9\n")});
  std::size_t lines = 0;
  for (const char character : text) lines += character == '\n' ? 1 : 0;
  EXPECT_EQ(lines, 6u);
  EXPECT_FALSE(hasLine(text, "PRIORITY=0"));
  EXPECT_FALSE(hasLine(text, "SPACEKEEP_LEVEL=9"));
}

TEST(JournalSocket, ADatagramArrivesWhole) {
  const TemporaryDirectory directory;
  const FakeJournal journal(directory / "socket");
  const std::string text = "MESSAGE=" + std::string(60'000, 'x') + "\n";
  EXPECT_EQ(sendToJournal(directory / "socket", text), JournalSend::kSent);
  EXPECT_EQ(journal.receive(), text);
}

TEST(JournalSocket, AStuckJournalIsNotWaitedFor) {
  const TemporaryDirectory directory;
  const FakeJournal journal(directory / "socket");
  JournalSend last = JournalSend::kSent;
  for (int line = 0; line < 100'000 && last == JournalSend::kSent; ++line) {
    last = sendToJournal(directory / "socket", "MESSAGE=x\n");
  }
  EXPECT_EQ(last, JournalSend::kFull);
  EXPECT_EQ(journal.receive(), "MESSAGE=x\n");
  EXPECT_EQ(sendToJournal(directory / "socket", "MESSAGE=y\n"), JournalSend::kSent);
}

TEST(JournalSocket, AMissingRestartedOrImpossibleJournalIsToldApart) {
  const TemporaryDirectory directory;
  EXPECT_EQ(sendToJournal(directory / "socket", "MESSAGE=x\n"), JournalSend::kUnreachable);
  EXPECT_EQ(sendToJournal(std::string(500, 'p'), "MESSAGE=x\n"), JournalSend::kUnreachable);
  { const FakeJournal first(directory / "socket"); }
  EXPECT_EQ(sendToJournal(directory / "socket", "MESSAGE=x\n"), JournalSend::kUnreachable);
  unlink((directory / "socket").c_str());
  const FakeJournal second(directory / "socket");
  EXPECT_EQ(sendToJournal(directory / "socket", "MESSAGE=z\n"), JournalSend::kSent);
  EXPECT_EQ(second.receive(), "MESSAGE=z\n");
}

TEST(JournalChoice, StandardErrorIsTheJournalOnlyWhenTheStreamIsTheSame) {
  struct stat error {};
  ASSERT_EQ(fstat(STDERR_FILENO, &error), 0);
  const std::string same = std::to_string(error.st_dev) + ":" + std::to_string(error.st_ino);
  ASSERT_EQ(setenv("JOURNAL_STREAM", same.c_str(), 1), 0);
  EXPECT_TRUE(standardErrorIsJournal());
  for (const char* other : {"", "1:1", "x", ":", "99999999999999999999:1"}) {
    ASSERT_EQ(setenv("JOURNAL_STREAM", other, 1), 0);
    EXPECT_FALSE(standardErrorIsJournal()) << other;
    EXPECT_FALSE(installPlatformLog());
    EXPECT_EQ(gMOLogWrite.load(), &writeLogLine);
  }
  ASSERT_EQ(unsetenv("JOURNAL_STREAM"), 0);
  EXPECT_FALSE(standardErrorIsJournal());
}

/// A /run of this process's own with nothing in it but a journal.
class RunWithAJournal {
 public:
  RunWithAJournal() {
    if (unshare(CLONE_NEWNS) != 0 ||
        mount(nullptr, "/", nullptr, MS_REC | MS_PRIVATE, nullptr) != 0 ||
        mount("none", "/run", "tmpfs", 0, nullptr) != 0) {
      throw std::runtime_error("this test mounts a file system and has to run as root");
    }
    std::filesystem::create_directories(std::filesystem::path(kJournalSocket).parent_path());
    journal_.emplace(kJournalSocket);
  }
  ~RunWithAJournal() { umount2("/run", MNT_DETACH); }
  RunWithAJournal(const RunWithAJournal&) = delete;
  RunWithAJournal& operator=(const RunWithAJournal&) = delete;
  [[nodiscard]] const FakeJournal& journal() const { return *journal_; }

 private:
  std::optional<FakeJournal> journal_;
};

TEST(JournalChoice, LinesGoToTheJournalExactlyWhereItIsStandardError) {
  const RunWithAJournal run;
  ASSERT_EQ(setenv("JOURNAL_STREAM", "1:1", 1), 0);
  EXPECT_FALSE(installPlatformLog());
  struct stat error {};
  ASSERT_EQ(fstat(STDERR_FILENO, &error), 0);
  const std::string same = std::to_string(error.st_dev) + ":" + std::to_string(error.st_ino);
  ASSERT_EQ(setenv("JOURNAL_STREAM", same.c_str(), 1), 0);
  const auto before = gMOLogWrite.load();
  LogHandle handle;
  setLogHandle(&handle);
  EXPECT_TRUE(installPlatformLog());
  logProblem("%s to the journal", "test");
  gMOLogWrite.store(before);
  setLogHandle(nullptr);
  EXPECT_TRUE(hasLine(run.journal().receive(), "MESSAGE=test to the journal"));
  ASSERT_EQ(unsetenv("JOURNAL_STREAM"), 0);
}

}  // namespace
}  // namespace spacekeep
