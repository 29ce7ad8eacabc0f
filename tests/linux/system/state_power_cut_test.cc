// The power goes after any change that the daemon makes to its storage: nothing that was answered is
// lost, and the state can always be opened again.
#include <gtest/gtest.h>

#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <random>
#include <string>
#include <vector>

#include "support/preferences/linux/sqlite_suite.h"
#include "tests/helpers/log_capture.h"
#include "tests/helpers/temporary_directory.h"
#include "tests/linux/system/sandbox.h"
#include "tests/linux/system/state_client.h"
#include "tests/linux/system/state_disk.h"

namespace spacekeep::system_test {
namespace {

namespace fs = std::filesystem;

constexpr const char* kSuite = "com.quorvel.spacekeep";
constexpr const char* kState = "SPACEKEEP_USER_DEFAULTS";

/// In memory: a few thousand disks are laid out.
class ImageDirectory {
 public:
  ImageDirectory() {
    std::string name = "/dev/shm/spacekeep-cut-XXXXXX";
    if (mkdtemp(name.data()) == nullptr) throw std::runtime_error("no directory in memory");
    path_ = name;
  }
  ~ImageDirectory() { fs::remove_all(path_); }
  ImageDirectory(const ImageDirectory&) = delete;
  ImageDirectory& operator=(const ImageDirectory&) = delete;
  [[nodiscard]] std::string disk() const { return path_ + "/disk"; }

 private:
  std::string path_;
};

struct Answer {
  std::uint64_t trace_bytes;  ///< recorded when it came
  std::uint64_t count;
};

/// The count that `suite` holds, 0 for none.
std::uint64_t storedCount(PreferencesSuite& suite) {
  const auto state = suite.get(kState);
  if (!state || state->dictionary() == nullptr) return 0;
  const Value* entry = state->dictionary()->find("KEY");
  if (entry == nullptr || entry->dictionary() == nullptr) return 0;
  return unsignedAt(*entry->dictionary(), "COUNT").value_or(0);
}

class StatePowerCut : public testing::Test {
 protected:
  void SetUp() override { sandbox_.start(); }

  [[nodiscard]] std::string trace() const { return sandbox_.outside("/tmp/trace"); }
  [[nodiscard]] std::string storage() const { return sandbox_.outside("/var/lib"); }

  /// Runs the daemon under the recorder and writes; sizes of the written values in bytes.
  void record(const std::vector<std::size_t>& sizes) {
    // AddressSanitizer, where the daemon has it, would rather stand first itself.
    Process daemon = sandbox_.spawn(
        {"env", "ASAN_OPTIONS=verify_asan_link_order=0",
         "LD_PRELOAD=/programs/tests/libstate-recorder.so", "SPACEKEEP_TRACE_BELOW=/var/lib",
         "SPACEKEEP_TRACE=/tmp/trace", "/programs/daemon/spacekeepd"},
        "daemon.log");
    const auto client = connectToStarting(sandbox_);
    ASSERT_NE(client, nullptr) << sandbox_.daemonLog();
    for (const std::size_t size : sizes) {
      const Value value = Dictionary{{"COUNT", ++count_}, {"TEXT", std::string(size, 'x')}};
      const sdk::Status status = client->setState("KEY", value);
      ASSERT_TRUE(status.ok()) << status.error->text;
      answers_.push_back({fs::file_size(trace()), count_});
    }
    daemon.signal(SIGKILL);
    daemon.wait();
  }

  [[nodiscard]] std::uint64_t answeredBy(std::uint64_t trace_bytes) const {
    std::uint64_t count = first_count_;
    for (const Answer& answer : answers_) {
      if (answer.trace_bytes <= trace_bytes) count = answer.count;
    }
    return count;
  }

  /// Cuts the power after every step, in each manner, and opens what is left.
  void cutEverywhere(StateDisk& disk) {
    const std::vector<TraceStep> steps = readTrace(trace());
    ASSERT_GT(steps.size(), 20U);
    std::mt19937 random(7);
    for (std::size_t i = 0; i < steps.size(); ++i) {
      disk.play(steps[i]);
      for (const Unsynced unsynced : {Unsynced::kLost, Unsynced::kMixed, Unsynced::kKept}) {
        disk.layOut(image_.disk(), unsynced, random);
        reopen(i, answeredBy(steps[i].end));
        if (HasFailure()) return;
        ++cuts_;
      }
    }
    std::printf("%zu changes to storage, %d power cuts, %zu answered writes\n", steps.size(), cuts_,
                answers_.size());
  }
  void reopen(std::size_t step, std::uint64_t answered) {
    const test::LogCapture log;
    const auto suite = SqliteSuite::open(image_.disk() + "/spacekeep", kSuite);
    ASSERT_NE(suite, nullptr) << "step " << step << ": "
                              << ::testing::PrintToString(log.texts(kLogProblem));
    const std::uint64_t found = storedCount(*suite);
    EXPECT_TRUE(found == answered || found == answered + 1)
        << "step " << step << ": answered " << answered << ", found " << found;
    if (damaged_.empty()) {
      EXPECT_EQ(log.texts(kLogProblem).size(), 0U)
          << "step " << step << ": " << log.texts(kLogProblem).front();
    } else {
      EXPECT_TRUE(damagedIsThere()) << "step " << step;
    }
  }
  [[nodiscard]] bool damagedIsThere() const {
    for (const auto& entry : fs::directory_iterator(image_.disk() + "/spacekeep")) {
      if (test::contentOf(entry.path()) == damaged_) return true;
    }
    return false;
  }

  Sandbox sandbox_;
  ImageDirectory image_;
  std::vector<Answer> answers_;
  std::string damaged_;
  std::uint64_t count_ = 0;
  std::uint64_t first_count_ = 0;
  int cuts_ = 0;
};

TEST_F(StatePowerCut, FromTheFirstStartOnLosesNothingAnswered) {
  StateDisk disk(storage(), "/var/lib");
  record({10, 10, 3'000, 9'000, 9'100, 30'000, 10, 20'000, 60'000, 61'000});
  cutEverywhere(disk);
}

// Shows that the tests here can fail: on a disk that does nothing when asked for durability, a power
// cut loses what was answered.
TEST_F(StatePowerCut, OfADiskThatLiesAboutDurabilityWouldBeNoticed) {
  StateDisk honest(storage(), "/var/lib");
  StateDisk lying(storage(), "/var/lib");
  record({10, 3'000, 9'000});
  for (const TraceStep& step : readTrace(trace())) {
    honest.play(step);
    if (step.header.kind != TraceKind::kSynced) lying.play(step);
  }
  std::mt19937 random(7);
  honest.layOut(image_.disk(), Unsynced::kLost, random);
  EXPECT_EQ(storedCount(*SqliteSuite::open(image_.disk() + "/spacekeep", kSuite)), 3U);
  lying.layOut(image_.disk(), Unsynced::kLost, random);
  EXPECT_EQ(storedCount(*SqliteSuite::open(image_.disk() + "/spacekeep", kSuite)), 0U);
}

TEST_F(StatePowerCut, InALaterLifeOfTheDaemonLosesNothingAnswered) {
  record({10, 100});
  fs::remove(trace());
  answers_.clear();
  first_count_ = count_;
  StateDisk disk(storage(), "/var/lib");
  // The last ones make the file grow, and its headroom with it.
  record({10, 4'000, 4'000, 5'000, 200, 150'000, 250'000, 10});
  cutEverywhere(disk);
}

TEST_F(StatePowerCut, WhileADamagedFileIsSetAsideLosesNeitherItNorWhatComesAfter) {
  damaged_ = "no database, but somebody may want it back" + std::string(10'000, '!');
  sandbox_.write("/var/lib/spacekeep/" + std::string(kSuite) + ".sqlite", damaged_);
  sandbox_.write("/var/lib/spacekeep/" + std::string(kSuite) + ".sqlite-journal",
                 std::string(5'000, '\0'));
  StateDisk disk(storage(), "/var/lib");
  record({10, 3'000, 10});
  EXPECT_NE(sandbox_.daemonLog().find("It was set aside as"), std::string::npos);
  cutEverywhere(disk);
}

}  // namespace
}  // namespace spacekeep::system_test
