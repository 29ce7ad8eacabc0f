// The program from outside: its output, its exit codes, and how it serves.
#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <poll.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <unistd.h>

#include <csignal>
#include <filesystem>
#include <fstream>
#include <set>

#include "tests/linux/command/command_world.h"
#include "tests/linux/sdk/fake_daemon.h"

namespace spacekeep::command {
namespace {

using cachedir::Ended;
using cachedir::Program;
using sdk::eventually;
using testing::StartsWith;

Ended runIt(const std::vector<std::string>& arguments) {
  return Program(arguments, -1, kProgram).wait();
}

std::string ruleText(const std::string& id, const std::string& path, const std::string& more = "") {
  return "<plist version=\"1.0\"><dict><key>SPACEKEEP_ID</key><string>" + id +
         "</string><key>DIRECTORIES</key><array><dict><key>PATH</key><string>" + path +
         "</string></dict></array>" + more + "</dict></plist>\n";
}

/// The program, which has said something on standard error and is no longer read from then on.
std::unique_ptr<Program> readNoMore(const std::vector<std::string>& arguments) {
  const std::string fifo = temporaryDirectory() + "/fifo";
  EXPECT_EQ(::mkfifo(fifo.c_str(), 0600), 0);
  const int reader = ::open(fifo.c_str(), O_RDONLY | O_NONBLOCK | O_CLOEXEC);
  std::vector<std::string> words{"-c", "exec \"$@\" 2>\"$0\"", fifo, kProgram};
  words.insert(words.end(), arguments.begin(), arguments.end());
  auto running = std::make_unique<Program>(words, -1, "/bin/sh");
  pollfd said{.fd = reader, .events = POLLIN, .revents = 0};
  EXPECT_EQ(::poll(&said, 1, 20'000), 1) << "it says nothing";
  EXPECT_NE(said.revents & POLLIN, 0) << "it has ended at once";
  ::close(reader);
  return running;
}

class CommandProgram : public testing::Test {
 protected:
  void SetUp() override {
    write("a", ruleText("com.example.a", volume_ / "a",
                        "<key>DESCRIPTION</key><string>things</string><key>TAKES</key><dict><key>1"
                        "</key><string>some</string></dict><key>LOSES</key><string>little</string>"
                        "<key>SOURCE</key><string>we do</string>"));
    write("b", ruleText("com.example.b", volume_ / "b", "<key>ENABLED</key><false/>"));
    writeFile(volume_ / "a/old", kMiB, 40);
    writeFile(volume_ / "a/young", kMiB, 2);
    writeFile(volume_ / "b/old", kMiB, 40);
  }
  void write(const std::string& name, const std::string& text) const {
    std::ofstream(rules_ + "/" + name + ".plist") << text;
  }
  Volume volume_{"tmpfs"};
  const std::string rules_ = temporaryDirectory();
};

TEST_F(CommandProgram, TheEstimateIsATableOfAllRulesAtAllUrgencies) {
  const Ended table = runIt({"--rules-dir", rules_, "--estimate"});
  EXPECT_EQ(table.status, 0);
  EXPECT_EQ(table.out,
            "rule      urgency 1   urgency 2   urgency 3   urgency 4\n"
            "a           1.0 MiB     1.0 MiB     2.0 MiB     2.0 MiB\n"
            "b (off)     1.0 MiB     1.0 MiB     1.0 MiB     1.0 MiB\n"
            "total       1.0 MiB     1.0 MiB     2.0 MiB     2.0 MiB\n");
}

TEST_F(CommandProgram, ADryRunPrintsWhatOnceThenTakesOfTheRulesThatAreOn) {
  const Ended dry = runIt({"--rules-dir", rules_, "--dry-run", "--urgency", "3"});
  EXPECT_EQ(dry.status, 0);
  EXPECT_EQ(dry.out,
            "1048576\t" + (volume_ / "a/old") + "\n1048576\t" + (volume_ / "a/young") + "\n");
  EXPECT_EQ(dry.err, "would free 2097152 bytes (2.0 MiB)\n");
  const Ended once = runIt({"--rules-dir", rules_, "--once", "--urgency", "3", "--amount", "1G"});
  EXPECT_EQ(once.status, 1) << "less than was asked for";
  EXPECT_EQ(once.out, dry.out);
  EXPECT_EQ(once.err, "freed 2097152 bytes (2.0 MiB)\n");
  EXPECT_TRUE(exists(volume_ / "b/old"));
}

TEST_F(CommandProgram, ARuleThatIsOffIsSwitchedOnByAFileOfTheSameName) {
  const std::string admin = temporaryDirectory();
  std::ofstream(admin + "/b.plist")
      << "<plist version=\"1.0\"><dict><key>ENABLED</key><true/></dict></plist>";
  const Ended once = runIt({"--rules-dir", rules_, "--rules-dir", admin, "--only", "b", "--once",
                            "--urgency", "1", "--amount", "1M"});
  EXPECT_EQ(once.status, 0) << once.err;
  EXPECT_FALSE(exists(volume_ / "b/old"));
  EXPECT_TRUE(exists(volume_ / "a/old"));
}

TEST_F(CommandProgram, ADryRunNamesTheCommandOfWhichNobodyKnowsWhatItFrees) {
  write("t",
        "<plist version=\"1.0\"><dict><key>SPACEKEEP_ID</key><string>com.example.t</string>"
        "<key>MEASURE</key><array><string>" +
            (volume_ / "b") +
            "</string></array><key>CLEAN</key><dict><key>3</key><dict><key>COMMAND</key><array>"
            "<string>rm</string><string>" +
            (volume_ / "b/old") + "</string></array></dict></dict></dict></plist>");
  const std::vector<std::string> asked = {"--rules-dir", rules_, "--only", "t", "--urgency", "3"};
  const auto with = [&](std::vector<std::string> more) {
    more.insert(more.begin(), asked.begin(), asked.end());
    return runIt(more);
  };
  const Ended dry = with({"--dry-run"});
  EXPECT_EQ(dry.out, "?\trm " + (volume_ / "b/old") + "\n");
  EXPECT_EQ(dry.err, "would free 0 bytes (0 B)\n");
  EXPECT_TRUE(exists(volume_ / "b/old"));
  EXPECT_EQ(with({"--once", "--amount", "1M"}).out, "1048576\trm " + (volume_ / "b/old") + "\n");
  EXPECT_FALSE(exists(volume_ / "b/old"));
}

TEST_F(CommandProgram, EachRuleDescribesItself) {
  EXPECT_EQ(runIt({"--rules-dir", rules_, "--only", "a", "--describe"}).out,
            "a (on): things\n  urgency 1 takes some\n  lost: little\n  source: we do\n");
}

TEST_F(CommandProgram, AServiceEndsAsUsualWhereNobodyReadsWhatItSays) {
  EXPECT_EQ(cachedir::statusWithoutAReader(kProgram, {"--rules-dir", rules_}), 4);
}

TEST_F(CommandProgram, MistakesAreSaidWithAnExitCodeOfTheirOwn) {
  write("c", "<plist version=\"1.0\"><dict/></plist>");
  const Ended bad = runIt({"--rules-dir", rules_, "--once", "--amount", "1G", "--urgency", "4"});
  EXPECT_EQ(bad.status, 3);
  EXPECT_THAT(bad.err, StartsWith(rules_ + "/c.plist: "));
  EXPECT_TRUE(exists(volume_ / "a/old"));
  for (const std::vector<std::string>& wrong : std::vector<std::vector<std::string>>{
           {},
           {"--estimate"},
           {"--rules-dir", rules_, "--once"},
           {"--rules-dir", rules_, "--estimate", "--describe"},
           {"--rules-dir", rules_, "--dry-run", "--urgency", "5"}}) {
    EXPECT_EQ(runIt(wrong).status, 2);
  }
  EXPECT_EQ(runIt({"--rules-dir", rules_, "--only", "a"}).status, 4) << "no socket was handed over";
}

constexpr int kAlice = 40001;
constexpr int kBob = 40002;

/// Two users with homes on the volume, in a user database of this test program's own.
class CommandServing : public CommandProgram {
 protected:
  void SetUp() override {
    const std::string passwd = temporaryDirectory() + "/passwd";
    std::ofstream(passwd) << "root:x:0:0:root:/root:/bin/sh\n"
                          << entry("alice", kAlice) << entry("bob", kBob);
    ASSERT_EQ(::mount(passwd.c_str(), "/etc/passwd", nullptr, MS_BIND, nullptr), 0);
    ASSERT_EQ(::chmod(sockets_.path().c_str(), 0755), 0);
    ASSERT_EQ(::chmod(volume_.path().c_str(), 0755), 0);
    ASSERT_EQ(::chmod(rules_.c_str(), 0755), 0);
    std::filesystem::copy_file(kProgram, program_);
    write("pictures", ruleText("com.example.pictures", "$XDG_CACHE_HOME/pictures"));
    write("web", ruleText("com.example.web", "$XDG_CACHE_HOME/web"));
    for (const char* name : {"alice", "bob"}) {
      for (const char* cache : {"pictures", "web"}) {
        writeFile(cacheOf(name) + "/" + cache + "/old", kMiB, 40);
      }
      const std::string home = volume_ / name;
      cachedir::run("chown -R " + std::string(name) + " " + home);
    }
    daemon_.on("clientCheckin", [this](const ipc::Arguments& in, const ipc::Responder& responder) {
      const std::string id = std::get<std::string>(in.at(0));
      ids_.update([&id](auto& ids) { ids.insert(id); });
      registering_(in, responder);
    });
  }
  void TearDown() override { ::umount2("/etc/passwd", MNT_DETACH); }

  [[nodiscard]] std::string entry(const std::string& name, int uid) const {
    return name + ":x:" + std::to_string(uid) + ":" + std::to_string(uid) +
           "::" + (volume_ / name) + ":/bin/sh\n";
  }
  [[nodiscard]] std::string cacheOf(const std::string& name) const {
    return volume_ / name + "/.cache";
  }
  [[nodiscard]] std::unique_ptr<Program> serveAs(int uid) const {
    const std::string number = std::to_string(uid);
    return std::make_unique<Program>(
        std::vector<std::string>{"--reuid", number, "--regid", number, "--clear-groups", program_,
                                 "--rules-dir", rules_, "--user", "--check-in", "--socket",
                                 sockets_.daemonSocket()},
        -1, "/usr/bin/setpriv");
  }
  std::uint64_t purge(const SpacekeepServiceProtocol& service, std::uint64_t amount) {
    rt::Guarded<std::optional<std::uint64_t>> freed;
    service.servicePurge(1, {{"SPACEKEEP_VOLUME", volume_.path()}, {"SPACEKEEP_AMOUNT", amount}},
                         [&freed](const ipc::OptionalDictionary& reply) {
                           freed.set(unsignedAt(reply.value(), "SPACEKEEP_AMOUNT"));
                         });
    EXPECT_TRUE(eventually([&freed] { return freed.get().has_value(); }));
    return freed.get().value_or(0);
  }

  const std::string program_ = temporaryDirectory() + "/spacekeep-command";
  sdk::SocketDirectory sockets_;
  rt::Guarded<std::set<std::string>> ids_;
  rt::Guarded<std::vector<std::shared_ptr<SpacekeepServiceProtocol>>> services_;
  sdk::FakeDaemon daemon_{sockets_.daemonSocket()};
  const sdk::FakeDaemon::Serve registering_ = daemon_.registering(services_);
};

TEST_F(CommandServing, TwoUsersServicesStandBesideEachOtherAndEachFreesItsOwn) {
  daemon_.start();
  const auto alice = serveAs(kAlice);
  ASSERT_TRUE(eventually([this] { return services_.get().size() == 1; })) << alice->errSoFar();
  const auto bob = serveAs(kBob);
  ASSERT_TRUE(eventually([this] { return services_.get().size() == 2; })) << bob->errSoFar();
  EXPECT_EQ(ids_.get(), (std::set<std::string>{"com.quorvel.spacekeep.caches.40001",
                                               "com.quorvel.spacekeep.caches.40002"}));
  EXPECT_EQ(purge(*services_.get()[0], 10 * kMiB), 2 * kMiB);
  EXPECT_FALSE(exists(cacheOf("alice") + "/pictures/old"));
  EXPECT_FALSE(exists(cacheOf("alice") + "/web/old"));
  EXPECT_TRUE(exists(cacheOf("bob") + "/pictures/old"));
  EXPECT_EQ(purge(*services_.get()[1], 1), kMiB) << "one cache suffices";
  alice->signal(SIGTERM);
  EXPECT_EQ(alice->wait().status, 0);
}

TEST_F(CommandServing, AServiceGoesOnWhenNobodyReadsWhatItSaysAnyMore) {
  write("one", ruleText("com.example.one", cacheOf("bob") + "/web"));
  const auto service = readNoMore(
      {"--rules-dir", rules_, "--only", "one", "--check-in", "--socket", sockets_.daemonSocket()});
  daemon_.start();
  // It says so when it has found the daemon.
  ASSERT_TRUE(eventually([this] { return services_.get().size() == 1; })) << "it has ended";
  EXPECT_EQ(purge(*services_.get()[0], 10 * kMiB), kMiB);
  service->signal(SIGTERM);
  EXPECT_EQ(service->wait().status, 0);
}

TEST_F(CommandServing, AUserWithoutTheRightIsToldHowToGetIt) {
  daemon_.turnEverybodyAway();
  daemon_.start();
  const auto alice = serveAs(kAlice);
  ASSERT_TRUE(eventually([&] {
    return alice->errSoFar().find("adduser USER spacekeep-services; then log in anew") !=
           std::string::npos;
  })) << alice->errSoFar();
}

}  // namespace
}  // namespace spacekeep::command
