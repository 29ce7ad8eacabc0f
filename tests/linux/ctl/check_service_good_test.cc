// Good services pass.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <fstream>
#include <string>

#include "ctl/check_service/checks.h"
#include "tests/linux/ctl/check_service_world.h"

namespace spacekeep::ctl {
namespace {

using testing::Contains;
using testing::ElementsAre;
using testing::EndsWith;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::IsSupersetOf;
using testing::SizeIs;

class CheckServiceGood : public CheckServiceTest {
 protected:
  [[nodiscard]] std::string rules() const {
    std::string path = directory_.path() + "/rules.plist";
    std::ofstream(path)
        << "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n<plist version=\"1.0\"><dict>"
        << "<key>SPACEKEEP_ID</key><string>com.example.cache</string>"
        << "<key>DIRECTORIES</key><array><dict><key>PATH</key><string>" << cache()
        << "</string></dict></array></dict></plist>\n";
    return path;
  }
  [[nodiscard]] std::string cacheDir(const std::string& options) const {
    return "-- " + program("services/spacekeep-cachedir") + " --rules " + rules() + " " + options;
  }
  [[nodiscard]] std::string withItsFiles() const {
    return checking("--yes --data " + cache() + " --in-use " + cache());
  }
  /// Every check was made, and all was well.
  static void expectAllWell(const Finished& run) {
    EXPECT_EQ(run.exit_code, 0) << run.out << run.err;
    EXPECT_THAT(checksThatWere("ok", run.out), SizeIs(allChecks().size() + 1)) << run.out;
    EXPECT_THAT(run.out, EndsWith("24 checks: 24 ok, 0 failed, 0 not applicable\n"));
    EXPECT_THAT(run.err, IsEmpty());
  }
};

TEST_F(CheckServiceGood, AServiceOnAnotherLibraryPassesEveryCheck) {
  expectAllWell(onVolume(300, withItsFiles() + badService("none")));
}

TEST_F(CheckServiceGood, TheCacheDirectoryServicePassesEveryCheckWhenItChecksIn) {
  const Finished run = onVolume(4000, withItsFiles() + cacheDir("--check-in"));
  expectAllWell(run);
  EXPECT_THAT(run.out, HasSubstr("ok, it checked in as com.example.cache\n"));
}

TEST_F(CheckServiceGood, TheCacheDirectoryServicePassesEveryCheckAtAHandedOverSocket) {
  const Finished run = onVolume(4000, withItsFiles() + cacheDir(""));
  expectAllWell(run);
  EXPECT_THAT(run.out, HasSubstr("ok, it listens\n"));
}

TEST_F(CheckServiceGood, AServiceThatFindsTheSocketInItsCommandIsReached) {
  const Finished run =
      onVolume(10, checking("--no-purge") + cacheDir("--check-in --socket {socket}"));
  EXPECT_EQ(run.exit_code, 0) << run.out;
  EXPECT_THAT(run.out, HasSubstr("ok, it checked in as com.example.cache\n"));
}

TEST_F(CheckServiceGood, AServiceThatListensAlreadyIsReachedAtItsSocket) {
  const std::string socket = directory_.serviceSocket();
  const Finished run = onVolume(
      4000, "systemd-socket-activate --listen=" + socket + " " + cacheDir("").substr(3) +
                " >/dev/null 2>&1 &\nserver=$!\ntrap \"kill $server\" EXIT\n" + "until test -S " +
                socket + "; do sleep 0.01; done\n" + withItsFiles() + " --endpoint " + socket);
  EXPECT_EQ(run.exit_code, 0) << run.out << run.err;
  EXPECT_THAT(checksThatWere("FAILED", run.out), IsEmpty());
  // Whose process it is cannot be told from a socket that somebody else listens at.
  EXPECT_THAT(checksThatWere("not applicable", run.out), ElementsAre("upkeep"));
}

/// The examples are about /data, which this machine need not have.
class DocumentedService : public CheckServiceGood,
                          public testing::WithParamInterface<const char*> {};

TEST_P(DocumentedService, Passes) {
  const std::string root = directory_.path() + "/root";
  const Finished run = runShell(
      std::string(SPACEKEEP_SOURCE_DIR) + "/tests/sandbox/enter " + root + " " +
          SPACEKEEP_BUILD_DIR + " -- /bin/sh -c \"export ASAN_OPTIONS=" + kNoQuarantine +
          "; mkdir /data && mount -t tmpfs data /data && mkdir /data/thumbnails "
          "&& " +
          "head -c 81920000 /dev/zero | split -b 20480 -a 4 -d - /data/thumbnails/item- && " +
          "/programs/ctl/spacekeepctl check-service --yes --volume /data --data /data/thumbnails " +
          "-- " + GetParam() + "\"",
      errFile());
  runShell("rm -rf " + root, errFile());
  EXPECT_EQ(run.exit_code, 0) << run.out << run.err;
  EXPECT_THAT(checksThatWere("FAILED", run.out), IsEmpty());
  EXPECT_THAT(checksThatWere("ok", run.out),
              IsSupersetOf({"reached", "ping", "query-frees-nothing", "purge-nothing",
                            "purge-share", "purge-limit", "daemon-gone", "purge-everything",
                            "answers", "answers-once", "honest-amounts"}))
      << run.out;
}

INSTANTIATE_TEST_SUITE_P(On, DocumentedService,
                         testing::Values("/programs/sdk/example_thumbnail_cache",
                                         "/programs/sdk/example_thumbnails",
                                         "env PYTHONPATH=/source/sdk/python /usr/bin/python3 -B "
                                         "/source/sdk/examples/thumbnails.py",
                                         "env PYTHONPATH=/source/sdk/python /usr/bin/python3 -B "
                                         "/source/tests/programs/listening_thumbnails.py"));

TEST_F(CheckServiceGood, AServiceWithNothingToGiveIsToldWhatCouldNotBeSeen) {
  const Finished run = onVolume(0, checking("--yes") + "-- " + program("sdk/example_on_demand"));
  EXPECT_EQ(run.exit_code, 0) << run.out << run.err;
  EXPECT_THAT(checksThatWere("not applicable", run.out),
              ElementsAre("purge-share", "purge-limit", "cancel", "purge-everything", "in-use"));
  EXPECT_THAT(run.out, HasSubstr("Fill its cache and check again."));
}

TEST_F(CheckServiceGood, WithNoPurgeNothingIsGivenUp) {
  const Finished run =
      onVolume(300, checking("--no-purge") + badService("none") + "\nls " + cache() + " | wc -l");
  EXPECT_EQ(run.exit_code, 0) << run.out << run.err;
  EXPECT_THAT(run.out, EndsWith("\n300\n"));
  EXPECT_THAT(checksThatWere("not applicable", run.out), Contains("purge-everything"));
  EXPECT_THAT(checksThatWere("ok", run.out), Contains("daemon-gone"));
}

TEST_F(CheckServiceGood, JsonIsOneObjectOnStandardOutputAndNothingElse) {
  const Finished run = onVolume(300, checking("--yes --json") + badService("none"));
  EXPECT_EQ(run.exit_code, 0);
  EXPECT_THAT(run.err, IsEmpty());
  EXPECT_THAT(run.out, testing::StartsWith("{\"checks\":[{\"check\":\"reached\",\"result\":\"ok\","
                                           "\"text\":\"it checked in as com.example.raw\"}"));
  EXPECT_THAT(run.out, EndsWith(",\"failed\":0,\"not_applicable\":1,\"ok\":23,\"service\":"
                                "\"com.example.raw\",\"volume\":\"" +
                                volume() + "\"}\n"));
}

}  // namespace
}  // namespace spacekeep::ctl
